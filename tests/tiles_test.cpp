// Whole tiles: the runs that there are, the cache in between, and tiles not stored as such.
#include "std/std.h"

#include "access/tile_cache.h"
#include "support/file_test.h"
#include "support/refusal.h"

#include <algorithm>
#include <numeric>

namespace {

class Tiles : public FileTest {
protected:
    // Opens an image whose stored bytes are 1, 2, 3, ..., as many of them as the file has.
    img_desc *open(const test_geometry &image, std::int32_t cache_mb = 0,
                   std::size_t length = INT32_MAX)
    {
        img_closefile(create_test_file(m_file, image));
        bytes file = read_file(m_file);
        std::iota(file.begin() + TEST_HEADER_LENGTH, file.end(), std::uint8_t{1});
        file.resize(std::min(file.size(), TEST_HEADER_LENGTH + length));
        write_file(m_file, file);
        img_cache_mb = cache_mb;
        img_default_tile_nsamps = img_default_tile_nlines = 2;
        m_desc = img_find_image(open_test_file(m_name, IMG_OPEN_READ_WRITE));
        img_cache_mb = 0;
        return m_desc;
    }
    bytes stored() const
    {
        const bytes file = read_file(m_file);
        return {file.begin() + TEST_HEADER_LENGTH, file.end()};
    }
    // Returns what a load of a run of planes leaves in a buffer of sevens.
    bytes load(std::int32_t first_tile, std::int32_t ntiles, std::int32_t band,
               std::int32_t result = 0)
    {
        bytes buffer(static_cast<std::size_t>(ntiles) * img_std_plane_size(m_desc), 7);
        fault_arm(io_call::read, 0);
        printed_by([&] {
            EXPECT_EQ(img_load_tiles(m_desc->handle, first_tile, ntiles, band, buffer.data()),
                      result);
        });
        return buffer;
    }
    std::int32_t dump(std::int32_t first_tile, std::int32_t band, const bytes &planes)
    {
        const auto ntiles = static_cast<std::int32_t>(planes.size() / img_std_plane_size(m_desc));
        return img_dump_tiles(m_desc->handle, first_tile, ntiles, band, planes.data());
    }
    // Expects results of both transfers, and that nothing is printed.
    static void expect(img_handle image, std::array<std::int32_t, 3> run, std::uint8_t *buffer,
                       std::int32_t loaded, std::int32_t dumped)
    {
        const auto first = run[0], ntiles = run[1], band = run[2];
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

TEST_F(Tiles, AreMovedRefusedOrPassedOverQuietly)
{
    constexpr std::int32_t min = INT32_MIN, max = INT32_MAX;
    constexpr std::array<std::int32_t, 4> cases[] = {
        // first tile, tiles, band; result
        {0, 6, 1, 0},      {5, 1, 0, 0},    {0, 7, 0, -1},   {6, 1, 0, -1},   {-1, 2, 0, -1},
        {0, 1, -1, -1},    {0, 1, 2, -1},   {max, 1, 0, -1}, {1, max, 0, -1}, {max, max, 0, -1},
        {min, max, 0, -1}, {min, 1, 0, -1}, {0, 1, max, -1}, {9, 0, 9, 0},    {min, min, min, 0}};
    for (const std::int32_t layout : {0, 2, 3, 4})
        for (const std::int32_t cache_mb : {0, 1}) {
            const std::int32_t tile = layout == 0 ? 0 : 2;
            const img_handle image = open({4, 6, 2, 1, tile, tile, layout}, cache_mb)->handle;
            const bool tiled = img_is_tiled(m_desc);
            EXPECT_EQ(img_std_read_tiles(m_desc, 9, tiled ? 0 : 1, 9, nullptr), 0);
            EXPECT_EQ(img_std_write_tiles(m_desc, 9, tiled ? 0 : 1, 9, nullptr), 0);
            for (const auto &[first, ntiles, band, result] : cases) {
                const std::int32_t expected = tiled ? result : 0;
                bytes buffer(24, 7);
                fault_arm(io_call::read, 0);
                expect(image, {first, ntiles, band}, buffer.data(), expected, expected);
                EXPECT_EQ(buffer, bytes(24, 7));
                EXPECT_TRUE((tiled && result == 0 && ntiles > 0) ||
                            calls_of(io_call::read) + calls_of(io_call::write) == 0);
            }
            expect(image, {0, 1, 0}, nullptr, tiled ? -1 : 0, tiled ? -1 : 0);
            close();
        }
}

TEST_F(Tiles, NeedAnImageThatTakesThem)
{
    const img_handle image = open({4, 6, 2, 1, 2, 2, IMG_LAYOUT_TILED})->handle;
    std::array<std::uint8_t, 4> plane{};
    for (const img_handle none : {-1, 60, 59, INT32_MIN, INT32_MAX})
        expect(none, {0, 1, 0}, plane.data(), -1, -1);
    m_desc->oflags = IMG_OPEN_READ_ONLY | IMG_OPEN_BINARY;
    expect(image, {0, 1, 0}, plane.data(), 0, -1);
    m_desc->oflags = IMG_OPEN_WRITE_ONLY | IMG_OPEN_BINARY;
    expect(image, {0, 1, 0}, plane.data(), -1, 0);
    EXPECT_EQ(refusal([&] {  // what the rest of the tile is cannot be known
                  return img_dump_buffer(image, 0, 0, 1, 1, 0, plane.data(), 1, nullptr);
              }),
              perror_line("img_std_read_tiles:read", EBADF));
    m_desc->oflags = IMG_OPEN_READ_WRITE | IMG_OPEN_BINARY;
    const img_type_desc type = img_type_table[TEST_TYPE];
    img_type_table[TEST_TYPE].read_tiles = nullptr;
    expect(image, {0, 1, 0}, plane.data(), -1, 0);
    img_type_table[TEST_TYPE].write_tiles = nullptr;
    expect(image, {0, 1, 0}, plane.data(), -1, -1);
    img_type_table[TEST_TYPE] = type;
    close();
}

TEST_F(Tiles, AreNotCachedAfterAllWhenTheFirstDoesNotFit)
{
    open({1, 1, 1, 2, 1024, 1024, IMG_LAYOUT_TILED}, 1);
    for (const int reads : {1, 2}) {
        load(0, 1, 0);
        EXPECT_EQ(m_desc->tile_cache, nullptr) << reads;
        m_desc->cache_mb = 4;
    }
    close();
}

TEST_F(Tiles, ThatWereChangedReachTheFileWhenItIsClosed)
{
    open({2, 6, 1, 1, 2, 2, IMG_LAYOUT_TILED}, 1);
    EXPECT_EQ(dump(0, 0, {50, 51, 52, 53, 54, 55, 56, 57}), 0);  // there is no cache yet
    EXPECT_EQ(calls_of(io_call::write), 1);
    load(0, 1, 0);
    EXPECT_EQ(dump(1, 0, {60, 61, 62, 63, 70, 71, 72, 73}), 0);
    EXPECT_EQ(load(0, 3, 0), (bytes{50, 51, 52, 53, 60, 61, 62, 63, 70, 71, 72, 73}));
    EXPECT_EQ(calls_of(io_call::read) + calls_of(io_call::write), 0);
    EXPECT_EQ(stored(), (bytes{50, 51, 52, 53, 54, 55, 56, 57, 9, 10, 11, 12}));
    close();
    EXPECT_EQ(stored(), (bytes{50, 51, 52, 53, 60, 61, 62, 63, 70, 71, 72, 73}));
}

TEST_F(Tiles, OfInterleavedPixelsBringTheOtherBandsAlong)
{
    open({1, 4, 3, 1, 2, 1, IMG_LAYOUT_TILED_BIP}, 1);
    load(0, 1, 0);
    EXPECT_EQ(dump(1, 1, {50, 51}), 0);
    img_tile_cache *const cache = m_desc->tile_cache;
    const struct {
        std::int32_t tile, band;
        bytes plane;
        int reads;
    } loads[] = {{0, 1, {2, 5}, 0},
                 {0, 2, {3, 6}, 0},
                 {1, 0, {7, 10}, 1},
                 {1, 2, {9, 12}, 0},
                 {1, 1, {50, 51}, 0}};  // changed: the file has older bytes
    for (const auto &[tile, band, plane, reads] : loads) {
        EXPECT_EQ(load(tile, 1, band), plane);
        EXPECT_EQ(calls_of(io_call::read), reads);
    }
    const bytes plane{60, 61};
    EXPECT_EQ(img_std_write_tiles(m_desc, 1, 1, 0, plane.data()), 0);
    EXPECT_EQ(stored(), (bytes{1, 2, 3, 4, 5, 6, 60, 8, 9, 61, 11, 12}));
    EXPECT_EQ(m_desc->tile_cache, cache);
    fault_arm(io_call::write, 0);
    close();
    EXPECT_EQ(calls_of(io_call::write), 1);  // what is as the file has it is not written
    EXPECT_EQ(stored(), (bytes{1, 2, 3, 4, 5, 6, 60, 50, 9, 61, 51, 12}));
}

TEST_F(Tiles, BehindOneThatIsMissingAreKept)
{
    open({2, 6, 1, 1, 2, 2, IMG_LAYOUT_TILED}, 1, 4);
    EXPECT_EQ(load(0, 3, 0, -1), (bytes{1, 2, 3, 4, 7, 7, 7, 7, 7, 7, 7, 7}));
    EXPECT_EQ(img_tile_cache_has(m_desc->tile_cache, 1, 0), 0);
    EXPECT_EQ(dump(2, 0, {50, 51, 52, 53}), 0);
    const bytes row{60, 61, 62, 63}, fill{9};
    for (const std::int32_t before : {0, 1}) {
        img_std_report_errors = before;
        EXPECT_EQ(img_dump_buffer(m_desc->handle, 0, 1, 1, 4, 0, row.data(), 4, fill.data()), 0);
        EXPECT_EQ(img_std_report_errors, before);
    }
    close();
    EXPECT_EQ(stored(), (bytes{1, 60, 3, 4, 61, 62, 9, 9, 63, 51, 52, 53}));
}

TEST_F(Tiles, InWhichTheFileEndsAreDeliveredSampleBySample)
{
    for (std::size_t length = 0; length <= 16; ++length) {  // 4 pixels of 2 x 2 bytes
        open({1, 4, 2, 2, 2, 1, IMG_LAYOUT_TILED_BIP}, 0, length);
        bytes expected(8, 7);
        for (std::size_t pixel = 0; pixel < 4; ++pixel)
            for (std::size_t i = 0; i < 2 && 4 * pixel + 4 <= length; ++i)
                expected[2 * pixel + i] = static_cast<std::uint8_t>(4 * pixel + 3 + i);
        EXPECT_EQ(load(0, 2, 1, length < 16 ? -1 : 0), expected) << length;
        close();
    }
}

TEST_F(Tiles, OfAnUntiledFileStayWithinTheImageAndInItsByteOrder)
{
    open({1, 3, 1, 2, 0, 0, IMG_LAYOUT_BSQ, 1}, 1);
    EXPECT_EQ(load(0, 2, 0), (bytes{1, 2, 3, 4, 7, 7, 7, 7, 5, 6, 7, 7, 7, 7, 7, 7}));
    EXPECT_EQ(dump(1, 0, {50, 51, 52, 53, 54, 55, 56, 57}), 0);
    close();
    EXPECT_EQ(stored(), (bytes{1, 2, 3, 4, 50, 51}));
}

TEST(PixelInterleaving, FollowsTheBandMap)
{
    const bytes tile{1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12};
    const std::array band_map{2, 0, 1};
    for (const std::int32_t nbytes : {1, 2}) {
        bytes band0(4, 77), band2(4, 77), merged(12, 77);
        img_std_split_tile(tile.data(), 2 / nbytes, 2, nbytes, 3, band_map,
                           {band0.data(), nullptr, band2.data()});
        img_std_merge_tile(3, band_map, {band0.data(), nullptr, band2.data()}, 2 / nbytes, 2,
                           nbytes, merged.data());
        EXPECT_EQ(band0, nbytes == 1 ? (bytes{2, 5, 8, 11}) : (bytes{3, 4, 9, 10}));
        EXPECT_EQ(band2, nbytes == 1 ? (bytes{1, 4, 7, 10}) : (bytes{1, 2, 7, 8}));
        EXPECT_EQ(merged, nbytes == 1 ? (bytes{1, 2, 77, 4, 5, 77, 7, 8, 77, 10, 11, 77})
                                      : (bytes{1, 2, 3, 4, 77, 77, 7, 8, 9, 10, 77, 77}));
    }
}

}  // namespace
