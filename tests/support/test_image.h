// Images in any layout, in files and in memory.
#ifndef IMG_TEST_IMAGE_H
#define IMG_TEST_IMAGE_H

#include "base/img_desc.h"
#include "imgfile/img.h"

#include <cstdint>
#include <string>

// Slot of a type that exists in tests alone: a header of TEST_HEADER_LENGTH bytes that can state
// any geometry, layout and byte order, then pixels that the standard driver lays out. Whole tiles
// are stored, as in VITec files.
inline constexpr std::int32_t TEST_TYPE = 40;
inline constexpr std::int32_t TEST_HEADER_LENGTH = 36;

struct test_geometry {
    std::int32_t nlines = 1, nsamps = 1, nbands = 1, nbytes = 1;
    std::int32_t tile_nsamps = 0, tile_nlines = 0;
    std::int32_t layout = IMG_LAYOUT_BSQ;
    std::int32_t swap = 0;
    std::int32_t band_shift = 0;  // by which the bands of a pixel-interleaved tile are rotated
    std::int32_t virtual_nsamps = 0,
                 virtual_nlines = 0;  // tiles that a cache gives an untiled image
};

// Registers the type; later calls do nothing.
void test_type_register();

// Creates a file of that geometry and leaves it open for reading and writing; -1 on failure.
// Two-byte images have no chain: loads deliver their samples as they are.
img_handle create_test_file(const std::string &name, const test_geometry &geometry);
// Opens such a file again, likewise without a chain.
img_handle open_test_file(const std::string &name, std::int32_t flags);
// Makes an in-memory image, released with img_closefile.
img_handle create_test_memory(const test_geometry &geometry);

#endif
