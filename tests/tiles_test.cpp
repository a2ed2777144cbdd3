// Whole tiles: the runs that there are, and what they need.
#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/settings.h"
#include "base/types.h"
#include "imgfile/img.h"
#include "std/std.h"
#include "std/std_interleaved_tiles.h"
#include "std/std_tiles.h"

#include "support/file_test.h"
#include "support/guarded_buffer.h"
#include "support/random.h"
#include "support/refusal.h"

#include <algorithm>
#include <numeric>

namespace {

class Tiles : public FileTest {
protected:
    img_desc *open(const test_geometry &image, std::int32_t cache_mb = 0)
    {
        img_closefile(create_test_file(m_file, image));
        img_cache_mb = cache_mb;
        img_default_tile_nsamps = img_default_tile_nlines = 2;
        m_desc = img_find_image(open_test_file(m_name, IMG_OPEN_READ_WRITE));
        img_default_tile_nsamps = img_default_tile_nlines = 128;
        img_cache_mb = 0;
        return m_desc;
    }
    // Expects results of both transfers, and that nothing is printed.
    static void expect(std::int32_t loaded, std::int32_t dumped, img_handle image,
                       std::uint8_t *buffer, std::int32_t first = 0, std::int32_t ntiles = 1,
                       std::int32_t band = 0)
    {
        EXPECT_EQ(printed_by([=] {
                      EXPECT_EQ(img_dump_tiles(image, first, ntiles, band, buffer), dumped);
                      EXPECT_EQ(img_load_tiles(image, first, ntiles, band, buffer), loaded);
                  }),
                  "")
            << first << ' ' << ntiles << ' ' << band;
    }
    void close() { img_closefile(m_desc->handle); }

    img_desc *m_desc = nullptr;
};

TEST_F(Tiles, AreMovedRefusedOrPassedOverQuietly)  // those of 2 rows of 3 tiles in 2 bands
{
    constexpr int runs = 7 * 7 * 7;
    const guarded_buffer memory;
    const std::span<std::uint8_t> room = memory.bytes().last(32);
    for (const std::int32_t layout : {0, 2, 3, 4})
        for (const std::int32_t cache_mb : {0, 1}) {
            const std::int32_t tile = layout == 0 ? 0 : 2;
            const img_handle image = open({4, 6, 2, 1, tile, tile, layout}, cache_mb)->handle;
            const bool tiled = img_is_tiled(m_desc);
            EXPECT_EQ(img_std_read_tiles(m_desc, 9, tiled ? 0 : 1, 9, nullptr), 0);
            EXPECT_EQ(img_std_write_tiles(m_desc, 9, tiled ? 0 : 1, 9, nullptr), 0);
            for (int i = 0; i < runs; ++i) {
                extreme_arguments any(i, runs);
                const std::int32_t first = any.next(6), ntiles = any.next(6), band = any.next(2);
                const bool moves = tiled && ntiles > 0;
                const bool exists =
                    band >= 0 && band < 2 && first >= 0 && std::int64_t{first} + ntiles <= 6;
                const std::int32_t result = moves && !exists ? -1 : 0;
                const std::size_t length =
                    moves && exists ? 4 * static_cast<std::size_t>(ntiles) : 0;
                std::iota(room.begin(), room.end(), static_cast<std::uint8_t>(i));
                const bytes before(room.begin(), room.end());
                fault_arm(io_call::read, 0);
                expect(result, result, image, room.data() + room.size() - length, first, ntiles,
                       band);
                EXPECT_TRUE(std::ranges::equal(room, before));
                EXPECT_TRUE(length > 0 || calls_of(io_call::read) + calls_of(io_call::write) == 0);
            }
            close();
        }
}

TEST_F(Tiles, NeedABufferAndAnImageThatTakesThem)
{
    const img_handle image = open({4, 6, 2, 1, 2, 2, IMG_LAYOUT_TILED})->handle;
    std::array<std::uint8_t, 4> plane{};
    expect(-1, -1, image, nullptr);
    for (const img_handle none : {-1, 60, 59, INT32_MIN, INT32_MAX})
        expect(-1, -1, none, plane.data());
    m_desc->oflags = IMG_OPEN_READ_ONLY | IMG_OPEN_BINARY;
    expect(0, -1, image, plane.data());
    m_desc->oflags = IMG_OPEN_WRITE_ONLY | IMG_OPEN_BINARY;
    expect(-1, 0, image, plane.data());
    EXPECT_EQ(refusal([&] {  // what the rest of the tile is cannot be known
                  return img_dump_buffer(image, 0, 0, 1, 1, 0, plane.data(), 1, nullptr);
              }),
              perror_line("img_std_read_tiles:read", EBADF));
    m_desc->oflags = IMG_OPEN_READ_WRITE | IMG_OPEN_BINARY;
    const img_type_desc type = img_type_table[TEST_TYPE];
    img_type_table[TEST_TYPE].read_tiles = nullptr;
    expect(-1, 0, image, plane.data());
    img_type_table[TEST_TYPE].write_tiles = nullptr;
    expect(-1, -1, image, plane.data());
    img_type_table[TEST_TYPE] = type;
    close();
}

TEST(PixelInterleaving, FollowsTheBandMapAndPassesOverMissingPlanes)
{
    const bytes tile{1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12};
    const std::array band_map{2, 0, 1};
    bytes band0(4), band2(4), merged(12, 77);
    img_std_split_tile(tile.data(), 1, 2, 2, 3, band_map, {band0.data(), nullptr, band2.data()});
    img_std_merge_tile(3, band_map, {band0.data(), nullptr, band2.data()}, 1, 2, 2, merged.data());
    EXPECT_EQ(merged, (bytes{1, 2, 3, 4, 77, 77, 7, 8, 9, 10, 77, 77}));
    EXPECT_EQ(band0, (bytes{3, 4, 9, 10}));
}

}  // namespace
