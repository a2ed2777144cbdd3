#include "std/std.h"

#include "api/img_desc.h"

#include <gtest/gtest.h>

namespace {

constexpr std::int32_t TILE = 128 * 64, BAND = 1'000'000;

TEST(SampleOffset, FollowsTheLayoutOrIsRefused)
{
    constexpr std::int32_t max = INT32_MAX, in_tile = 2 * 128 + 5, last_line = (max - 512) / 516;
    // layout, bands, bytes per sample; line, sample, band; the offset, worked out by hand
    constexpr std::array<std::int32_t, 7> cases[] = {
        {0, 3, 1, 2, 3, 1, 512 + BAND + 2 * 516 + 3},
        {0, 3, 2, 2, 3, 2, 512 + 2 * BAND + (2 * 516 + 3) * 2},
        {1, 3, 1, 130, 5, 1, 512 + (130 * 516 + 5) * 3 + 1},
        {1, 3, 2, 0, 1, 2, 512 + 6 + 4},
        {1, 1, 2, 2, 3, 0, 512 + (2 * 516 + 3) * 2},
        {2, 3, 1, 66, 5, 1, 512 + 13 * TILE + in_tile},
        {2, 3, 2, 66, 5, 1, 512 + (13 * TILE + in_tile) * 2},
        {2, 1, 1, 63, 511, 0, 512 + 4 * TILE - 1},
        {3, 3, 1, 66, 5, 1, 512 + BAND + 4 * TILE + in_tile},
        {3, 3, 2, 66, 261, 2, 512 + 2 * BAND + (6 * TILE + in_tile) * 2},
        {4, 3, 1, 66, 5, 1, 512 + (4 * TILE + in_tile) * 3 + 1},
        {4, 2, 2, 66, 5, 1, 512 + ((4 * TILE + in_tile) * 2 + 1) * 2},
        {5, 3, 1, 66, 5, 1, 0},
        {6, 3, 1, 66, 5, 1, 0},
        {0, 1, 1, last_line, 0, 0, 512 + last_line * 516},
        {0, 1, 1, last_line + 1, 0, 0, -1},
        {2, 1, 1, 256, 0, 0, -1},
        {2, 1, 1, 0, 512, 0, -1},
        {0, 1, 1, 0, 0, max, -1},
        {1, 3, 2, max, max, max, -1},
        {4, 3, 2, max, max, max, -1},
        {3, 3, 1, -1, 0, 0, -1},
        {1, 3, 1, 0, -1, 0, -1},
        {2, 3, 1, 0, 0, -1, -1},
    };
    for (const auto &[layout, nbands, nbytes, line, samp, band, expected] : cases) {
        img_std_file file{};
        file.data_offset = 512;
        file.padded_nsamps = 516;
        file.band_size = BAND;
        file.tiles_across = file.tiles_down = 4;
        file.tile_size = TILE * nbytes * (layout == IMG_LAYOUT_TILED_BIP ? nbands : 1);
        img_desc desc{};
        desc.layout = layout;
        desc.nbands = nbands;
        desc.nbytes = nbytes;
        desc.tile_nsamps = 128;
        desc.tile_nlines = 64;
        desc.std_file = &file;
        EXPECT_EQ(img_std_sample_offset(&desc, line, samp, band), expected)
            << layout << ' ' << line << ' ' << samp << ' ' << band;
    }
}

}  // namespace
