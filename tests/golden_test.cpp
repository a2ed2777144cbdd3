// Files that were made outside this code, each explained in data/README.md, and what the library
// makes of them: geometry, windows, whole tiles, stretched and raw samples, and a truncated line.
#include "base/types.h"
#include "std/std.h"
#include "support/file_test.h"
#include "support/sample.h"
#include "support/stretch_model.h"

#include <numeric>

namespace {

struct golden_file {
    const char *name;
    std::int32_t type;
    test_geometry image;
    bool little_endian = false;
    std::int32_t data_offset = 0;

    friend std::ostream &operator<<(std::ostream &out, const golden_file &each)
    {
        return out << each.name;
    }
};

std::int32_t sample_of(const test_geometry &image, std::int32_t band, std::int32_t line,
                       std::int32_t samp)
{
    return image.nbytes == 1 ? (band * 101 + line * 31 + samp * 7) % 251
                             : (band * 501 + line * 13 + samp * 3) % 4096;
}

class Golden : public testing::TestWithParam<golden_file> {
protected:
    // Expects the samples of a window in `rows`, which lie side by side.
    void expect_samples(const transfer &request, const bytes &rows, bool exchanged = false) const
    {
        const test_geometry &image = GetParam().image;
        for (std::int32_t i = 0; i < request.nlines * request.nsamps; ++i) {
            const std::int32_t line = request.line + i / request.nsamps,
                               samp = request.samp + i % request.nsamps;
            if (line >= image.nlines || samp >= image.nsamps) continue;
            auto sample =
                get_sample(&rows[static_cast<std::size_t>(i * image.nbytes)], image.nbytes);
            if (exchanged) sample = static_cast<std::uint16_t>(sample << 8U | sample >> 8U);
            ASSERT_EQ(sample, sample_of(image, request.band, line, samp))
                << request.band << ' ' << line << ' ' << samp;
        }
    }
};

TEST_P(Golden, IsReadAsItWasMade)
{
    const auto &[name, type, image, little_endian, data_offset] = GetParam();
    const img_handle handle =
        img_openfile((std::string(IMGFILE_TEST_DATA "/") + name).c_str(), IMG_OPEN_READ_ONLY);
    img_desc *const desc = img_find_image(handle);
    ASSERT_NE(desc, nullptr);
    std::array<std::int32_t, 6> answers{
        0, 0, 0, 0, img_query_num_bands(handle), img_query_image_type(handle)};
    img_query_dimension(handle, &answers[0], &answers[1]);
    img_query_tile_size(handle, &answers[2], &answers[3]);
    EXPECT_EQ(answers, (std::array{image.nlines, image.nsamps, image.tile_nsamps, image.tile_nlines,
                                   image.nbands, type}));
    EXPECT_EQ(img_query_nbits(handle), image.nbytes == 1 ? 8 : 12);
    EXPECT_EQ(desc->std_file->data_offset, data_offset);
    const bool exchanged = little_endian != IS_LITTLE_ENDIAN;
    for (std::int32_t band = 0; band < image.nbands; ++band)
        for (const transfer &at :
             {transfer{band, 0, 0, image.nlines, image.nsamps}, {band, 5, 7, 3, 2}}) {
            const auto count = static_cast<std::size_t>(at.nlines * at.nsamps);
            bytes raw(count * static_cast<std::size_t>(image.nbytes)), delivered(count);
            EXPECT_EQ(img_type_of(desc).read(desc, at.line, at.samp, at.nlines, at.nsamps, band,
                                             raw.data(), at.nsamps),
                      0);
            expect_samples(at, raw);
            EXPECT_EQ(load(handle, at, delivered.data()), 0);
            samples window, identity(256);
            std::iota(identity.begin(), identity.end(), std::uint16_t{0});
            for (std::size_t i = 0; i < count; ++i)
                window.push_back(get_sample(&raw[i * raw.size() / count], image.nbytes));
            const samples lut =
                image.nbytes == 1 ? identity : expected_stretch(window, at.nsamps, 0, 12, 8);
            for (std::size_t i = 0; i < count; ++i) ASSERT_EQ(delivered[i], lut[window[i]]);
        }
    const tile_grid grid = tiles_of(image);
    for (std::int32_t tile = 0; tile < grid.across * grid.down * image.nbands; ++tile) {
        bytes plane(static_cast<std::size_t>(grid.height * grid.width * image.nbytes));
        const std::int32_t band = tile % image.nbands, number = tile / image.nbands;
        EXPECT_EQ(load(handle, {.band = band, .line = number, .tiles = true}, plane.data()), 0);
        const auto across = static_cast<std::int32_t>(grid.across);
        expect_samples({band, number / across * image.tile_nlines,
                        number % across * image.tile_nsamps, image.tile_nlines, image.tile_nsamps},
                       plane, exchanged && image.nbytes == 2);
    }
    img_closefile(handle);
}

constexpr std::int32_t vitec = IMG_TYPE_VITEC, helava = IMG_TYPE_HELAVA;
INSTANTIATE_TEST_SUITE_P(
    Files, Golden,
    testing::Values(
        golden_file{"untiled_8bit.img", vitec, {.nlines = 37, .nsamps = 53}, false, VITEC_HEADER},
        golden_file{"untiled_3bands_little.img",
                    vitec,
                    {.nlines = 20, .nsamps = 31, .nbands = 3},
                    true,
                    VITEC_HEADER},
        golden_file{"tiled_3bands.img", vitec, {37, 53, 3, 1, 8, 16}, false, VITEC_HEADER},
        golden_file{"untiled_16bit.img",
                    vitec,
                    {.nlines = 29, .nsamps = 41, .nbytes = 2},
                    false,
                    VITEC_HEADER},
        golden_file{"tiled_16bit_little.img", vitec, {29, 41, 2, 2, 32, 8}, true, VITEC_HEADER},
        golden_file{"long_header.img", vitec, {.nlines = 9, .nsamps = 11}, false, 504},
        golden_file{"helava_2bands.d", helava, {.nlines = 23, .nsamps = 35, .nbands = 2}},
        golden_file{"helava_little.d", helava, {.nlines = 23, .nsamps = 35}, true}),
    [](const auto &each) {
        return std::string(each.param.name, std::string_view(each.param.name).find('.'));
    });

TEST(GoldenFile, ThatIsTruncatedIsReadUpToThere)
{
    const img_handle handle =
        img_openfile(IMGFILE_TEST_DATA "/cut_in_line_20.img", IMG_OPEN_READ_ONLY);
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
