#include "base/image_table.h"
#include "base/img_desc.h"
#include "formats/vitec.h"
#include "formats/words.h"
#include "imgfile/img.h"
#include "std/std.h"

#include "support/file_test.h"

#include <ctime>

namespace {

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
        const auto mode = static_cast<unsigned>(std::filesystem::status(m_file).permissions());
        EXPECT_EQ(mode & 07111U, 0U);  // no more than reading and writing
        std::fill_n(&header[16], 6, std::uint8_t{0});
        EXPECT_EQ(header, expected);
        img_closefile(desc->handle);
        EXPECT_EQ(read_file(m_file).size(), 244 + 256 * 112 * nbands * 2);
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
        block.bytes.fill(0xEE);
        img_vitec_build_image_block(&block, image.nlines, image.nsamps, image.tile_nsamps,
                                    image.tile_nlines, image.nbands, image.nbytes, 64);
        EXPECT_EQ(img_get_word(block.bytes, IMG_VITEC_AT_TOTAL_LENGTH), expected);
        EXPECT_EQ(block.bytes[IMG_VITEC_AT_DESCRIPTION], 0);
    }
}

}  // namespace
