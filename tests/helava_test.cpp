// Tests of helava.cpp: trailers to the byte.
#include "std/std.h"
#include "support/file_test.h"

using Helava = FileTest;

TEST_F(Helava, FilesAreSamplesAndATrailer)
{
    const bytes trailer{0, 0, 0, 3, 0, 0, 0, 100, 0, 0, 0, 50, 0x48, 0x41, 0x14, 0x84};
    bytes expected(15'000);
    expected.insert(expected.end(), trailer.begin(), trailer.end());
    const img_handle handle = creating(m_name, IMG_TYPE_HELAVA, {50, 100, 3, 1, 8, 8}).result;
    EXPECT_EQ(read_file(m_file), expected);
    const img_desc &desc = *img_find_image(handle);
    EXPECT_EQ(bytes(&desc.header[0], &desc.header[0] + 16), trailer);
    EXPECT_EQ((std::array{desc.tile_nsamps, desc.layout, desc.swap, desc.std_file->data_offset}),
              (std::array{8, 0, 0, 0}));  // the tiles last until the file is closed
    const bytes line(100, 6);
    EXPECT_EQ(dump(handle, {.band = 2, .line = 49, .nsamps = 100}, line.data()), 0);
    std::copy(line.begin(), line.end(), expected.end() - 116);
    img_closefile(handle);
    EXPECT_EQ(read_file(m_file), expected);
    EXPECT_EQ(creating(m_name, IMG_TYPE_HELAVA, {.nbytes = 2}).result, -1);
    EXPECT_EQ(read_file(m_file), bytes{});  // of what is refused nothing is left
}
