// What docs/limits.md promises and no other test holds: the memory that a call takes, and two
// images of one file.
#include "base/scratch.h"
#include "chain/chain.h"
#include "support/file_test.h"

using Limits = FileTest;

TEST_F(Limits, HoldForTheMemoryOfACall)
{
    // Working memory comes in powers of two and whole pages.
    const auto block = [](std::size_t size) { return std::bit_ceil(size | 4095U); };
    constexpr std::size_t kib = 1024;
    const test_geometry one{.nlines = 400, .nsamps = 500},
        two{.nlines = 400, .nsamps = 500, .nbytes = 2};
    test_geometry tiled = one, deep_tiled = two;
    tiled.tile_nsamps = tiled.tile_nlines = deep_tiled.tile_nsamps = deep_tiled.tile_nlines = 64;
    deep_tiled.nbands = 3;
    const transfer window{.line = 60, .samp = 60, .nlines = 30, .nsamps = 100};
    const struct {
        test_geometry image;
        std::size_t to_open, to_load,
            to_dump;  // bytes at most; the window has 30 lines x 100 samples
    } cases[] = {
        {one, 2 * kib, 0, 0},
        {two, 12 * kib, block(30 * 100 * 2) + block(16 * kib), block(100 * 2)},
        {tiled, 2 * kib, block(3 * 64 * 64), block(3 * 64 * 64)},
        {deep_tiled, 12 * kib, block(3 * 64 * 64 * 2) + block(30 * 100 * 2) + block(16 * kib),
         block(3 * 64 * 64 * 2)},
    };
    bytes buffer(64 * 64 * 2);  // a tile, or the window
    for (const auto &[image, to_open, to_load, to_dump] : cases) {
        img_closefile(creating(m_name, IMG_TYPE_VITEC, image).result);
        img_free_scratch();
        memory_arm(0);
        const img_handle handle = opening(m_name).result;
        EXPECT_LE(memory_requested(), to_open);
        memory_arm(0);
        EXPECT_EQ(load(handle, window, buffer.data()), 0);
        EXPECT_LE(memory_requested(), to_load);
        img_free_scratch();
        memory_arm(0);
        EXPECT_EQ(dump(handle, window, buffer.data()), 0);
        EXPECT_LE(memory_requested(), to_dump);
        memory_arm(0);
        EXPECT_EQ(load(handle, {.tiles = true}, buffer.data()), 0);
        EXPECT_EQ(memory_requested(), 0U);
        std::filesystem::resize_file(m_file, VITEC_HEADER);
        const stderr_capture quiet;
        EXPECT_EQ(load(handle, window, buffer.data()), -1);
        EXPECT_EQ(img_chain_of(handle).work_memory, nullptr);
        memory_arm(0);
        EXPECT_EQ(img_closefile(handle), 0);
        EXPECT_EQ(memory_requested(), 0U);
    }
}

TEST_F(Limits, KeepAnImageToTheFileThatWasOpened)
{
    std::uint8_t sample = 1;
    const img_handle handle = creating(m_name, IMG_TYPE_VITEC, {}).result;
    EXPECT_EQ(dump(handle, {}, &sample), 0);
    const bytes other = vitec_file({}, VITEC_HEADER + 1);
    write_file(m_folder / "other", other);
    std::filesystem::rename(m_folder / "other", m_file);
    for (const bool removed : {false, true}) {
        if (removed) std::filesystem::remove(m_file);
        EXPECT_EQ(load(handle, {}, &sample), 0);
        EXPECT_EQ(sample, removed ? 2 : 1);
        EXPECT_EQ(dump(handle, {}, &++sample), 0);
        EXPECT_TRUE(removed || read_file(m_file) == other);
    }
    EXPECT_EQ(img_closefile(handle), 0);
}

TEST_F(Limits, LetTwoImagesOfOneFileSeeAndKeepWhatTheOtherWrote)
{
    for (const std::int32_t tile : {0, 8}) {
        const img_handle first = creating(m_name, IMG_TYPE_VITEC, {48, 8, 1, 1, tile, tile}).result;
        const img_handle second = opening(m_name).result;
        bytes expected(48 * 8);
        for (const std::int32_t line : {16, 8, 40, 0}) {  // beyond the end of the file and within
            const img_handle writer = line % 16 == 0 ? first : second;
            bytes rows(8 * 8, static_cast<std::uint8_t>(line + 1)), seen(8 * 8);
            EXPECT_EQ(dump(writer, {.line = line, .nlines = 8, .nsamps = 8}, rows.data()), 0);
            std::ranges::copy(rows, &expected[static_cast<std::size_t>(line * 8)]);
            for (const img_handle reader : {first, second})
                EXPECT_EQ(load(reader, {.line = line, .nlines = 8, .nsamps = 8}, seen.data()), 0);
            EXPECT_EQ(seen, rows);
        }
        img_closefile(first);
        img_closefile(second);
        const bytes file = read_file(m_file);
        EXPECT_EQ(bytes(file.begin() + VITEC_HEADER, file.end()), expected);
    }
}
