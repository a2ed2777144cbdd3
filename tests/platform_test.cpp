#include "io/platform.h"
#include "support/file_test.h"

#include <chrono>
#include <csignal>
#include <thread>

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

class Platform : public FileTest {
protected:
    // Opens the file, closes it, and returns what fcntl answers in between; -1: not opened.
    int open_and_ask(std::int32_t oflags, int request = F_GETFL) const
    {
        const std::int32_t fd = img_platform_open(m_file.c_str(), oflags, 0600);
        const int answer = ::fcntl(fd, request);
        EXPECT_EQ(img_platform_close(fd), fd != -1 ? 0 : -1);
        return request == F_GETFL && fd != -1 ? answer & O_ACCMODE : answer;
    }
};

TEST_F(Platform, TranslatesOpenFlags)
{
    const bytes content{1, 2, 3};
    EXPECT_EQ(open_and_ask(2), -1);
    EXPECT_EQ(open_and_ask(0x8102), O_RDWR);
    write_file(m_file, content);
    EXPECT_EQ(open_and_ask(0x8000), O_RDONLY);
    EXPECT_EQ(open_and_ask(1), O_WRONLY);
    EXPECT_EQ(open_and_ask(0x102), O_RDWR);
    for (const std::int32_t unknown : {3, 0x303, 0x306, 0x10302, -1, INT32_MIN})
        EXPECT_EQ(open_and_ask(unknown), -1) << unknown;
    EXPECT_EQ(read_file(m_file), content);
    EXPECT_EQ(open_and_ask(0x201), O_WRONLY);
    EXPECT_EQ(read_file(m_file), bytes{});
}

TEST_F(Platform, RefusesWithoutWaitingWhatIsNoFile)
{
    ASSERT_EQ(::mkfifo(m_file.c_str(), 0600), 0);
    const int lowest_free = ::dup(STDERR_FILENO);
    ::close(lowest_free);
    for (const std::string &name : {m_file, m_folder / "", std::string("/dev/null")})
        for (const std::int32_t mode : {0, 1, 2})
            EXPECT_EQ(img_platform_open(name.c_str(), mode, 0666), -1) << name << mode;
    EXPECT_EQ(::dup(STDERR_FILENO), lowest_free);
    ::close(lowest_free);
}

TEST_F(Platform, KeepsFilesApartFromStandardStreamsAndOtherPrograms)
{
    for (const int first : {0, 1, 2}) {
        int saved[3], taken = 0;
        for (int fd = first; fd < 3; ++fd) {
            saved[fd] = ::fcntl(fd, F_DUPFD, 50);
            ::close(fd);
        }
        const img_handle handle =
            img_createfile(m_file.c_str(), 4, 50, 1, IMG_TYPE_HELAVA, 0, 0, 1);
        img_load_buffer(handle, 0, 0, 1, 1, 99, nullptr, 1, nullptr);  // no such band: prints
        img_closefile(handle);
        const int flags = open_and_ask(0, F_GETFD);
        for (int fd = first; fd < 3; ++fd) {
            taken += ::fcntl(fd, F_GETFD) != -1 ? 1 : 0;
            ::dup2(saved[fd], fd);
            ::close(saved[fd]);
        }
        EXPECT_EQ(read_file(m_file), helava_file({4, 50}, 200));
        EXPECT_EQ(taken, 0);
        EXPECT_EQ(flags, FD_CLOEXEC);
    }
    EXPECT_EQ(open_and_ask(0, F_GETFD), FD_CLOEXEC);
}

TEST_F(Platform, TransfersGoOnAfterInterruptionsAndInPieces)
{
    struct sigaction interrupting {};  // without SA_RESTART: calls that wait fail with EINTR
    interrupting.sa_handler = [](int) {};
    ::sigaction(SIGUSR1, &interrupting, nullptr);
    std::signal(SIGPIPE, SIG_IGN);
    int ends[2];
    ASSERT_EQ(::pipe(ends), 0);
    constexpr std::uint32_t size = 30'000'000;  // many times what a pipe holds
    bytes sent(size), received(size);
    for (std::size_t i = 0; i < size; ++i) sent[i] = static_cast<std::uint8_t>(i * 7 >> 3);
    std::thread reader([&] {
        img_platform_read(ends[0], received.data(), size);
        ::close(ends[0]);  // lets a write that is not read to its end fail
    });
    std::thread interrupter([&, writer = ::pthread_self()] {
        for (int i = 0; i < 40; ++i) {
            std::this_thread::sleep_for(std::chrono::microseconds(500));
            ::pthread_kill(i % 2 == 0 ? reader.native_handle() : writer, SIGUSR1);
        }
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(4));  // the reader waits for its first
    EXPECT_EQ(img_platform_write(ends[1], sent.data(), size), size);
    interrupter.join();
    ::close(ends[1]);
    reader.join();
    EXPECT_TRUE(received == sent);
}

TEST_F(Platform, TransfersReturnWhatWasMovedBeforeAnErrorOrTheEnd)
{
    const std::int32_t fd = img_platform_open(m_file.c_str(), 0x102, 0600);
    bytes block(16, 5);
    rlimit limit{};
    ASSERT_EQ(::getrlimit(RLIMIT_FSIZE, &limit), 0);
    const rlimit ten_bytes{10, limit.rlim_max};
    std::signal(SIGXFSZ, SIG_IGN);
    ::setrlimit(RLIMIT_FSIZE, &ten_bytes);
    const std::array written{img_platform_write(fd, block.data(), 16),
                             img_platform_write(fd, block.data(), 16)};
    ::setrlimit(RLIMIT_FSIZE, &limit);
    EXPECT_EQ(written, (std::array{10, -1}));
    EXPECT_EQ(img_platform_seek(fd, 0, 0), 0);
    EXPECT_EQ(img_platform_read(fd, block.data(), 16), 10);
    EXPECT_EQ(img_platform_read(fd, block.data(), 16), 0);
    EXPECT_EQ(img_platform_read(fd, block.data(), 0x80000000U), -1);
    img_platform_close(fd);
    EXPECT_EQ(img_platform_read(fd, block.data(), 16), -1);
}

TEST_F(Platform, PositionsFit31Bits)
{
    const std::int32_t fd = img_platform_open(m_file.c_str(), 0x102, 0600);
    ASSERT_EQ(::truncate(m_file.c_str(), INT32_MAX), 0);
    EXPECT_EQ(img_platform_seek(fd, 0, 2), INT32_MAX);
    for (const auto &[offset, whence] :
         {std::array{8, 1}, {INT32_MAX, 1}, {1, 2}, {0, 3}, {0, -1}}) {
        EXPECT_EQ(img_platform_seek(fd, INT32_MAX - 7, 0), INT32_MAX - 7);
        EXPECT_EQ(img_platform_seek(fd, offset, whence), -1) << offset << " from " << whence;
    }
    img_platform_close(fd);
}

}  // namespace
