#include "formats/vitec.h"

#include "formats/words.h"
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
        std::fill_n(&header[16], 6, std::uint8_t{0});
        EXPECT_EQ(header, expected);
        img_closefile(desc->handle);
        EXPECT_EQ(read_file(m_file).size(), 244 + 256 * 112 * nbands * 2);
    }
}

TEST_F(Vitec, TotalLengthWrapsAndRaisesTheWidthAlone)
{
    const std::pair<test_geometry, std::uint32_t> cases[] = {
        {{1000, 1000, 1, 1, 0, 0}, 1000132},
        {{1000, 1000, 1, 1, 256, 256}, 1024132},
        {{1000, 1024, 1, 2, 256, 8}, 2048132},
        {{1000, 1000, 3, 1, 0, 256}, 3000132},
        {{1000, 1000, 1, 1, 256, 0}, 1000132},
        {{65536, 65536, 1, 1, 0, 0}, 132},
        {{65537, 65537, 1, 2, 0, 0}, 262278},
        {{40000, 60000, 1, 1, 0, 0}, 2400000132},
        {{-1, 1, 1, 1, 0, 0}, 131}};
    for (const auto &[image, expected] : cases) {
        img_vitec_image_block block{};
        img_vitec_build_image_block(&block, image.nlines, image.nsamps, image.tile_nsamps,
                                    image.tile_nlines, image.nbands, image.nbytes, 64);
        EXPECT_EQ(img_get_word(block.bytes, IMG_VITEC_AT_TOTAL_LENGTH), expected);
    }
}

TEST_F(Vitec, CreateChecksBandsThenTilesThenSampleSize)
{
    const char *const none = "";
    const char *const bands = "Unsupported number of bands, must be less than 4!!\n";
    const char *const tile = "Unsupported tile size, must be power of 2 >= 8!!\n";
    const char *const bits = "Unsupported # bits per pixel (3)!!\n";
    const struct {
        std::int32_t tile_nsamps, tile_nlines, nbands, nbytes;
        const char *text;
    } cases[] = {
        {8, 8, 1, 1, none},       {0, 0, 3, 2, none},         {0x8000, 16, 1, 1, none},
        {8, 0x10008, 1, 1, none}, {0x10008, 8, 1, 1, none},   {4, 8, 1, 1, tile},
        {8, 4, 1, 1, tile},       {12, 0, 1, 1, tile},        {0, 12, 1, 1, tile},
        {-8, 8, 1, 1, tile},      {8, INT32_MIN, 1, 1, tile}, {INT32_MIN + 8, 8, 1, 1, tile},
        {0x10000, 8, 1, 1, tile}, {8, 0x18008, 1, 1, tile},   {4, 4, 4, 3, bands},
        {4, 4, 3, 3, tile},       {0, 0, 1, 3, bits}};
    for (const auto &[tile_nsamps, tile_nlines, nbands, nbytes, text] : cases) {
        const outcome seen = creating(m_name, 0, {9, 9, nbands, nbytes, tile_nsamps, tile_nlines});
        EXPECT_EQ(seen.result, text == none ? 0 : -1);
        EXPECT_EQ(seen.text, text == none ? none : text + could_not_create(m_name));
        EXPECT_EQ(read_file(m_file).size(), text == none ? 244 : 112);
        img_closefile(seen.result);
    }
}

TEST_F(Vitec, HeaderLeadsToItsPartsInEitherByteOrder)
{
    // The second number is where samples begin; -1: refused.
    const std::pair<vitec_variant, std::int32_t> cases[] = {
        {{108, 132}, 244}, {{44, 68}, 116},        {{296, 200}, 500},        {{296, -90}, 210},
        {{296, -300}, 0},  {{296, -301}, -1},      {{296, INT32_MIN}, -1},   {{296, INT32_MAX}, -1},
        {{-5, 132}, -1},   {{INT32_MIN, 132}, -1}, {{INT32_MAX, 132}, -1},   {{532, 132}, 668},
        {{533, 132}, -1},  {{108, 132, 6}, -1},    {{108, 132, 7 << 24}, -1}};
    for (auto [variant, data_offset] : cases)
        for (const std::int32_t little_endian : {0, 1}) {
            variant.little_endian = little_endian != 0;
            write_file(m_file, vitec_file({2, 3, 4, 2, 8, 16}, 604, variant));
            const outcome seen = opening(m_name);
            EXPECT_TRUE(data_offset == -1 ? seen == REFUSED_QUIETLY : seen.result == 0);
            const img_desc *const desc = img_find_image(seen.result);
            if (desc == nullptr) continue;
            const std::int32_t swap = IMG_WRITES_SWAPPED ? 1 - little_endian : little_endian;
            EXPECT_EQ((std::array{desc->nlines, desc->nsamps, desc->nbands, desc->nbytes,
                                  desc->nbits, desc->tile_nsamps, desc->tile_nlines, desc->layout}),
                      (std::array{2, 3, 4, 2, 12, 8, 16, 2}));
            EXPECT_EQ((std::array{desc->swap, desc->std_file->data_offset}),
                      (std::array{swap, data_offset}));
            img_closefile(seen.result);
        }
    bytes decoy = vitec_file({}, 604, {44, 132});  // a block where a failed seek leaves the reader
    put_word(decoy, 4, -5);
    write_file(m_file, decoy);
    EXPECT_EQ(opening(m_name), REFUSED_QUIETLY);
}

}  // namespace
