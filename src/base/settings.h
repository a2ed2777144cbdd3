// Settings of the whole library. Nothing in it changes them at run time; tests do.
#ifndef IMG_SETTINGS_H
#define IMG_SETTINGS_H

#include <cstdint>

extern std::int32_t img_mapdown_src_slot;     // chain slot of the link that computes the stretch
extern std::int32_t img_mapdown_slot;         // chain slot of the link that applies it
extern std::int32_t img_default_tile_nsamps;  // tile width of virtual tiling, in samples
extern std::int32_t img_default_tile_nlines;  // tile height of virtual tiling, in lines
// Memory budget in megabytes of a new image's tile cache. 0: images have no cache. Any other value
// also turns virtual tiling on.
extern std::int32_t img_cache_mb;

#endif
