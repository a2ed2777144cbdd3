// Tests of local_time_posix.cpp, which dates VITec files.
#include "io/local_time.h"
#include "support/file_test.h"

using LocalTime = FileTest;

TEST_F(LocalTime, IsStoredInFilesIfItIsKnown)
{
    for (bool *const missing : {&host.has_no_time, &host.has_no_local_time}) {
        *missing = true;
        EXPECT_EQ(img_closefile(creating(m_file, IMG_TYPE_VITEC, {}).result), 0);
        *missing = false;
        const bytes file = read_file(m_file);
        ASSERT_EQ(file.size(), 245U);
        EXPECT_EQ(bytes(&file[16], &file[22]), bytes(6));
    }
    ::setenv("TZ", "EST5", 1);  // where the day has another hour
    const auto date = img_local_time();
    ::setenv("TZ", "EST-7", 1);
    EXPECT_NE(img_local_time(), date);
}
