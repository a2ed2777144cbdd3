// Tests of std_region.cpp and of the transfers of lines for callers inside the library. Regions
// that a host can ask for are tested in transfers_test.
#include "std/std_region.h"

#include "std/std_interleaved_lines.h"
#include "std/std_lines.h"
#include "std/std_offset.h"
#include "support/file_test.h"

namespace {

using Regions = FileTest;

TEST_F(Regions, OfNoLinesMoveNothing)
{
    img_desc *const desc =
        img_find_image(create_test_file(m_file, {.nlines = 2, .nsamps = 2, .nbands = 2}));
    const bytes before = read_file(m_file);
    std::uint8_t sample = UNTOUCHED;
    for (const std::int32_t nlines : {0, -1, INT32_MIN}) {
        EXPECT_EQ(img_std_read(desc, 0, 0, nlines, 1, 0, &sample, 1), 0);
        EXPECT_EQ(img_std_write(desc, 0, 0, nlines, 1, 0, &sample, 1, nullptr), 0);
        EXPECT_EQ(img_read_nontiled(desc, 0, 0, nlines, 1, 0, &sample, 1), 0);
        EXPECT_EQ(img_std_write_nontiled(desc, 0, 0, nlines, 1, 0, &sample, 1, nullptr), 0);
        EXPECT_EQ(img_std_read_nontiled_interleaved(desc, 0, 0, nlines, 1, 0, &sample, 1), 0);
    }
    EXPECT_EQ(img_std_read(desc, 0, 0, 1, 0, 0, &sample, 1), 0);
    for (const auto &[line, samp, band] : {std::array{-1, 0, 0}, {0, -1, 0}, {0, 0, -1}})
        EXPECT_EQ(img_std_sample_offset(desc, line, samp, band), -1);
    EXPECT_EQ(sample, UNTOUCHED);
    EXPECT_EQ(read_file(m_file), before);
    img_closefile(desc->handle);
}

}  // namespace
