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
    const std::size_t to_stretch = block(8 * kib) + block((4096 + 4) * sizeof(std::uint32_t));
    const transfer window{.line = 60, .samp = 60, .nlines = 30, .nsamps = 100};
    const struct {
        test_geometry image;
        std::size_t to_open, to_load,
            to_dump;  // bytes at most; the window has 30 lines x 100 samples
    } cases[] = {{{400, 500}, 2 * kib, 0, 0},
                 {{400, 500, 1, 2}, 12 * kib, block(30 * 100 * 2) + to_stretch, block(100 * 2)},
                 {{400, 500, 1, 1, 64, 64}, 2 * kib, block(3 * 64 * 64), block(3 * 64 * 64)},
                 {{400, 500, 3, 2, 64, 64},
                  12 * kib,
                  block(3 * 64 * 64 * 2) + block(30 * 100 * 2) + to_stretch,
                  block(3 * 64 * 64 * 2)}};
    const auto memory_of = [](auto action) {
        img_free_scratch();
        memory_arm(0);
        EXPECT_EQ(action(), 0);
        return shortage.requested;
    };
    bytes buffer(64 * 64 * 2);  // a tile, or the window
    for (const auto &[image, to_open, to_load, to_dump] : cases) {
        img_closefile(creating(m_name, IMG_TYPE_VITEC, image).result);
        EXPECT_LE(memory_of([&] { return opening(m_name).result; }), to_open);
        EXPECT_LE(memory_of([&] { return load(0, window, buffer.data()); }), to_load);
        EXPECT_LE(memory_of([&] { return dump(0, window, buffer.data()); }), to_dump);
        EXPECT_EQ(memory_of([&] { return load(0, {.tiles = true}, buffer.data()); }), 0U);
        std::filesystem::resize_file(m_file, VITEC_HEADER);
        const stderr_capture quiet;
        EXPECT_EQ(load(0, window, buffer.data()), -1);
        EXPECT_EQ(img_chain_of(0).work_memory, nullptr);
        EXPECT_EQ(memory_of([] { return img_closefile(0); }), 0U);
    }
}

TEST_F(Limits, KeepAnImageToTheFileThatWasOpened)
{
    const std::uint8_t sample = 1;
    const img_handle handle = creating(m_name, IMG_TYPE_VITEC, {}).result;
    EXPECT_EQ(dump(handle, {}, &sample), 0);
    const bytes other = vitec_file({}, VITEC_HEADER + 1);
    write_file(m_folder / "other", other);
    std::filesystem::rename(m_folder / "other", m_file);
    std::uint8_t stored = 0;
    EXPECT_EQ(load(handle, {}, &stored), 0);
    EXPECT_EQ(stored, sample);
    EXPECT_EQ(dump(handle, {}, &stored), 0);
    EXPECT_EQ(img_closefile(handle), 0);
    EXPECT_EQ(read_file(m_file), other);
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
