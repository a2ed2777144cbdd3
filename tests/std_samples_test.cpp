// Tests of std_samples.cpp: copying rows of every length.
#include "std/std_samples.h"
#include "support/files.h"

#include <gtest/gtest.h>

TEST(Samples, OfARowAndNoOthersAreCopied)
{
    constexpr std::size_t longest = 300, nrows = 3, pitch = 2 * longest + 1;
    bytes source(nrows * pitch);
    for (std::size_t i = 0; i < source.size(); ++i) source[i] = static_cast<std::uint8_t>(i % 251);
    for (const std::size_t step : {std::size_t{1}, std::size_t{2}})
        for (std::size_t nsamps = 0; nsamps <= longest; ++nsamps) {
            bytes target(nrows * longest, 255), expected = target;
            img_std_copy_rows({source.data(), pitch, step}, target.data(), longest, nrows, nsamps,
                              1, false);
            for (std::size_t i = 0; i < nrows * nsamps; ++i) {
                const std::size_t row = i / nsamps, samp = i % nsamps;
                expected[row * longest + samp] = source[row * pitch + samp * step];
            }
            EXPECT_EQ(target, expected) << nsamps << " samples, " << step;
        }
}

TEST(Samples, OfALargeRunAreAllCopied)
{
    constexpr std::size_t count = 200'000;
    bytes source(count), target(count + 1, 255);
    for (std::size_t i = 0; i < count; ++i) source[i] = static_cast<std::uint8_t>(i % 251);
    img_std_copy_rows({source.data(), 1000, 1}, target.data(), 1000, count / 1000, 1000, 1, false);
    source.push_back(255);
    EXPECT_EQ(target, source);
}
