// What docs/limits.md promises and no other test holds: the memory that a call takes, and two
// images of one file.
#include "base/scratch.h"
#include "chain/chain.h"
#include "imgfile/img.h"
#include "support/fault_memory.h"
#include "support/file_test.h"

#include <bit>

namespace {

using Limits = FileTest;

TEST_F(Limits, MemoryOfACall)
{
    // Working memory comes in powers of two and whole pages.
    const auto block = [](std::size_t size) { return std::bit_ceil(size | 4095U); };
    constexpr std::size_t kib = 1024;
    const struct {
        test_geometry image;
        std::size_t open, load, dump;  // bytes at most; the window has 30 lines x 100 samples
    } cases[] = {
        {{400, 500, 1, 1, 0, 0}, 2 * kib, 0, 0},
        {{400, 500, 1, 2, 0, 0}, 12 * kib, block(30 * 100 * 2) + block(16 * kib), block(100 * 2)},
        {{400, 500, 1, 1, 64, 64}, 2 * kib, block(3 * 64 * 64), block(3 * 64 * 64)},
        {{400, 500, 3, 2, 64, 64},
         12 * kib,
         block(3 * 64 * 64 * 2) + block(30 * 100 * 2) + block(16 * kib),
         block(3 * 64 * 64 * 2)},
    };
    bytes buffer(64 * 64 * 2);  // a tile, or the window
    for (const auto &[image, open, load, dump] : cases) {
        img_closefile(creating(m_name, IMG_TYPE_VITEC, image).result);
        img_free_scratch();
        memory_arm(0);
        const img_handle handle = opening(m_name).result;
        EXPECT_LE(memory_requested(), open);
        memory_arm(0);
        EXPECT_EQ(img_load_buffer(handle, 60, 60, 30, 100, 0, buffer.data(), 100, nullptr), 0);
        EXPECT_LE(memory_requested(), load);
        img_free_scratch();
        memory_arm(0);
        EXPECT_EQ(img_dump_buffer(handle, 60, 60, 30, 100, 0, buffer.data(), 100, nullptr), 0);
        EXPECT_LE(memory_requested(), dump);
        memory_arm(0);
        EXPECT_EQ(img_load_tiles(handle, 0, 1, 0, buffer.data()), 0);
        EXPECT_EQ(memory_requested(), 0U);
        std::filesystem::resize_file(m_file, 244);
        const stderr_capture quiet;
        EXPECT_EQ(img_load_buffer(handle, 60, 60, 30, 100, 0, buffer.data(), 100, nullptr), -1);
        EXPECT_EQ(img_chain_of(handle).work_memory, nullptr);
        memory_arm(0);
        EXPECT_EQ(img_closefile(handle), 0);
        EXPECT_EQ(memory_requested(), 0U);
    }
}

TEST_F(Limits, AnImageGoesOnWithTheFileThatWasOpened)
{
    std::uint8_t sample = 1;
    const img_handle handle = creating(m_name, IMG_TYPE_VITEC, {}).result;
    EXPECT_EQ(img_dump_buffer(handle, 0, 0, 1, 1, 0, &sample, 1, nullptr), 0);
    const bytes other = vitec_file({}, 245);
    write_file(m_folder / "other", other);
    std::filesystem::rename(m_folder / "other", m_file);
    for (const bool removed : {false, true}) {
        if (removed) std::filesystem::remove(m_file);
        EXPECT_EQ(img_load_buffer(handle, 0, 0, 1, 1, 0, &sample, 1, nullptr), 0);
        EXPECT_EQ(sample, removed ? 2 : 1);
        EXPECT_EQ(img_dump_buffer(handle, 0, 0, 1, 1, 0, &++sample, 1, nullptr), 0);
        EXPECT_TRUE(removed || read_file(m_file) == other);
    }
    EXPECT_EQ(img_closefile(handle), 0);
}

TEST_F(Limits, TwoImagesOfOneFileSeeAndKeepWhatTheOtherWroteElsewhere)
{
    for (const std::int32_t tile : {0, 8}) {
        const img_handle first = creating(m_name, IMG_TYPE_VITEC, {48, 8, 1, 1, tile, tile}).result;
        const img_handle second = opening(m_name).result;
        bytes expected(48 * 8);
        for (const std::int32_t line : {16, 8, 40, 0}) {  // beyond the end of the file and within
            const img_handle writer = line % 16 == 0 ? first : second;
            bytes rows(8 * 8, static_cast<std::uint8_t>(line + 1)), seen(8 * 8);
            EXPECT_EQ(img_dump_buffer(writer, line, 0, 8, 8, 0, rows.data(), 8, nullptr), 0);
            std::ranges::copy(rows, &expected[static_cast<std::size_t>(line * 8)]);
            for (const img_handle reader : {first, second})
                EXPECT_EQ(img_load_buffer(reader, line, 0, 8, 8, 0, seen.data(), 8, nullptr), 0);
            EXPECT_EQ(seen, rows);
        }
        img_closefile(first);
        img_closefile(second);
        const bytes file = read_file(m_file);
        EXPECT_EQ(bytes(file.begin() + 244, file.end()), expected);
    }
}

}  // namespace
