// Files that were made outside this code, each explained in data/README.md, and what the library
// makes of them: geometry, samples, windows, whole tiles, and a truncated line.
#include "support/file_test.h"
#include "support/sample.h"

namespace {

constexpr struct {
    const char *name;
    std::int32_t type;
    test_geometry image;
    std::int32_t data_offset = VITEC_HEADER;
    bool little_endian = false;
} golden_files[] = {
    {"untiled_8bit.img", IMG_TYPE_VITEC, {.nlines = 37, .nsamps = 53}},
    {"untiled_3bands_little.img", IMG_TYPE_VITEC, {20, 31, 3}, VITEC_HEADER, true},
    {"tiled_3bands.img", IMG_TYPE_VITEC, {37, 53, 3, 1, 8, 16}},
    {"untiled_16bit.img", IMG_TYPE_VITEC, {.nlines = 29, .nsamps = 41, .nbytes = 2}},
    {"tiled_16bit_little.img", IMG_TYPE_VITEC, {29, 41, 2, 2, 32, 8}, VITEC_HEADER, true},
    {"long_header.img", IMG_TYPE_VITEC, {.nlines = 9, .nsamps = 11}, 504},
    {"helava_2bands.d", IMG_TYPE_HELAVA, {.nlines = 23, .nsamps = 35, .nbands = 2}, 0},
    {"helava_little.d", IMG_TYPE_HELAVA, {.nlines = 23, .nsamps = 35}, 0, true}};

TEST(GoldenFiles, AreReadAsTheyWereMade)
{
    for (auto [name, type, image, data_offset, little_endian] : golden_files) {
        const std::string path = std::string(IMGFILE_TEST_DATA "/") + name;
        image.layout = has_tiles(image) ? IMG_LAYOUT_TILED : IMG_LAYOUT_BSQ;
        image.swap = little_endian != IS_LITTLE_ENDIAN ? 1 : 0;
        const img_handle handle = opening(path, IMG_OPEN_READ_ONLY).result;
        ASSERT_EQ(img_query_image_type(handle), type) << name;
        EXPECT_EQ(img_query_nbits(handle), image.nbytes == 1 ? 8 : 12) << name;
        expect_reads({image, data_offset, read_file(path)}, handle);
        for (std::int32_t i = 0; i < image.nbands * image.nlines * image.nsamps; ++i) {
            const std::int32_t band = i % image.nbands, samp = i / image.nbands % image.nsamps;
            const std::int32_t line = i / image.nbands / image.nsamps;
            std::array<std::uint8_t, 2> sample;
            EXPECT_EQ(load(handle, {band, line, samp}, sample.data()), 0);
            ASSERT_EQ(get_sample(sample.data(), image.nbytes),
                      image.nbytes == 1 ? (band * 101 + line * 31 + samp * 7) % 251
                                        : (band * 501 + line * 13 + samp * 3) % 4096)
                << name << ' ' << band << ' ' << line << ' ' << samp;
        }
        img_closefile(handle);
    }
}

TEST(GoldenFiles, ThatAreTruncatedAreReadUpToThere)
{
    const img_handle handle =
        opening(IMGFILE_TEST_DATA "/cut_in_line_20.img", IMG_OPEN_READ_ONLY).result;
    bytes lines(53 * 21, UNTOUCHED);
    EXPECT_EQ(load(handle, {.nlines = 20, .nsamps = 53}, lines.data()), 0);
    EXPECT_EQ(lines[19 * 53 + 52], (19 * 31 + 52 * 7) % 251);
    EXPECT_EQ(load(handle, {.line = 20, .nsamps = 17}, lines.data()), 0);
    EXPECT_EQ(lines[16], (20 * 31 + 16 * 7) % 251);
    EXPECT_EQ(refusal([&] {
                  return load(handle, {.line = 19, .nlines = 2, .nsamps = 53}, lines.data());
              }),
              "img_read_nontiled: 17 of 53 bytes read!!\n");
    img_closefile(handle);
}

}  // namespace
