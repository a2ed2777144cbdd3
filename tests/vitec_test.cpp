// Tests of vitec.cpp and words.cpp: headers to the byte.
#include "formats/vitec.h"
#include "formats/words.h"
#include "std/std.h"
#include "support/file_test.h"

#include <ctime>

using Vitec = FileTest;

TEST_F(Vitec, HeaderIsWrittenToTheByte)
{
    ::setenv("TZ", "EST-05:30", 1);  // five hours and a half ahead
    ::tzset();
    for (const std::int32_t nbands : {1, 2, 3}) {
        const test_geometry image{100, 200, nbands, 2, 64, 16};
        bytes expected = vitec_file(image);
        std::ranges::copy(std::string("VITec"), &expected[32]);
        put_word(expected, 116, 256 * 100 * nbands * 2 + 132);
        put_word(expected, 164, nbands < 3 ? 1 : 0);

        const std::time_t now = std::time(nullptr) + (5 * 60 + 30) * 60;
        const img_desc *const desc = img_find_image(creating(m_name, 0, image).result);
        EXPECT_EQ((std::array{desc->swap, desc->layout, desc->std_file->data_offset}),
                  (std::array{IMG_WRITES_SWAPPED ? 1 : 0, 2, 244}));
        bytes header = read_file(m_file);
        std::tm date{header[21], header[20], header[19], header[18], header[17], header[16],
                     0,          0,          0,          0,          nullptr};
        EXPECT_LE(std::abs(::timegm(&date) - now), 2);
        std::fill_n(&header[16], 6, std::uint8_t{0});
        EXPECT_EQ(header, expected);
        img_closefile(desc->handle);
        EXPECT_EQ(read_file(m_file).size(), 244 + 256 * 112 * nbands * 2);
    }
}

TEST_F(Vitec, RefusedImagesLeaveWhatWasWrittenBefore)
{
    const std::pair<test_geometry, std::size_t> cases[] = {
        {{.nbands = 4}, 48 + 64},
        {{.tile_nsamps = 12}, 48 + 64},
        {{.nbytes = 3}, 48 + 64},
        {{.nlines = -1}, VITEC_HEADER},
        {{.nlines = 1 << 16, .nsamps = 1 << 16}, VITEC_HEADER}};
    for (const auto &[image, length] : cases) {
        EXPECT_EQ(creating(m_name, IMG_TYPE_VITEC, image).result, -1);
        EXPECT_EQ(read_file(m_file).size(), length);
    }
}

TEST_F(Vitec, TotalLengthWrapsAndRaisesTheWidthAlone)
{
    const std::pair<test_geometry, std::uint32_t> cases[] = {
        {{1000, 1000, 1, 2, 256, 256}, 2048132},
        {{1000, 1000, 1, 1, 256, 0}, 1000132},
        {{1000, 1000, 3, 1, 0, 256}, 3000132},
        {{40000, 60000, 2, 1, 0, 0}, 505032836}};
    for (const auto &[image, expected] : cases) {
        img_vitec_image_block block;
        img_vitec_build_image_block(&block, image.nlines, image.nsamps, image.tile_nsamps,
                                    image.tile_nlines, image.nbands, image.nbytes, 64);
        EXPECT_EQ(img_get_word(block.bytes, IMG_VITEC_AT_TOTAL_LENGTH), expected);
    }
}

TEST(VitecTiles, ArePowersOfTwoFromEightTo32768)
{
    for (const std::int32_t size : {8, 16, 32768}) EXPECT_TRUE(img_vitec_is_tile_size(size));
    for (const std::int32_t size : {-8, 0, 4, 12, 65536, 0x10008})
        EXPECT_FALSE(img_vitec_is_tile_size(size)) << size;
}
