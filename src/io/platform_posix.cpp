#include "io/platform.h"

#include "imgfile/img.h"
#include "io/lend_posix.h"

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <ctime>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

static_assert(sizeof(off_t) >= 8, "lengths beyond 31 bits must be seen to be refused");

namespace {

// What a file held when it was opened: enough to tell its type and geometry without asking the
// system for each word.
struct first_look {
    std::int64_t length;       // -1: no longer known
    std::int32_t head_length;  // bytes in `head`; -1: not read yet
    std::array<std::byte, 512> head;
};

// A file that is open. Its position is kept here, and seeks need no call of the system.
struct open_file {
    std::int32_t fd;
    std::int32_t position;
    img_file_mapping mapping;
    first_look look;  // until the length is asked for, or something is written
};

constexpr std::int32_t FREE_PLACE = 0;  // a standard stream's, and never that of a file here
std::array<std::int32_t, 64> descriptors{};
std::array<open_file, descriptors.size()> open_files{};  // place by place

// Returns the place of a descriptor; the number of places: it has none.
std::size_t find_place(std::int32_t fd)
{
    return static_cast<std::size_t>(std::ranges::find(descriptors, fd) - descriptors.begin());
}

// Returns the open file of a descriptor, or null with errno set.
open_file *find_file(std::int32_t fd)
{
    const std::size_t place = find_place(fd);
    if (fd != FREE_PLACE && place < open_files.size()) return &open_files[place];
    errno = EBADF;
    return nullptr;
}

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

// Reads from the head of a file that was just opened. Returns the bytes read, or -1 when they are
// not to be had there.
std::int32_t read_head(open_file *file, void *buffer, std::uint32_t count)
{
    first_look &look = file->look;
    const auto size = static_cast<std::int32_t>(look.head.size());
    if (look.length == -1 || file->position > size ||
        count > static_cast<std::uint32_t>(size - file->position))
        return -1;
    if (look.head_length == -1)
        look.head_length =
            static_cast<std::int32_t>(::pread(file->fd, look.head.data(), look.head.size(), 0));
    if (look.head_length < std::min<std::int64_t>(look.length, size)) {
        look.length = -1;  // what came is not what there is
        return -1;
    }
    const auto got =
        std::clamp(look.head_length - file->position, 0, static_cast<std::int32_t>(count));
    std::copy_n(look.head.data() + file->position, got, static_cast<std::byte *>(buffer));
    file->position += got;
    return got;
}

std::int32_t close_and_fail(int fd, int error)
{
    ::close(fd);
    errno = error;
    return -1;
}

// Calls `transfer(done, position)` at the file's position until `count` bytes are moved, nothing
// more comes, or an error occurs.
template <typename Transfer>
std::int32_t transfer_whole(open_file *file, std::uint32_t count, Transfer transfer)
{
    if (count > static_cast<std::uint32_t>(INT32_MAX - file->position)) {
        errno = EINVAL;
        return -1;
    }
    std::uint32_t done = 0;
    while (done < count) {
        const ssize_t moved = transfer(done, off_t{file->position});
        if (moved == -1 && errno == EINTR) continue;
        if (moved == -1 && done == 0) return -1;
        if (moved <= 0) break;
        done += static_cast<std::uint32_t>(moved);
        file->position += static_cast<std::int32_t>(moved);
    }
    return static_cast<std::int32_t>(done);
}

}  // namespace

std::int32_t img_platform_open(const char *filename, std::int32_t oflags, std::int32_t mode)
{
    int flags = system_flags(oflags);
    if (flags == -1) {
        errno = EINVAL;
        return -1;
    }
    int fd;
    for (;;) {
        fd = ::open(filename, flags, static_cast<mode_t>(mode));
        if (fd == -1 && errno == EWOULDBLOCK && (flags & O_NONBLOCK) != 0)
            flags &= ~O_NONBLOCK;  // another program has leased the file: the system asks for it
        else if (fd != -1 || errno != EINTR)
            break;
    }
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
    const std::size_t place = find_place(FREE_PLACE);
    if (place == open_files.size()) return close_and_fail(fd, EMFILE);
    descriptors[place] = fd;
    open_file &file = open_files[place];  // whose head need not be cleared
    file.fd = fd;
    file.position = 0;
    file.mapping = {};
    file.look.length = S_ISREG(status.st_mode) ? status.st_size : -1;
    file.look.head_length = -1;
    return fd;
}

std::int32_t img_platform_close(std::int32_t fd)
{
    open_file *const file = find_file(fd);
    if (file == nullptr) return -1;
    file->mapping.drop();
    descriptors[find_place(fd)] = FREE_PLACE;
    // An interrupted close is not repeated: the descriptor may be in use again by then.
    return ::close(fd);
}

std::int32_t img_platform_read(std::int32_t fd, void *buffer, std::uint32_t count)
{
    open_file *const file = find_file(fd);
    if (file == nullptr) return -1;
    if (const std::int32_t got = read_head(file, buffer, count); got != -1) return got;
    return transfer_whole(file, count, [=](std::uint32_t done, off_t position) {
        return ::pread(fd, static_cast<std::byte *>(buffer) + done, count - done, position);
    });
}

std::int32_t img_platform_write(std::int32_t fd, const void *buffer, std::uint32_t count)
{
    open_file *const file = find_file(fd);
    if (file == nullptr) return -1;
    file->look.length = -1;
    return transfer_whole(file, count, [=](std::uint32_t done, off_t position) {
        return ::pwrite(fd, static_cast<const std::byte *>(buffer) + done, count - done, position);
    });
}

std::int32_t img_platform_seek(std::int32_t fd, std::int32_t offset, std::int32_t whence)
{
    open_file *const file = find_file(fd);
    if (file == nullptr) return -1;
    std::int64_t base = 0;
    if (whence == IMG_SEEK_CURRENT) base = file->position;
    if (whence == IMG_SEEK_END) {
        base = std::exchange(file->look.length, -1);
        if (base == -1) base = ::lseek(fd, 0, SEEK_END);
        if (base == -1) return -1;
    }
    const std::int64_t at = base + offset;
    if (whence < IMG_SEEK_START || whence > IMG_SEEK_END || at < 0 || at > INT32_MAX) {
        errno = at > INT32_MAX ? EOVERFLOW : EINVAL;
        return -1;
    }
    file->position = static_cast<std::int32_t>(at);
    return file->position;
}

std::int32_t img_platform_lend(std::int32_t fd, std::int32_t offset, std::int32_t count,
                               img_io_use_fn use, void *arg)
{
    open_file *const file = find_file(fd);
    return file != nullptr ? file->mapping.lend(fd, offset, count, use, arg) : -1;
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
