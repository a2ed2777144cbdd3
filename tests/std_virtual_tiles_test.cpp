// Tests of std_virtual_tiles.cpp: tiles of untiled images.
#include "base/settings.h"
#include "std/std_virtual_tiles.h"
#include "support/file_test.h"

using VirtualTiles = FileTest;

TEST_F(VirtualTiles, StopAtTheFirstFailure)
{
    img_closefile(create_test_file(m_name, {.nlines = 8, .nsamps = 8}));
    const setting cache_mb(img_cache_mb, 1);
    const setting width(img_default_tile_nsamps, 4), height(img_default_tile_nlines, 4);
    img_desc *const desc = img_find_image(open_test_file(m_name, IMG_OPEN_READ_WRITE));
    bytes planes(4 * 16);
    const stderr_capture quiet;
    fault_arm(io_call::read, 1);
    EXPECT_EQ(img_std_read_virtual_tiles(desc, 0, 4, 0, planes.data()), -1);
    EXPECT_EQ(calls_of(io_call::read), 1);
    fault_arm(io_call::write, 1);
    EXPECT_EQ(img_std_write_virtual_tiles(desc, 0, 4, 0, planes.data()), -1);
    EXPECT_EQ(calls_of(io_call::write), 1);
    img_closefile(desc->handle);
}
