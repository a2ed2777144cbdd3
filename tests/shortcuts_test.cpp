// What may not change because bytes are lent, and calls merged: results, messages and files.
#include "base/scratch.h"
#include "std/std.h"
#include "support/file_test.h"

namespace {

struct condition {
    std::int32_t tiles_there = 0;
    int disk_size = -1, seconds_later = 1;
    std::int32_t access = IMG_OPEN_READ_WRITE;
};

class Shortcuts : public FileTest {
protected:
    // Dumps a window of a new image, whose bytes are lent and whose calls may be merged, and of
    // one whose calls are counted.
    outcome expect_same(const test_geometry &image, const transfer &window, const condition &given)
    {
        outcome seen[2];
        bytes file[2];
        for (const bool lends : {false, true}) {
            const img_handle handle = create_test_file(lends ? m_file : m_name, image);
            img_desc &desc = *img_find_image(handle);
            dump(handle, {.nlines = given.tiles_there, .tiles = true}, &m_content[7]);
            host.seconds_later = given.seconds_later;  // 0: what was just written is not lent
            host.disk_size = given.disk_size;
            desc.oflags = given.access | IMG_OPEN_BINARY;
            std::fill_n(img_take_scratch(1 << 15).get(), 1 << 15, UNTOUCHED);
            seen[lends] = outcome_of([&] { return dump(handle, window, &m_content[0]); });
            host = {};
            file[lends] = read_file(m_file);
            EXPECT_TRUE(seen[lends].result == -1 || desc.std_file->veof == std::ssize(file[lends]));
            img_closefile(handle);
        }
        EXPECT_EQ(seen[true], seen[false]);
        EXPECT_EQ(file[true], file[false]);
        return seen[true];
    }

    const bytes m_content = numbered(bytes(300'000), 0, 300'000);
};

TEST_F(Shortcuts, WriteManyLinesInOneCallAsOneByOne)
{
    test_geometry image{.nlines = 5, .nsamps = 6, .nbytes = 2};
    for (image.swap = 0; image.swap < 2; ++image.swap)
        for (const std::int32_t stride : {6, 8})
            for (int size = TEST_HEADER_LENGTH; size < TEST_HEADER_LENGTH + 70; size += 5)
                expect_same(image, {.nlines = 5, .nsamps = 6, .stride = stride},
                            {.disk_size = size});
}

// Where most lines of stored tiles stay, the others alone are written.
TEST_F(Shortcuts, WriteTouchedLinesAsWholeTiles)
{
    const test_geometry image{256, 256, 1, 1, 128, 128, IMG_LAYOUT_TILED};
    const transfer window{.line = 70, .samp = 4, .nlines = 58, .nsamps = 190};
    for (int limit = 36; limit <= 36 + 2 * 16384; limit += 1024)
        expect_same(image, window, {.tiles_there = limit == 36 ? 0 : 4, .disk_size = limit});
    for (int i = 0; i < 10; ++i)
        expect_same(image, window, {.tiles_there = i / 2, .seconds_later = i % 2});
}

// A window that has all of a tile does not make up for the right to read it.
TEST_F(Shortcuts, ReplaceNoTileOfAnImageThatIsWrittenAlone)
{
    const outcome seen = expect_same({8, 8, 1, 1, 8, 8, IMG_LAYOUT_TILED},
                                     {.nlines = 8, .nsamps = 8}, {.access = IMG_OPEN_WRITE_ONLY});
    EXPECT_EQ(seen.result, -1);
}

// Also where a region has many lines, or rows of tiles.
TEST_F(Shortcuts, AskForBytesOnLoanOnce)
{
    for (std::int32_t layout = IMG_LAYOUT_BSQ; layout <= IMG_LAYOUT_TILED_BIP; ++layout) {
        const std::int32_t tile = layout < IMG_LAYOUT_TILED ? 0 : 8;
        img_closefile(create_test_file(m_file, {32, 32, 2, 1, tile, tile, layout}));
        const img_handle handle = open_test_file(m_file + "@refusing", IMG_OPEN_READ_WRITE);
        refused_loans() = 0;
        bytes buffer(30 * 30, 1);
        EXPECT_EQ(load(handle, {.line = 1, .samp = 1, .nlines = 30, .nsamps = 30}, &buffer[0]), 0);
        EXPECT_EQ(refused_loans(), 1);
        EXPECT_EQ(buffer, bytes(30 * 30));
        img_closefile(handle);
    }
}

}  // namespace
