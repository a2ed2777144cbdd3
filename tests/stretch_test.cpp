// The contrast stretch against a second, plain computation.
#include "chain/chain.h"
#include "support/random.h"
#include "support/refusal.h"
#include "support/stretch_model.h"

#include <cstring>

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
    for (int round = 0; round < 400; ++round) {
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
        for (int bits_out = 1; bits_out <= bits_in; ++bits_out)
            ASSERT_EQ(computed(histogram, bits_in, bits_out),
                      expected_stretch(histogram, bits_in, bits_out))
                << "round " << round << ", " << bits_in << " to " << bits_out << " bits";
        const samples wider = computed(histogram, bits_in, 16);
        ASSERT_TRUE(std::is_sorted(wider.begin(), wider.end())) << round;
    }
}

TEST(Stretch, MultipliesByTheGainRatherThanDividesBySpan)
{
    int spans_that_differ = 0;
    for (std::size_t span = 1; span <= 4033; ++span) {
        counters histogram(4096);  // two values: the cuts fall right behind them
        histogram[21] = histogram[21 + span] = 100;
        const samples lut = computed(histogram, 12, 8);
        const double gain = 4096.0 / static_cast<double>(span);
        bool differs = false;
        for (std::size_t above = 0; above < span; ++above) {
            ASSERT_EQ(lut[22 + above], static_cast<int>(static_cast<double>(above) * gain) >> 4);
            differs = differs || lut[22 + above] != (above * 4096 / span) >> 4;
        }
        spans_that_differ += differs ? 1 : 0;
    }
    EXPECT_EQ(spans_that_differ, 222);
}

TEST(Stretch, RefusesWidthsThatItHasNoTableFor)
{
    const counters ones(256, 1);
    samples lut(256, UNTOUCHED);
    const img_chain_lut widths{8, 8, 256, nullptr, 0}, other_widths{9, 8, 512, nullptr, 0};
    const std::string where = "img_chain_compute_stretch_lut: ";
    for (const int bits : {-1, 0, 17, INT32_MAX})
        EXPECT_EQ(refusal(img_chain_compute_stretch_lut, ones.data(), bits, &widths, lut.data()),
                  where + "Invalid arguments\n");
    EXPECT_EQ(refusal(img_chain_compute_stretch_lut, nullptr, 8, &widths, lut.data()),
              where + "Invalid arguments\n");
    EXPECT_EQ(refusal(img_chain_compute_stretch_lut, ones.data(), 8, &other_widths, lut.data()),
              where + "histogram doesnt match lut bits_in\n");
    EXPECT_EQ(lut, samples(256, UNTOUCHED));
    EXPECT_EQ(img_chain_compute_stretch_lut(ones.data(), 8, nullptr, lut.data()), 0);
    EXPECT_EQ(lut, expected_stretch(ones, 8, 8));  // as wide as the input
}

TEST(StretchOfABuffer, TakesEveryFourthSampleOfEachLineButTheFill)
{
    random_numbers random(2);
    for (int round = 0; round < 300; ++round) {
        const std::int32_t nbytes = 1 + round % 2;
        const int bits = nbytes == 1 ? random.within(4, 8) : random.within(5, 16);
        const std::int32_t nlines = random.within(1, 5), nsamps = random.within(1, 30);
        const std::int32_t stride = nsamps + random.within(0, 2);
        const auto fill = static_cast<std::uint16_t>(random.below(round % 4 == 0 ? 65536 : 16));
        const img_buffer_def def{nlines, nsamps, 0, 0, stride, nbytes, bits, fill};
        samples window;
        bytes buffer(static_cast<std::size_t>(nlines * stride * nbytes), 0xEE);
        for (std::int32_t i = 0; i < nlines * nsamps; ++i) {
            const std::uint32_t any = random.below(2U << bits);  // half of them beyond the bits
            auto sample = static_cast<std::uint16_t>(random.below(4) == 0 ? fill : any);
            if (nbytes == 1) sample &= 0xFF;
            window.push_back(sample);
            const std::int32_t at = (i / nsamps * stride + i % nsamps) * nbytes;
            std::memcpy(&buffer[static_cast<std::size_t>(at)], &sample,
                        static_cast<std::size_t>(nbytes));
        }
        const int bits_out = std::min(bits, 8);
        samples lut(std::size_t{1} << bits, UNTOUCHED);
        ASSERT_EQ(
            img_chain_create_stretch_lut_from_buffer(buffer.data(), &def, lut.data(), bits_out), 0);
        ASSERT_EQ(lut, expected_stretch(window, nsamps, fill, bits, bits_out)) << round;
    }
}

TEST(StretchOfABuffer, SaysWhichWidthsItDoesNotStretch)
{
    const bytes buffer(16);
    for (const std::int32_t bits : {17, INT32_MAX, 0, -1, INT32_MIN}) {
        const img_buffer_def def{2, 4, 0, 0, 4, 2, bits, 0};
        std::uint16_t lut = UNTOUCHED;
        const auto create = [&] {
            return img_chain_create_16to8_lut(nullptr, buffer.data(), &def, &lut);
        };
        if (bits > 0)
            EXPECT_EQ(refusal(create), "img_chain_create_16to8_lut:image resolution overflow\n");
        else
            EXPECT_EQ(printed_by([&] { EXPECT_EQ(create(), 0); }),
                      "img_chain_compute_stretch_lut: Invalid arguments\n");
        EXPECT_EQ(lut, UNTOUCHED);
    }
}

}  // namespace
