// Tests of platform_posix.cpp and io_default.cpp: ordinary files.
#include "io/io_method.h"
#include "io/platform.h"
#include "support/file_test.h"

#include <fcntl.h>
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
    host.block_devices = true;
    EXPECT_EQ(open_and_ask(0), O_RDONLY);
    host = {.leases_files = 1};
    EXPECT_EQ(open_and_ask(0), O_RDONLY);
    host = {.leases_files = 2};
    EXPECT_EQ(open_and_ask(0), -1);
    host = {};
    for (const std::int32_t unknown : {3, 0x303, 0x306, 0x10302, -1, INT32_MIN})
        EXPECT_EQ(open_and_ask(unknown), -1) << unknown;
    EXPECT_EQ(read_file(m_file), content);
    ASSERT_EQ(::mkfifo((m_folder / "pipe").c_str(), 0600), 0);
    for (const auto &[name, error] : {std::pair{"pipe", EINVAL}, {"missing", ENOENT}}) {
        EXPECT_EQ(img_platform_open((m_folder / name).c_str(), 0, 0), -1);
        EXPECT_EQ(errno, error);
    }
    EXPECT_EQ(open_and_ask(0x201), O_WRONLY);
    EXPECT_EQ(read_file(m_file), bytes{});
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
        load(handle, {.band = 99}, nullptr);  // no such band: prints
        img_closefile(handle);
        const int flags = open_and_ask(0, F_GETFD);
        for (int fd = first; fd < 3; ++fd) {
            taken += ::fcntl(fd, F_GETFD) != -1 ? 1 : 0;
            ::dup2(saved[fd], fd);
            ::close(saved[fd]);
        }
        EXPECT_EQ(read_file(m_file), helava_file({.nlines = 4, .nsamps = 50}, 200));
        EXPECT_EQ(taken, 0);
        EXPECT_EQ(flags, FD_CLOEXEC);
    }
    EXPECT_EQ(open_and_ask(0, F_GETFD), FD_CLOEXEC);
}

TEST_F(Platform, TransfersReturnWhatWasMovedBeforeAnErrorOrTheEnd)
{
    const std::int32_t fd = img_platform_open(m_file.c_str(), 0x102, 0600);
    bytes block(16, 5);
    host.disk_size = 10;
    for (const std::int32_t expected : {10, -1})
        EXPECT_EQ(img_platform_write(fd, block.data(), 16), expected);
    host = {};
    EXPECT_EQ(img_platform_seek(fd, 0, 0), 0);
    for (const std::int32_t expected : {10, 0})
        EXPECT_EQ(img_platform_read(fd, block.data(), 16), expected);
    EXPECT_EQ(img_platform_read(fd, block.data(), 0x80000000U), -1);
    EXPECT_EQ(img_platform_write(fd, block.data(), 0x80000000U), -1);
    EXPECT_EQ(img_platform_seek(fd, 0, 0), 0);
    host.interrupts = true;
    host.reads_left = 6;  // half of them interrupted, the last one fails
    for (const std::int32_t expected : {6, -1})
        EXPECT_EQ(img_platform_read(fd, block.data(), 16), expected);
    host = {};
    img_platform_close(fd);
    for (const std::int32_t none : {fd, -1, 0}) {
        errno = 0;
        EXPECT_EQ((std::array{img_platform_read(none, block.data(), 16),
                              img_platform_write(none, block.data(), 16),
                              img_platform_seek(none, 0, 0), img_platform_close(none)}),
                  (std::array{-1, -1, -1, -1}));
        EXPECT_EQ(errno, EBADF);
    }
}

TEST_F(Platform, AsksForTheHeadOfAFileOnce)
{
    const bytes content = numbered(bytes(600), 0, 600);
    write_file(m_file, content);
    const std::int32_t fd = img_platform_open(m_file.c_str(), 2, 0);
    const auto read_at = [=](std::int32_t at, std::uint32_t count) {
        bytes block(count);
        img_platform_seek(fd, at, 0);
        block.resize(static_cast<std::size_t>(img_platform_read(fd, &block[0], count)));
        EXPECT_EQ(img_platform_seek(fd, 0, 1), at + std::ssize(block));
        return block;
    };
    const auto part = [&](std::ptrdiff_t at, std::ptrdiff_t count) {
        return bytes(content.begin() + at,
                     content.begin() + std::min<std::ptrdiff_t>(at + count, 600));
    };
    for (const auto &[at, count] :
         {std::pair{0, 4}, {112, 68}, {0, 600}, {510, 3}, {590, 20}, {700, 1}})
        EXPECT_EQ(read_at(at, static_cast<std::uint32_t>(count)),
                  at > 600 ? bytes() : part(at, count));
    EXPECT_EQ(img_platform_seek(fd, 0, 2), 600);  // and from now on it is asked for
    write_file(m_file, bytes(10));
    EXPECT_EQ(read_at(4, 20), bytes(6));
    EXPECT_EQ(img_platform_seek(fd, 0, 2), 10);
    ::close(fd);
    EXPECT_EQ(img_platform_seek(fd, 0, 2), -1);
    EXPECT_EQ(img_platform_close(fd), -1);
    write_file(m_file, content);
    const std::int32_t cut = img_platform_open(m_file.c_str(), 0, 0);
    ASSERT_EQ(::truncate(m_file.c_str(), 100), 0);
    bytes block(100);
    EXPECT_EQ(img_platform_read(cut, &block[0], 100), 100);
    EXPECT_EQ(block, part(0, 100));
    img_platform_close(cut);

    std::vector<std::int32_t> all;
    for (int i = 0; i < 65; ++i) all.push_back(img_platform_open(m_file.c_str(), 0, 0));
    EXPECT_EQ(std::pair(all.back(), errno), (std::pair{-1, EMFILE}));
    all.pop_back();
    for (const std::int32_t each : all) EXPECT_EQ(img_platform_close(each), 0);
}

TEST_F(Platform, PositionsFit31Bits)
{
    write_file(m_file, {});
    ASSERT_EQ(::truncate(m_file.c_str(), INT32_MAX), 0);
    const std::int32_t fd = img_platform_open(m_file.c_str(), 2, 0600);
    EXPECT_EQ(img_platform_seek(fd, 0, 2), INT32_MAX);
    for (const auto &[offset, whence] :
         {std::array{8, 1}, {INT32_MAX, 1}, {1, 2}, {0, 3}, {0, -1}}) {
        EXPECT_EQ(img_platform_seek(fd, INT32_MAX - 7, 0), INT32_MAX - 7);
        EXPECT_EQ(img_platform_seek(fd, offset, whence), -1) << offset << " from " << whence;
    }
    img_platform_close(fd);
    EXPECT_EQ(img_lookup_io_method("")->unlink(m_file.c_str()), 0);
    EXPECT_FALSE(std::filesystem::exists(m_file));
}

}  // namespace
