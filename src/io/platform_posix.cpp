// Ordinary files of a POSIX system. Positions are kept here, so that a seek makes no system call:
// reads and writes are pread and pwrite at the recorded position. Threads open and close files at
// the same time; an entry of the table belongs to its file from the open to the close. Read
// platform.h first.
#include "io/platform.h"

#include "base/img_desc.h"
#include "io/bus_error_guard_posix.h"
#include "io/file_mapping_posix.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <cstddef>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

static_assert(sizeof(off_t) >= 8, "lengths beyond 31 bits must be seen to be refused");

namespace {

// The length and the first bytes of a file that was just opened. Each type that probes the file
// reads its header in several small pieces: they come from here, with one system call.
struct file_head {
    std::int64_t length;       // of the file; -1: this record is out of date
    std::int32_t head_length;  // bytes in `bytes`; -1: not read yet
    std::array<std::byte, 512> bytes;
};

struct open_file {
    std::int32_t fd;
    std::int32_t position;  // where the next read or write starts
    img_file_mapping mapping;
    file_head head;  // until the length is asked for or a byte is written
};

constexpr std::int32_t NO_DESCRIPTOR = 0;  // a standard stream's: never that of a file here
constexpr std::int32_t RESERVED = -1;      // an entry that an open fills in
std::array<std::atomic<std::int32_t>, IMG_MAX_PLATFORM_FILES> descriptors{};
std::array<open_file, IMG_MAX_PLATFORM_FILES> open_files;  // entry i belongs to descriptors[i]

// The entry of a descriptor is the first free one from this index on.
std::size_t first_index(std::int32_t fd)
{
    return static_cast<std::size_t>(fd) % descriptors.size();
}

// Returns the index of a descriptor of an open file; the number of entries if it has none.
std::size_t find_index(std::int32_t fd)
{
    std::size_t index = first_index(fd);
    for (std::size_t i = 0; i < descriptors.size(); ++i) {
        if (descriptors[index].load(std::memory_order_acquire) == fd) return index;
        index = (index + 1) % descriptors.size();
    }
    return descriptors.size();
}

// Returns the open file of a descriptor, or null with errno set.
open_file *find_file(std::int32_t fd)
{
    const std::size_t index = fd > STDERR_FILENO ? find_index(fd) : open_files.size();
    if (index < open_files.size()) return &open_files[index];
    errno = EBADF;
    return nullptr;
}

// Returns the index of the entry for a descriptor, which is reserved; the number of entries if none
// is free.
std::size_t reserve_entry(std::int32_t fd)
{
    std::size_t index = first_index(fd);
    for (std::size_t i = 0; i < descriptors.size(); ++i) {
        std::int32_t free = NO_DESCRIPTOR;
        if (descriptors[index].compare_exchange_strong(free, RESERVED)) return index;
        index = (index + 1) % descriptors.size();
    }
    return descriptors.size();
}

// Returns the system's flags for `oflags`, or -1 for flags that have no meaning here.
int system_flags(std::int32_t oflags)
{
    constexpr std::int32_t known =
        IMG_ACCESS_MODE | IMG_OPEN_CREATE | IMG_OPEN_TRUNCATE | IMG_OPEN_BINARY;
    if ((oflags & ~known) != 0) return -1;
    int flags = O_CLOEXEC | O_NOCTTY | O_NONBLOCK;  // opening a FIFO without a peer must not block
    switch (oflags & IMG_ACCESS_MODE) {
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

// Reads from the head of a file that was just opened. Returns the bytes read, or -1 when the head
// does not hold them all.
std::int32_t read_head(open_file *file, void *buffer, std::uint32_t count)
{
    file_head &head = file->head;
    const auto size = static_cast<std::int32_t>(head.bytes.size());
    if (head.length == -1 || file->position > size ||
        count > static_cast<std::uint32_t>(size - file->position))
        return -1;
    if (head.head_length == -1)
        head.head_length =
            static_cast<std::int32_t>(::pread(file->fd, head.bytes.data(), head.bytes.size(), 0));
    if (head.head_length < std::min<std::int64_t>(head.length, size)) {
        head.length = -1;  // the file has changed since
        return -1;
    }
    const auto got =
        std::clamp(head.head_length - file->position, 0, static_cast<std::int32_t>(count));
    std::copy_n(head.bytes.data() + file->position, got, static_cast<std::byte *>(buffer));
    file->position += got;
    return got;
}

std::int32_t close_and_fail(int fd, int error)
{
    ::close(fd);
    errno = error;
    return -1;
}

// Writes from `source`, or where that is null reads into `target`, at `*position`, which moves on:
// until `count` bytes are moved, a call moves none, or an error occurs.
std::int32_t transfer_whole(int fd, std::int32_t *position, std::byte *target,
                            const std::byte *source, std::uint32_t count)
{
    if (count > static_cast<std::uint32_t>(INT32_MAX - *position)) {
        errno = EINVAL;
        return -1;
    }
    std::uint32_t done = 0;
    while (done < count) {
        const ssize_t moved = source != nullptr
                                  ? ::pwrite(fd, source + done, count - done, *position)
                                  : ::pread(fd, target + done, count - done, *position);
        if (moved == -1 && errno == EINTR) continue;
        if (moved == -1 && done == 0) return -1;
        if (moved <= 0) break;
        done += static_cast<std::uint32_t>(moved);
        *position += static_cast<std::int32_t>(moved);
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
            flags &=
                ~O_NONBLOCK;  // another program holds a lease: wait until the system revokes it
        else if (fd != -1 || errno != EINTR)
            break;
    }
    if (fd == -1) return -1;

    // A host that has closed a standard stream would print into the image.
    if (fd <= STDERR_FILENO) {
        const int high = ::fcntl(fd, F_DUPFD_CLOEXEC, STDERR_FILENO + 1);
        if (high == -1) return close_and_fail(fd, errno);
        ::close(fd);
        fd = high;
    }
    struct stat status;
    if (::fstat(fd, &status) == -1) return close_and_fail(fd, errno);
    if (!S_ISREG(status.st_mode) && !S_ISBLK(status.st_mode)) return close_and_fail(fd, EINVAL);
    const std::size_t index = reserve_entry(fd);
    if (index == open_files.size()) return close_and_fail(fd, EMFILE);
    open_file &file = open_files[index];  // field by field: its head need not be cleared
    file.fd = fd;
    file.position = 0;
    file.head.length = S_ISREG(status.st_mode) ? status.st_size : -1;
    file.head.head_length = -1;
    descriptors[index].store(fd, std::memory_order_release);
    return fd;
}

std::int32_t img_platform_close(std::int32_t fd)
{
    open_file *const file = find_file(fd);
    if (file == nullptr) return -1;
    file->mapping.drop();
    descriptors[find_index(fd)].store(NO_DESCRIPTOR, std::memory_order_release);
    // An interrupted close is not repeated: the descriptor may be in use again by then.
    return ::close(fd);
}

std::int32_t img_platform_read(std::int32_t fd, void *buffer, std::uint32_t count)
{
    open_file *const file = find_file(fd);
    if (file == nullptr) return -1;
    if (const std::int32_t got = read_head(file, buffer, count); got != -1) return got;
    return transfer_whole(fd, &file->position, static_cast<std::byte *>(buffer), nullptr, count);
}

std::int32_t img_platform_read_at(std::int32_t fd, std::int32_t offset, void *buffer,
                                  std::uint32_t count)
{
    if (find_file(fd) == nullptr) return -1;
    return transfer_whole(fd, &offset, static_cast<std::byte *>(buffer), nullptr, count);
}

std::int32_t img_platform_write(std::int32_t fd, const void *buffer, std::uint32_t count)
{
    open_file *const file = find_file(fd);
    if (file == nullptr) return -1;
    file->head.length = -1;
    file->mapping.forget_status();
    return transfer_whole(fd, &file->position, nullptr, static_cast<const std::byte *>(buffer),
                          count);
}

std::int32_t img_platform_seek(std::int32_t fd, std::int32_t offset, std::int32_t whence)
{
    open_file *const file = find_file(fd);
    if (file == nullptr) return -1;
    std::int64_t base = 0;
    if (whence == IMG_SEEK_CURRENT) base = file->position;
    if (whence == IMG_SEEK_END) {
        base = std::exchange(file->head.length, -1);
        if (base == -1) base = ::lseek(fd, 0, SEEK_END);
        if (base == -1) return -1;
    }
    const std::int64_t position = base + offset;
    if (whence < IMG_SEEK_START || whence > IMG_SEEK_END || position < 0 || position > INT32_MAX) {
        errno = position > INT32_MAX ? EOVERFLOW : EINVAL;
        return -1;
    }
    file->position = static_cast<std::int32_t>(position);
    return file->position;
}

std::int32_t img_platform_lend(std::int32_t fd, std::int32_t offset, std::int32_t count,
                               std::int32_t discards, img_io_use_fn use, void *arg)
{
    open_file *const file = find_file(fd);
    if (file == nullptr) return -1;
    return file->mapping.lend(fd, offset, count, discards != 0, use, arg) ? 0 : -1;
}

std::int32_t img_platform_unlink(const char *filename)
{
    return ::unlink(filename);
}

void img_platform_after_fork()
{
    img_bus_errors_after_fork();
}

void img_platform_unload()
{
    img_leave_bus_errors();
}
