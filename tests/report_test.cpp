// Tests of report.cpp: where messages go.
#include "base/report.h"
#include "support/file_test.h"

using Messages = FileTest;

TEST_F(Messages, GoToTheSinkThatIsSet)
{
    static std::vector<std::pair<std::string, int>> told;
    const setting sink(img_message_sink,
                       [](const char *text, int error) { told.emplace_back(text, error); });
    EXPECT_EQ(creating("", IMG_TYPE_VITEC, {}).text, "");
    errno = 5;
    EXPECT_EQ(img_fail_errno("img_std_read_tiles:read"), -1);
    EXPECT_EQ(img_fail("%s!!\n", std::string(600, 'x').c_str()), -1);
    EXPECT_EQ(told[0], std::pair(std::string("No image file name specified!!"), 0));
    EXPECT_EQ(told[1], std::pair(std::string("img_std_read_tiles:read"), 5));
    EXPECT_EQ(told[2], std::pair(std::string(511, 'x'), 0));
}

TEST_F(Messages, AreKeptWithTheirError)
{
    const img_message_keeper outer;
    errno = 5;
    img_fail_errno("img_std_read_tiles:read");
    img_fail("a message without an error\n");
    EXPECT_EQ(img_message_keeper::last_error(), 5);
    {
        const img_message_keeper inner;
        EXPECT_EQ(img_message_keeper::last_error(), 0);
    }
    testing::internal::CaptureStderr();
    errno = 6;
    img_fail_errno("img_std_read_tiles:read");
    EXPECT_EQ(img_message_keeper::last_error(), 6);
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "");
}
