#include "formats/helava.h"

#include "formats/words.h"
#include "std/std.h"
#include "support/file_test.h"

namespace {

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
    EXPECT_EQ(img_dump_buffer(handle, 49, 0, 1, 100, 2, line.data(), 100, nullptr), 0);
    std::copy(line.begin(), line.end(), expected.end() - 116);
    img_closefile(handle);
    EXPECT_EQ(read_file(m_file), expected);
}

TEST_F(Helava, TrailersAreReadInEitherByteOrder)
{
    for (const std::int32_t little_endian : {0, 1}) {
        write_file(m_file, helava_file({3, 5, 70'000}, 31, little_endian != 0));
        const img_handle handle = opening(m_name, IMG_OPEN_READ_ONLY).result;
        const img_desc *const desc = img_find_image(handle);
        ASSERT_NE(desc, nullptr);
        const std::int32_t swap = IMG_WRITES_SWAPPED ? 1 - little_endian : little_endian;
        EXPECT_EQ((std::array{desc->nlines, desc->nsamps, desc->nbands, desc->nbytes, desc->nbits,
                              desc->layout, desc->tile_nsamps, desc->tile_nlines, desc->swap}),
                  (std::array{3, 5, 70'000, 1, 8, 0, 0, 0, swap}));
        EXPECT_EQ(desc->std_file->data_offset, 0);
        EXPECT_EQ(img_get_int({desc->header.get(), 16}, IMG_HELAVA_AT_NBANDS), 70'000);
        img_closefile(handle);
    }
}

TEST_F(Helava, CreateRefusesWhatATrailerCannotState)
{
    constexpr std::int32_t first = INT32_MAX - 15, k30 = 1 << 30;  // a trailer there ends too late
    const test_geometry cases[] = {
        {1, 1, 1, 2, 0, 0},     {1, 1, 1, 0, 0, 0},      {-1, 1, 1, 1, 0, 0},
        {1, 1, -2, 1, 0, 0},    {-1, -1, 1, 1, 0, 0},    {1, 1, 1, 1, -8, 0},
        {1, 1, 1, 1, 0, -8},    {1, first, 1, 1, 0, 0},  {1, first / 2, 2, 1, 0, 0},
        {k30, k30, 0, 1, 0, 0}, {k30, k30, k30, 1, 0, 0}};
    for (const test_geometry &image : cases) {
        EXPECT_EQ(creating(m_name, IMG_TYPE_HELAVA, image).text, could_not_create(m_name));
        EXPECT_LE(read_file(m_file).size(), 17);  // nothing is written that far
    }
}

}  // namespace
