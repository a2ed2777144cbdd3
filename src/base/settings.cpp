// The start values of the library-wide settings. Read settings.h first.
#include "base/settings.h"

std::int32_t img_mapdown_src_slot = 0;
std::int32_t img_mapdown_slot = 9;
std::int32_t img_default_tile_nsamps = 128;
std::int32_t img_default_tile_nlines = 128;
std::int32_t img_cache_mb = 0;
