// Tests of std_tiled.cpp: which samples a write keeps where tiles are not read by the driver's own
// operation, or not on loan. Regions themselves are tested in transfers_test.
#include "base/types.h"
#include "std/std_tiles.h"
#include "support/file_test.h"

namespace {

class TiledWrites : public FileTest {
protected:
    // Opens an image of two tiles. The file ends after the first, whose samples are all 9.
    img_handle open_half(const std::string &name)
    {
        const img_handle handle = create_test_file(name, {8, 16, 1, 1, 8, 8, IMG_LAYOUT_TILED});
        EXPECT_EQ(dump(handle, {.tiles = true}, bytes(64, 9).data()), 0);
        return handle;
    }
    static bytes first_tile(img_handle handle)
    {
        bytes plane(64);
        EXPECT_EQ(load(handle, {.tiles = true}, plane.data()), 0);
        return plane;
    }

    const transfer m_window{.line = 1, .samp = 6, .nlines = 2, .nsamps = 4};
    const bytes m_samples = bytes(8, 1);
};

TEST_F(TiledWrites, KeepATileThatATypesOwnOperationCannotRead)
{
    const img_handle handle = open_half(m_name);
    const std::string reason = perror_line("img_std_read_tiles:read", EIO);
    img_read_tiles_fn &read_tiles = img_type_table[TEST_TYPE].read_tiles;
    const setting own(read_tiles, [](auto... args) { return img_std_read_tiles(args...); });
    const auto write = [&] { return dump(handle, m_window, m_samples.data(), &FILL); };
    for (const io_call call : {io_call::read, io_call::seek}) {
        fault_arm(call, 1, fault::fails, true);
        EXPECT_EQ(refusal(write), reason);
        fault_arm(call, 0);
        EXPECT_EQ(first_tile(handle), bytes(64, 9));
    }
    {
        const setting none(read_tiles, nullptr);
        EXPECT_EQ(refusal(write), reason);
    }

    // Without a failure the second tile, which the file does not hold, gets the fill.
    EXPECT_EQ(printed_by([&] { EXPECT_EQ(write() + write(), 0); }), "");
    bytes samples(16);
    EXPECT_EQ(load(handle, {.line = 1, .nsamps = 16}, samples.data()), 0);
    bytes expected(16, FILL);
    std::fill_n(expected.begin(), 6, std::uint8_t{9});
    std::fill_n(expected.begin() + 6, 4, std::uint8_t{1});
    EXPECT_EQ(samples, expected);
    img_closefile(handle);
}

TEST_F(TiledWrites, GoThroughATypesOwnOperation)
{
    const img_handle handle = open_half(m_file);
    const setting type(img_type_table[TEST_TYPE].write_tiles, [](auto...) { return -1; });
    EXPECT_EQ(dump(handle, m_window, m_samples.data()), -1);
    EXPECT_EQ(first_tile(handle), bytes(64, 9));
    img_closefile(handle);
}

TEST_F(TiledWrites, AskOnceForALoanOfWhatTheyKeep)
{
    // Most of each tile is replaced, so the rest is asked for on loan.
    img_closefile(create_test_file(m_file, {256, 128, 1, 1, 128, 128, IMG_LAYOUT_TILED}));
    const img_handle large = open_test_file(m_file + "@refusing", IMG_OPEN_READ_WRITE);
    refused_loans() = 0;
    const bytes samples(256 * 127, 1);
    EXPECT_EQ(dump(large, {.nlines = 256, .nsamps = 127}, samples.data()), 0);
    EXPECT_EQ(refused_loans(), 1);
    img_closefile(large);
    host.seconds_later = 1;  // the file is old enough to be lent
    const img_handle lent = open_test_file(m_file, IMG_OPEN_READ_WRITE);
    EXPECT_EQ(dump(lent, {.nlines = 256, .nsamps = 127}, samples.data()), 0);
    img_closefile(lent);
    const bytes stored = read_file(m_file);
    for (std::size_t i = TEST_HEADER_LENGTH + 127; i < stored.size(); i += 128)
        EXPECT_EQ(stored[i], 0);
}

using TiledWindows = FileTest;

// Windows that are copied straight from where tiles lie, and by way of working memory.
TEST_F(TiledWindows, AreExactWhereTilesAreLent)
{
    const test_geometry geometry{200, 200, 1, 1, 64, 64, IMG_LAYOUT_TILED};
    const bytes written = numbered(bytes(40'000), 0, 40'000);
    const img_handle image = creating(m_file, IMG_TYPE_VITEC, geometry).result;
    EXPECT_EQ(dump(image, {.nlines = 200, .nsamps = 200}, written.data()), 0);
    host.seconds_later = 3600;
    for (const std::int32_t nlines : {50, 200}) {
        const transfer window{.nlines = nlines, .nsamps = 180, .stride = 200};
        bytes read(40'000), expected(40'000);
        EXPECT_EQ(load(image, window, read.data()), 0);
        for (std::size_t i = 0; i < 200 * static_cast<std::size_t>(nlines); ++i)
            expected[i] = i % 200 < 180 ? written[i] : 0;
        EXPECT_EQ(read, expected);
    }
    img_closefile(image);
}

}  // namespace
