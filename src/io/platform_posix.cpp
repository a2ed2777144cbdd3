#include "io/platform.h"

#include "api/img.h"

#include <cerrno>
#include <cstddef>
#include <ctime>
#include <limits>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

static_assert(sizeof(off_t) >= 8, "lengths beyond 31 bits must be seen to be refused");

namespace {

constexpr std::int32_t ACCESS_MODE = 3;  // the bits of the open flags that hold the access mode

// Returns the system's flags for `oflags`, or -1 for flags that have no meaning here.
int system_flags(std::int32_t oflags)
{
    constexpr std::int32_t known =
        ACCESS_MODE | IMG_OPEN_CREATE | IMG_OPEN_TRUNCATE | IMG_OPEN_BINARY;
    if ((oflags & ~known) != 0) return -1;
    int flags = O_CLOEXEC | O_NOCTTY | O_NONBLOCK;  // opening a pipe without a peer must not wait
    switch (oflags & ACCESS_MODE) {
    case IMG_OPEN_READ_ONLY:
        flags |= O_RDONLY;
        break;
    case IMG_OPEN_WRITE_ONLY:
        flags |= O_WRONLY;
        break;
    case IMG_OPEN_READ_WRITE:
        flags |= O_RDWR;
        break;
    default:
        return -1;
    }
    if ((oflags & IMG_OPEN_CREATE) != 0) flags |= O_CREAT;
    if ((oflags & IMG_OPEN_TRUNCATE) != 0) flags |= O_TRUNC;
    return flags;
}

std::int32_t close_and_fail(int fd, int error)
{
    ::close(fd);
    errno = error;
    return -1;
}

// Calls `transfer(done)` until `count` bytes are moved, nothing more comes, or an error occurs.
template <typename Transfer>
std::int32_t transfer_whole(std::uint32_t count, Transfer transfer)
{
    if (count > std::numeric_limits<std::int32_t>::max()) {
        errno = EINVAL;
        return -1;
    }
    std::size_t done = 0;
    while (done < count) {
        const ssize_t moved = transfer(done);
        if (moved == -1 && errno == EINTR) continue;
        if (moved == -1 && done == 0) return -1;
        if (moved <= 0) break;
        done += static_cast<std::size_t>(moved);
    }
    return static_cast<std::int32_t>(done);
}

}  // namespace

std::int32_t img_platform_open(const char *filename, std::int32_t oflags, std::int32_t mode)
{
    const int flags = system_flags(oflags);
    if (flags == -1) {
        errno = EINVAL;
        return -1;
    }
    int fd;
    do {
        fd = ::open(filename, flags, static_cast<mode_t>(mode));
    } while (fd == -1 && errno == EINTR);
    if (fd == -1) return -1;

    // With a standard stream closed, what the host prints to it would land in the image.
    if (fd <= STDERR_FILENO) {
        const int high = ::fcntl(fd, F_DUPFD_CLOEXEC, STDERR_FILENO + 1);
        if (high == -1) return close_and_fail(fd, errno);
        ::close(fd);
        fd = high;
    }
    struct stat status;
    if (::fstat(fd, &status) == -1) return close_and_fail(fd, errno);
    if (!S_ISREG(status.st_mode) && !S_ISBLK(status.st_mode)) return close_and_fail(fd, EINVAL);
    return fd;
}

std::int32_t img_platform_close(std::int32_t fd)
{
    // An interrupted close is not repeated: the descriptor may be in use again by then.
    return ::close(fd);
}

std::int32_t img_platform_read(std::int32_t fd, void *buffer, std::uint32_t count)
{
    return transfer_whole(count, [=](std::size_t done) {
        return ::read(fd, static_cast<std::byte *>(buffer) + done, count - done);
    });
}

std::int32_t img_platform_write(std::int32_t fd, const void *buffer, std::uint32_t count)
{
    return transfer_whole(count, [=](std::size_t done) {
        return ::write(fd, static_cast<const std::byte *>(buffer) + done, count - done);
    });
}

std::int32_t img_platform_seek(std::int32_t fd, std::int32_t offset, std::int32_t whence)
{
    constexpr std::array<int, 3> system_whence{SEEK_SET, SEEK_CUR, SEEK_END};
    if (whence < 0 || whence > 2) {
        errno = EINVAL;
        return -1;
    }
    const off_t at = ::lseek(fd, offset, system_whence[static_cast<std::size_t>(whence)]);
    if (at > std::numeric_limits<std::int32_t>::max()) {
        errno = EOVERFLOW;
        return -1;
    }
    return static_cast<std::int32_t>(at);
}

std::int32_t img_platform_unlink(const char *filename)
{
    return ::unlink(filename);
}

std::array<std::uint8_t, 6> img_platform_local_time()
{
    const std::time_t now = std::time(nullptr);
    std::tm local;
    ::tzset();  // localtime_r need not notice that the host has changed its time zone
    if (now == -1 || ::localtime_r(&now, &local) == nullptr) return {};
    return {static_cast<std::uint8_t>(local.tm_year), static_cast<std::uint8_t>(local.tm_mon),
            static_cast<std::uint8_t>(local.tm_mday), static_cast<std::uint8_t>(local.tm_hour),
            static_cast<std::uint8_t>(local.tm_min),  static_cast<std::uint8_t>(local.tm_sec)};
}
