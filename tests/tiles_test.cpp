// Tests of tiles.cpp: the runs of whole tiles that exist, what they need, and when a cache is made.
#include "base/settings.h"
#include "base/types.h"
#include "std/std_tiles.h"
#include "support/file_test.h"
#include "support/random.h"

#include <numeric>

namespace {

class Tiles : public FileTest {
protected:
    img_desc *open(const test_geometry &image, std::int32_t megabytes = 0)
    {
        img_closefile(create_test_file(m_file, image));
        const setting cache_mb(img_cache_mb, megabytes);
        const setting width(img_default_tile_nsamps, 2), height(img_default_tile_nlines, 2);
        return m_desc = img_find_image(open_test_file(m_name, IMG_OPEN_READ_WRITE));
    }
    // Expects results of both transfers of a run, and that nothing is printed.
    static void expect(std::int32_t loaded, std::int32_t dumped, img_handle image,
                       std::uint8_t *buffer, transfer run = {})
    {
        run.tiles = true;
        EXPECT_EQ(printed_by([=] {
                      EXPECT_EQ(dump(image, run, buffer), dumped);
                      EXPECT_EQ(load(image, run, buffer), loaded);
                  }),
                  "")
            << run.line << ' ' << run.nlines << ' ' << run.band;
    }

    img_desc *m_desc = nullptr;
};

TEST_F(Tiles, AreMovedRefusedOrIgnoredQuietly)  // those of 2 rows of 3 tiles in 2 bands
{
    constexpr int runs = 7 * 7 * 7;
    bytes room(24);  // where a run ends: the address checker sees what goes beyond
    for (const std::int32_t layout : {0, 2, 3, 4})
        for (const std::int32_t megabytes : {0, 1}) {
            const std::int32_t tile = layout == 0 ? 0 : 2;
            test_geometry image{4, 6, 2, 1, tile, tile, layout};
            const img_handle handle = open(image, megabytes)->handle;
            if (img_is_tiled(m_desc)) image.virtual_nlines = image.virtual_nsamps = 2;
            EXPECT_EQ(img_std_read_tiles(m_desc, 9, tile != 0 ? 0 : 1, 9, nullptr), 0);
            EXPECT_EQ(img_std_write_tiles(m_desc, 9, tile != 0 ? 0 : 1, 9, nullptr), 0);
            EXPECT_EQ(dump(handle, {.tiles = true}, room.data()), 0);
            EXPECT_EQ(m_desc->tile_cache, nullptr);  // until the first load
            for (int i = 0; i < runs; ++i) {
                extreme_arguments any(i, runs);
                transfer run{.line = any.next(6), .nlines = any.next(6)};
                run.band = any.next(2);
                run.tiles = true;
                const std::int32_t verdict = verdict_on(run, image);
                const std::size_t length = verdict == 1 ? 4 * img_count(run.nlines) : 0;
                std::iota(room.begin(), room.end(), static_cast<std::uint8_t>(i));
                const bytes before = room;
                fault_arm(io_call::read, 0);
                expect(std::min(verdict, 0), std::min(verdict, 0), handle,
                       room.data() + room.size() - length, run);
                EXPECT_EQ(room, before);
                EXPECT_TRUE(length > 0 || calls_of(io_call::read) + calls_of(io_call::write) == 0);
            }
            img_closefile(handle);
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
    EXPECT_EQ(refusal([&] { return dump(image, {}, plane.data()); }),  // the rest is unknown
              perror_line("img_std_read_tiles:read", EBADF));
    img_closefile(image);
}

// A type's own whole-tile operations serve windows, too, however old the file is.
TEST_F(Tiles, OfATypeWithItsOwnOperationsAreMovedByThose)
{
    img_closefile(create_test_file(m_file, {8, 8, 1, 1, 8, 8, IMG_LAYOUT_TILED}));
    const img_handle image = opening(m_file).result;
    img_type_desc &slot = img_type_table[TEST_TYPE];
    const setting type(slot, slot);
    bytes buffer(64);
    for (const bool exists : {true, false}) {
        slot.read_tiles = [](auto...) { return -1; };
        if (!exists) slot.read_tiles = nullptr;
        expect(-1, 0, image, buffer.data());
        for (const std::int32_t size : {8, 3}) {
            const transfer window{.nlines = size, .nsamps = size};
            EXPECT_EQ(refusal([&] { return load(image, window, buffer.data()); }), "");
            EXPECT_NE(refusal([&] { return dump(image, window, buffer.data()); }), "");
        }
    }
    slot.write_tiles = nullptr;
    expect(-1, -1, image, buffer.data());
    EXPECT_EQ(dump(image, {}, buffer.data()), -1);
    img_closefile(image);
}

}  // namespace
