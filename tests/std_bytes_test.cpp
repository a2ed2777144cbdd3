// Tests of std_bytes.cpp: positions in a file, and its growth.
#include "io/io_method.h"
#include "std/std.h"
#include "std/std_bytes.h"
#include "std/std_setup.h"
#include "support/file_test.h"

#include <fstream>

namespace {

using Bytes = FileTest;
constexpr std::int32_t HEADER = TEST_HEADER_LENGTH;

TEST_F(Bytes, AreZeroUpToAWriteAndToTheFullSize)
{
    img_desc *const desc = img_find_image(create_test_file(m_name, {.nsamps = 100}));
    bytes expected = read_file(m_file);
    expected.resize(90);
    expected[HEADER + 3] = '+';
    expected.insert(expected.end(), {'n', 'e', 'w'});
    EXPECT_EQ(img_std_extend(desc, 3), 0);
    EXPECT_EQ(desc->io_method->seek(desc->std_file->data_fd, 0, 1), HEADER + 3);
    std::ofstream(m_file, std::ios::app) << "+";  // grown by someone else meanwhile
    EXPECT_EQ(img_std_write_at(desc, 90, "new", 3), 3);
    EXPECT_EQ((std::array{desc->std_file->veof, desc->std_file->veof_max}),
              (std::array{93, HEADER}));
    EXPECT_EQ(read_file(m_file), expected);
    img_closefile(desc->handle);
    expected.resize(HEADER + 100);
    EXPECT_EQ(read_file(m_file), expected);
    expected.push_back('+');  // what is longer stays so
    write_file(m_file, expected);
    img_closefile(opening(m_name).result);
    EXPECT_EQ(read_file(m_file), expected);
}

TEST_F(Bytes, AreNotReadBeyond31Bits)
{
    img_desc *const desc = img_find_image(create_test_file(m_file, {}));
    char byte;
    EXPECT_EQ(img_std_read_at(desc, std::int64_t{1} << 31, &byte, 1), -1);
    EXPECT_EQ(errno, EOVERFLOW);
    img_closefile(desc->handle);
}

TEST_F(Bytes, LeaveAReasonWhereTheyCannotBeMoved)
{
    img_desc *const desc = img_find_image(create_test_file(m_name, {}));
    std::uint8_t sample = 0;
    const std::int64_t beyond = std::int64_t{INT32_MAX} + 1;
    EXPECT_EQ(img_std_read_at(desc, beyond, &sample, 1), -1);
    EXPECT_EQ(std::exchange(errno, 0), EOVERFLOW);
    EXPECT_EQ(img_std_write_at(desc, beyond, &sample, 1), -1);
    EXPECT_EQ(std::exchange(errno, 0), EOVERFLOW);
    int missed = 0;  // of a method that gives no reason, which still fails for one
    img_std_note_missed(desc, HEADER, -1, 1, &missed);
    EXPECT_EQ(missed, EIO);
    fault_arm(io_call::seek, 1);
    EXPECT_EQ(img_std_extend(desc, 3), -1);
    EXPECT_EQ(std::exchange(errno, 0), EIO);
    img_closefile(desc->handle);
    img_desc *const memory = img_find_image(create_test_memory({}));
    EXPECT_EQ(img_std_extend(memory, 5), 0);
    img_closefile(memory->handle);
}

}  // namespace
