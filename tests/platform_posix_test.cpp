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
    // Opens the file, closes it, and returns its mode of access in between; -1: not opened.
    int open_and_ask(std::int32_t oflags) const
    {
        const std::int32_t fd = img_platform_open(m_file.c_str(), oflags, 0600);
        const int flags = ::fcntl(fd, F_GETFL);
        EXPECT_TRUE(fd == -1 || ::fcntl(fd, F_GETFD) == FD_CLOEXEC);
        EXPECT_EQ(img_platform_close(fd), fd != -1 ? 0 : -1);
        return fd != -1 ? flags & O_ACCMODE : -1;
    }
};

TEST_F(Platform, TranslatesOpenFlags)
{
    const bytes content{1, 2, 3};
    EXPECT_EQ(open_and_ask(2), -1);
    EXPECT_EQ(open_and_ask(0x8102), O_RDWR);
    write_file(m_file, content);
    for (const auto &[oflags, answer] :
         {std::pair{0x8000, O_RDONLY}, {1, O_WRONLY}, {0x102, O_RDWR}, {3, -1}, {0x10302, -1}})
        EXPECT_EQ(open_and_ask(oflags), answer) << oflags;
    for (const fault_host &kind :
         {fault_host{.leases_files = 2}, {.leases_files = 1}, {.block_devices = true}}) {
        host = kind;
        EXPECT_EQ(open_and_ask(0), kind.leases_files == 2 ? -1 : O_RDONLY);
    }
    host = {};
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
        const img_handle handle = create(m_file, IMG_TYPE_HELAVA, {4, 50});
        load(handle, {.band = 99}, nullptr);  // no such band: prints
        img_closefile(handle);
        EXPECT_EQ(open_and_ask(0), O_RDONLY);
        // What is opened in place of a standard stream cannot stay there.
        EXPECT_EQ(limited(RLIMIT_NOFILE, 3, [&] { return open_and_ask(0); }), -1);
        for (int fd = first; fd < 3; ++fd) {
            taken += ::fcntl(fd, F_GETFD) != -1 ? 1 : 0;
            ::dup2(saved[fd], fd);
            ::close(saved[fd]);
        }
        EXPECT_EQ(read_file(m_file), helava_file({.nlines = 4, .nsamps = 50}, 200));
        EXPECT_EQ(taken, 0);
    }
}

TEST_F(Platform, AsksForTheHeadOfAFileOnce)
{
    const bytes content = numbered(bytes(600), 0, 600);
    write_file(m_file, content);
    std::int32_t fd = img_platform_open(m_file.c_str(), 2, 0);
    const auto expect = [&](std::int32_t position, std::uint32_t count, const bytes &expected) {
        bytes block(count);
        img_platform_seek(fd, position, 0);
        block.resize(static_cast<std::size_t>(img_platform_read(fd, &block[0], count)));
        EXPECT_EQ(block, expected);
        EXPECT_EQ(img_platform_seek(fd, 0, 1), position + std::ssize(block));
    };
    for (const auto &[at, count] : {std::pair{0, 4}, {112, 68}, {0, 600}, {510, 3}, {590, 20}})
        expect(at, static_cast<std::uint32_t>(count),
               bytes(content.begin() + at, content.begin() + std::min(at + count, 600)));
    expect(700, 1, {});
    EXPECT_EQ(img_platform_seek(fd, 0, 2), 600);  // and from now on it is asked for
    write_file(m_file, bytes(10));
    expect(4, 20, bytes(6));
    EXPECT_EQ(img_platform_seek(fd, 0, 2), 10);
    ::close(fd);
    EXPECT_EQ(img_platform_seek(fd, 0, 2), -1);
    EXPECT_EQ(img_platform_close(fd), -1);
    write_file(m_file, content);
    fd = img_platform_open(m_file.c_str(), 0, 0);
    std::filesystem::resize_file(m_file, 100);
    expect(0, 100, bytes(content.begin(), content.begin() + 100));
    img_platform_close(fd);
    std::vector<std::int32_t> all(IMG_MAX_PLATFORM_FILES + 1);
    for (std::int32_t &each : all) each = img_platform_open(m_file.c_str(), 0, 0);
    EXPECT_EQ(std::pair(all.back(), errno), (std::pair{-1, EMFILE}));
    for (const std::int32_t each : all) img_platform_close(each);
}

TEST_F(Platform, PositionsAndCountsFit31Bits)
{
    write_file(m_file, {});
    std::filesystem::resize_file(m_file, INT32_MAX);
    const std::int32_t fd = img_platform_open(m_file.c_str(), 2, 0600);
    EXPECT_EQ(img_platform_seek(fd, 0, 2), INT32_MAX);
    for (const auto &[offset, whence] :
         {std::array{8, 1}, {INT32_MAX, 1}, {1, 2}, {0, 3}, {0, -1}}) {
        EXPECT_EQ(img_platform_seek(fd, INT32_MAX - 7, 0), INT32_MAX - 7);
        EXPECT_EQ(img_platform_seek(fd, offset, whence), -1) << offset << " from " << whence;
    }
    std::uint8_t byte = 0;
    for (const std::int32_t each : {fd, -1, 0}) {
        EXPECT_EQ(img_platform_read(each, &byte, 0x80000000U), -1);
        EXPECT_EQ(img_platform_read_at(each, 7, &byte, INT32_MAX), -1);
        EXPECT_EQ(img_platform_write(each, &byte, 0x80000000U), -1);
        EXPECT_EQ(img_platform_close(each), each == fd ? 0 : -1);
    }
    EXPECT_EQ(img_platform_seek(fd, 0, 0), -1);
    EXPECT_EQ(img_lookup_io_method("")->unlink(m_file.c_str()), 0);
    EXPECT_FALSE(std::filesystem::exists(m_file));
}

}  // namespace
