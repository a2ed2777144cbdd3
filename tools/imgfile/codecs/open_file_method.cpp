// Operations of the two access methods. Positions are those that the system keeps for a descriptor,
// so a file must not be open in the library twice. Read open_file_method.h and io/io_method.h
// first.
#include "codecs/open_file_method.h"

#include "io/file_mapping_posix.h"

#include <cerrno>
#include <map>
#include <memory>

#include <unistd.h>

namespace {

int offered = -1;
std::map<std::int32_t, img_file_mapping> mappings;  // by descriptor; made when bytes are lent

std::int32_t open_offered(const char * /*filename*/, std::int32_t /*oflags*/, std::int32_t /*mode*/)
{
    return ::lseek(offered, 0, SEEK_SET) == 0 ? offered : -1;
}

std::int32_t leave_open(std::int32_t fd)
{
    if (const auto found = mappings.find(fd); found != mappings.end()) {
        found->second.drop();
        mappings.erase(found);
    }
    return 0;
}

// Calls `transfer(done)` until `count` bytes are moved, nothing more comes, or an error occurs.
template <typename Transfer>
std::int32_t transfer_whole(std::uint32_t count, Transfer transfer)
{
    std::uint32_t done = 0;
    while (done < count) {
        const ssize_t moved = transfer(done);
        if (moved == -1 && errno == EINTR) continue;
        if (moved == -1 && done == 0) return -1;
        if (moved <= 0) break;
        done += static_cast<std::uint32_t>(moved);
    }
    return static_cast<std::int32_t>(done);
}

std::int32_t read_file(std::int32_t fd, void *buffer, std::uint32_t count)
{
    return transfer_whole(count, [=](std::uint32_t done) {
        return ::read(fd, static_cast<char *>(buffer) + done, count - done);
    });
}

std::int32_t write_file(std::int32_t fd, const void *buffer, std::uint32_t count)
{
    return transfer_whole(count, [=](std::uint32_t done) {
        return ::write(fd, static_cast<const char *>(buffer) + done, count - done);
    });
}

std::int32_t seek_file(std::int32_t fd, std::int32_t offset, std::int32_t whence)
{
    const off_t position = ::lseek(fd, offset, whence);
    if (position <= INT32_MAX) return static_cast<std::int32_t>(position);
    errno = EOVERFLOW;
    return -1;
}

std::int32_t keep_file(const char * /*filename*/)
{
    errno = ENOSYS;
    return -1;
}

double no_value()
{
    return 0;
}

// More than a piece of a walk takes.
constexpr std::int32_t LARGEST_LOAN = 9 << 20;

// Reads the bytes into a buffer by one call and lends that: the ordinary calls would read line by
// line.
std::int32_t lend_buffer(std::int32_t fd, std::int32_t offset, std::int32_t count,
                         std::int32_t /*discards*/, img_io_use_fn use, void *arg)
{
    static const auto buffer = std::make_unique_for_overwrite<std::uint8_t[]>(LARGEST_LOAN);
    if (count < 1 || count > LARGEST_LOAN ||
        ::pread(fd, buffer.get(), static_cast<std::size_t>(count), offset) != count)
        return -1;
    use(arg, buffer.get());
    return 0;
}

std::int32_t lend_mapped(std::int32_t fd, std::int32_t offset, std::int32_t count,
                         std::int32_t discards, img_io_use_fn use, void *arg)
{
    return mappings[fd].lend(fd, offset, count, discards != 0, use, arg) ? 0 : -1;
}

static_assert(SEEK_SET == IMG_SEEK_START && SEEK_CUR == IMG_SEEK_CURRENT &&
              SEEK_END == IMG_SEEK_END);

constexpr img_io_method method_that_lends(const char *name, img_io_lend_fn lend)
{
    return {
        .name = name,
        .enabled = 1,
        .open = open_offered,
        .close = leave_open,
        .read = read_file,
        .write = write_file,
        .seek = seek_file,
        .unlink = keep_file,
        .get_value = no_value,
        .read_at = nullptr,  // the tool has one thread
        .lend = lend,
        .may_merge_transfers = 1,
    };
}

}  // namespace

const img_io_method &plain_method()
{
    static constexpr img_io_method method = method_that_lends("plain", lend_buffer);
    return method;
}

const img_io_method &mapped_method()
{
    static constexpr img_io_method method = method_that_lends("mapped", lend_mapped);
    return method;
}

offered_descriptor::offered_descriptor(int fd)
{
    offered = fd;
}

offered_descriptor::~offered_descriptor()
{
    offered = -1;
}
