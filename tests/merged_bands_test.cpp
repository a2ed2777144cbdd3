// Tests of merged_bands.cpp: types that merge the bands of their images, and that see windows
// unclipped.
#include "base/types.h"
#include "support/file_test.h"

namespace {

std::array<std::int32_t, 5> asked;  // of the type below: window and band
std::int32_t answer = 0, failing_band = -1;
const auto note_request = [](auto, auto line, auto samp, auto nlines, auto nsamps, auto band,
                             auto *buffer, auto...) {
    asked = {line, samp, nlines, nsamps, band};
    if constexpr (std::is_same_v<decltype(buffer), std::uint8_t *>)
        *buffer = static_cast<std::uint8_t>(*buffer + band + 1);
    return band == failing_band ? -1 : answer;
};

TEST(MergedBands, AreReadForTheWholeWindowUntilOneFails)
{
    const img_handle image = create_test_memory({.nbands = 3});
    img_desc *const desc = img_find_image(image);
    img_type_desc &slot = img_type_table[TEST_TYPE];
    const setting type(slot, slot);
    slot.read = note_request;
    slot.write = note_request;
    desc->unclipped = desc->merge_bands = 1;
    desc->merge_fn = [](auto line, auto samp, auto nlines, auto nsamps, auto stride, auto nbytes,
                        auto nbands, auto *bands, auto *buffer) {
        EXPECT_EQ((std::array{line, samp, nlines, nsamps, stride, nbytes}),
                  (std::array{0, 0, 2, 1, 3, 1}));
        for (std::int32_t band = 0; band < nbands; ++band)
            *buffer = static_cast<std::uint8_t>(*buffer * 10 + *bands[band]);
        return -1;  // is ignored
    };
    constexpr transfer window{.line = -4, .samp = 5, .nlines = 2, .stride = 3};
    bytes buffer(5, UNTOUCHED);
    EXPECT_EQ(img_query_num_bands(image), 1);
    EXPECT_EQ(load(image, window, buffer.data()), 0);
    EXPECT_EQ(buffer, (bytes{123, UNTOUCHED, UNTOUCHED, 0, UNTOUCHED}));
    EXPECT_EQ(asked, (std::array{-4, 5, 2, 1, 2}));
    failing_band = 1;
    EXPECT_EQ(load(image, window, buffer.data()), -1);
    EXPECT_EQ(asked.back(), 1);
    failing_band = -1;
    answer = 7;
    desc->merge_fn = nullptr;
    const std::uint8_t fill = 9;
    const transfer other{.line = 5, .samp = -4, .nlines = 2, .nsamps = 2, .stride = 3};
    EXPECT_EQ(load(image, other, buffer.data(), &fill), 7);
    EXPECT_EQ(buffer, (bytes{10, 9, UNTOUCHED, 9, 9}));
    EXPECT_EQ(dump(image, other, buffer.data()), 7);
    EXPECT_EQ(asked, (std::array{5, -4, 2, 2, 0}));
    img_closefile(image);
}

}  // namespace
