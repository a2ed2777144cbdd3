// Tests of ramp.cpp: tables that are computed in place of being looked up.
#include "chain/ramp.h"

#include "base/count.h"
#include "chain/chain.h"
#include "chain/chain_lut.h"
#include "support/effort.h"
#include "support/files.h"
#include "support/random.h"
#include "support/stretch_model.h"
#include "support/transfer.h"

#include <gtest/gtest.h>

TEST(Ramps, MapAsTheTableDoes)
{
    random_numbers random(1);
    samples given(70'000);
    for (std::size_t i = 0; i < given.size(); ++i) given[i] = static_cast<std::uint16_t>(i);
    // Rows with gaps on both sides, which stay.
    constexpr std::int32_t nlines = 7, nsamps = 9'990, stride = 10'000, to_stride = 10'003;
    const img_buffer_def from{nlines, nsamps, 0, 0, stride, 2, 12, 0};
    const img_buffer_def to{nlines, nsamps, 0, 0, to_stride, 1, 8, 0};
    int ramps = 0, tables = 0;
    for (; tables < 40 + rounds(1000); ++tables) {
        const std::int32_t bits = tables % 4 == 0 ? random.within(1, 13) : 12, size = 1 << bits;
        counters histogram(img_count(size));
        for (int k = random.within(0, 3); k > 0; --k)
            histogram[random.below(static_cast<std::uint32_t>(size))] += random.below(1000);
        samples table = expected_stretch(histogram, bits, 8);
        if (tables % 7 == 0)
            std::ranges::fill(table, samples{0, 1, 255, 256, 300}[img_count(tables % 5)]);
        if (tables % 5 == 0) table[random.below(static_cast<std::uint32_t>(size))] ^= 1;
        img_chain_ramp ramp;
        ramps += img_chain_find_ramp(table.data(), size, &ramp) ? 1 : 0;
        img_chain_lut record{static_cast<std::uint8_t>(bits), 8, size, table.data(), 0};
        bytes mapped(std::size_t{nlines} * to_stride, UNTOUCHED), expected = mapped;
        img_buffer_def narrow = from;
        narrow.nbits = bits;
        ASSERT_EQ(img_chain_lut_remap(&record, reinterpret_cast<const std::uint8_t *>(&given[0]),
                                      &narrow, &mapped[0], &to, 0, nullptr),
                  0);
        for (std::size_t i = 0; i < std::size_t{nlines} * nsamps; ++i) {
            const std::size_t sample = given[i / nsamps * stride + i % nsamps];
            expected[i / nsamps * to_stride + i % nsamps] =
                static_cast<std::uint8_t>(table[std::min(sample, table.size() - 1)]);
        }
        ASSERT_EQ(mapped, expected);
    }
    EXPECT_GT(ramps, tables / 4);
    EXPECT_LT(ramps, tables);
}
