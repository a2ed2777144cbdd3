// Tests of stretch.cpp: the contrast stretch against a second, plain computation.
#include "chain/chain.h"
#include "chain/stretch.h"
#include "support/effort.h"
#include "support/random.h"
#include "support/refusal.h"
#include "support/stretch_model.h"

namespace {

constexpr std::uint16_t UNTOUCHED = 0xABCD;

samples computed(const counters &histogram, int bits_in, int bits_out)
{
    samples lut(histogram.size(), UNTOUCHED);
    const img_chain_lut widths{static_cast<std::uint8_t>(bits_in),
                               static_cast<std::uint8_t>(bits_out), 1 << bits_in, nullptr, 0};
    EXPECT_EQ(img_chain_compute_stretch_lut(histogram.data(), bits_in, &widths, lut.data()), 0);
    return lut;
}

TEST(Stretch, AgreesWithThePlainComputationOnRandomHistograms)
{
    random_numbers random(1);
    for (int round = 0; round < rounds(1000); ++round) {
        const int bits_in = 1 + round % 16;
        const std::uint32_t size = 1U << bits_in;
        const auto [first, end] = COUNTING_BINS[bits_in - 1];
        // Few or many values, often with the first counting bin and the last, and with counts
        // that only an unsigned compare takes for large.
        counters histogram(size);
        const std::uint32_t values = round % 3 == 0 ? size : 1 + random.below(8);
        for (std::uint32_t i = 0; i < values; ++i)
            histogram[random.below(size)] += random.below(999);
        if (round % 2 == 0) histogram[first] += random.below(99);
        if (round % 5 == 0) histogram[end - 1] += random.below(999);
        if (round % 7 == 0) histogram[random.below(size)] = 0x80000000 + random.below(99);
        for (int bits_out = 1; bits_out <= 16; ++bits_out)
            ASSERT_EQ(computed(histogram, bits_in, bits_out),
                      expected_stretch(histogram, bits_in, bits_out))
                << "round " << round << ", " << bits_in << " to " << bits_out << " bits";
    }
}

TEST(Stretch, RefusesWidthsThatItHasNoTableFor)
{
    const counters ones(256, 1);
    samples lut(256, UNTOUCHED);
    const std::string where = "img_chain_compute_stretch_lut: ",
                      invalid = where + "Invalid arguments\n";
    const auto expect = [&](const std::uint32_t *histogram, std::int32_t bits, std::uint8_t bits_in,
                            std::uint8_t bits_out, const std::string &expected) {
        const img_chain_lut widths{bits_in, bits_out, 256, nullptr, 0};
        EXPECT_EQ(refusal(img_chain_compute_stretch_lut, histogram, bits, &widths, lut.data()),
                  expected);
    };
    expect(nullptr, 8, 8, 8, invalid);
    expect(ones.data(), 8, 8, 17, invalid);
    expect(ones.data(), 8, 9, 8, where + "histogram doesnt match lut bits_in\n");
    for (const std::int32_t bits : {17, INT32_MAX, 0, -1, INT32_MIN})
        expect(ones.data(), bits, 8, 8, invalid);
    const std::uint8_t sample = 0;
    img_buffer_def def{1, 1, 0, 0, 1, 1, 17, 0};
    EXPECT_EQ(refusal(img_chain_create_16to8_lut, nullptr, &sample, &def, lut.data()),
              "img_chain_create_16to8_lut:image resolution overflow\n");
    def.nbits = 0;
    EXPECT_EQ(printed_by([&] { img_chain_create_16to8_lut(nullptr, &sample, &def, lut.data()); }),
              invalid);
    EXPECT_EQ(lut, samples(256, UNTOUCHED));
    EXPECT_EQ(img_chain_compute_stretch_lut(ones.data(), 8, nullptr, lut.data()), 0);
    EXPECT_EQ(lut, expected_stretch(ones, 8, 8));  // as wide as the input
}

TEST(Stretch, StaysWithinAHistogramWhoseCountsOverflow)
{
    counters histogram(4096);
    histogram[20] = 0x80000000U;  // the first bin, which counts twice: from there on 0 and more
    histogram[4000] = 0x40000000U;
    samples lut(4096, 77);
    const img_chain_lut widths{12, 8, 4096, nullptr, 0};
    EXPECT_EQ(img_chain_compute_stretch_lut(histogram.data(), 12, &widths, lut.data()), 0);
    EXPECT_EQ((std::array{lut[0], lut[20], lut[4095]}), (std::array<std::uint16_t, 3>{0, 0, 255}));
}

TEST(Stretch, CountsEveryFourthSampleOfOneByteButTheFill)  // two bytes: load_window_test
{
    samples window(100);
    for (std::size_t i = 0; i < 100; ++i) window[i] = static_cast<std::uint8_t>(i * i % 251);
    window[8] = 9;  // the fill
    const bytes buffer(window.begin(), window.end());
    for (const int bits : {4, 8}) {  // some samples beyond them, or none
        const img_buffer_def def{4, 25, 0, 0, 25, 1, bits, 9};
        samples lut(std::size_t{1} << bits, UNTOUCHED);
        ASSERT_EQ(img_chain_create_stretch_lut_from_buffer(buffer.data(), &def, lut.data(), bits),
                  0);
        EXPECT_EQ(lut, expected_stretch(window, 25, 9, bits, bits));
        const img_buffer_def no_fill{4, 25, 0, 0, 25, 1, bits, 300};  // beyond the histogram
        img_chain_create_stretch_lut_from_buffer(buffer.data(), &no_fill, lut.data(), bits);
        EXPECT_EQ(lut, expected_stretch(window, 25, 300, bits, bits));
    }
}

}  // namespace
