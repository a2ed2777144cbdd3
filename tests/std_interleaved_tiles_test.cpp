// Tests of std_interleaved_tiles.cpp: tiles whose pixels hold all bands.
#include "std/std_interleaved_tiles.h"
#include "support/files.h"

#include <gtest/gtest.h>

TEST(InterleavedTiles, FollowTheBandMapAndSkipMissingPlanes)
{
    const bytes tile{1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12};
    const std::array band_map{2, 0, 1};
    bytes band0(4), band2(4), merged(12, 77);
    img_std_split_tile(tile.data(), 1, 2, 2, 3, band_map, {band0.data(), nullptr, band2.data()});
    img_std_merge_tile(3, band_map, {band0.data(), nullptr, band2.data()}, 1, 2, 2, merged.data());
    EXPECT_EQ(merged, (bytes{1, 2, 3, 4, 77, 77, 7, 8, 9, 10, 77, 77}));
    EXPECT_EQ(band0, (bytes{3, 4, 9, 10}));
}

// The file may end anywhere in a tile. Each of its bytes goes to a plane, and nothing else does.
TEST(InterleavedTiles, AreSplitToTheByteInWhichTheFileEnds)
{
    const bytes tile{1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12};
    for (std::size_t length = 0; length <= tile.size(); ++length) {
        bytes band0(6), band1(6), merged(12);
        img_std_split_bytes(tile.data(), length, 2, 2, {0, 1}, {band0.data(), band1.data()});
        img_std_merge_tile(2, {0, 1}, {band0.data(), band1.data()}, 3, 1, 2, merged.data());
        bytes expected = tile;
        std::fill(expected.begin() + static_cast<std::ptrdiff_t>(length), expected.end(),
                  std::uint8_t{0});
        EXPECT_EQ(merged, expected);
    }
}
