// Tests of std_samples.cpp: the kernels that copy rows of samples.
#include "std/std_samples.h"
#include "support/effort.h"
#include "support/format_rules.h"
#include "support/random.h"

#include <gtest/gtest.h>

TEST(CopyingRows, MovesSampleAfterSample)
{
    random_numbers random(1);
    const bytes from = numbered(bytes(40'000), 0, 40'000);
    for (int i = rounds(20'000); i > 0; --i) {
        const auto below = [&](std::uint32_t count) { return std::size_t{random.below(count)}; };
        const std::size_t width = 1 + below(2), first = below(5);
        const std::size_t step = width * (1 + below(3)), nsamps = below(i % 9 == 0 ? 300 : 40);
        const std::size_t pitch = step * (nsamps + below(2) * 7),
                          to_pitch = width * (nsamps + below(2));
        const std::size_t nrows = below(18);
        const bool exchange = width == 2 && below(2) == 0;
        bytes to(to_pitch * nrows + nsamps * width + 1, 0xEE), expected = to;
        for (std::size_t row = 0; row < nrows; ++row)
            for (std::size_t samp = 0; samp < nsamps; ++samp)
                for (std::size_t k = 0; k < width; ++k)
                    expected[row * to_pitch + samp * width + k] =
                        from[first + row * pitch + samp * step + (exchange ? 1 - k : k)];
        img_std_copy_rows({&from[first], pitch, step}, &to[0], to_pitch, nrows, nsamps,
                          static_cast<std::int32_t>(width), exchange);
        ASSERT_EQ(to, expected);
    }
}
