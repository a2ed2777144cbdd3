#include "memory_disk.h"

#include "imgfile/img.h"
#include "io/io_method.h"
#include "std/std_bytes.h"

#include <algorithm>
#include <cerrno>

namespace {

struct descriptor {
    bytes *file;  // null: not open
    std::int64_t position;
    bool writable;
};
std::array<descriptor, 64> descriptors{};

std::int32_t next_fault()
{
    if (disk.faults.empty() || disk.faults.front().first-- > 0) return DISK_IS_FINE;
    const std::int32_t fault = disk.faults.front().second;
    disk.faults.pop_front();
    errno = EIO;
    return fault;
}

// Returns how many of `count` bytes a call moves; -1: it fails.
std::int64_t share_of(std::int64_t count)
{
    const std::array<std::int64_t, 7> shares{-1, -1, 0, count > 1 ? 1 : 0, count / 2, -1, count};
    return shares.at(static_cast<std::size_t>(next_fault()));
}

std::int32_t memory_open(const char *filename, std::int32_t oflags, std::int32_t /*mode*/)
{
    const std::int32_t mode = oflags & 3;  // write-only images are of no use to anybody
    if (mode == IMG_OPEN_WRITE_ONLY || mode == 3 || next_fault() != DISK_IS_FINE ||
        (!disk.files.contains(filename) && (oflags & IMG_OPEN_CREATE) == 0))
        return -1;
    bytes &file = disk.files[filename];
    if ((oflags & IMG_OPEN_TRUNCATE) != 0) file.clear();
    auto *const unused = std::ranges::find(descriptors, nullptr, &descriptor::file);
    *unused = {&file, 0, mode == IMG_OPEN_READ_WRITE};
    ++disk.open_descriptors;
    return static_cast<std::int32_t>(unused - descriptors.begin());
}

std::int32_t memory_close(std::int32_t fd)
{
    descriptors.at(static_cast<std::size_t>(fd)).file = nullptr;  // closed, whatever the answer is
    --disk.open_descriptors;
    return next_fault() == DISK_IS_FINE ? 0 : -1;
}

std::int32_t memory_read(std::int32_t fd, void *buffer, std::uint32_t count)
{
    auto &[file, position, writable] = descriptors.at(static_cast<std::size_t>(fd));
    const auto moved = share_of(std::clamp<std::int64_t>(std::ssize(*file) - position, 0, count));
    if (moved <= 0) return static_cast<std::int32_t>(moved);
    std::copy_n(file->begin() + position, moved, static_cast<std::uint8_t *>(buffer));
    position += moved;
    return static_cast<std::int32_t>(moved);
}

std::int32_t memory_write(std::int32_t fd, const void *buffer, std::uint32_t count)
{
    auto &[file, position, writable] = descriptors.at(static_cast<std::size_t>(fd));
    const auto moved = writable ? share_of(count) : -1;
    if (moved <= 0) return static_cast<std::int32_t>(moved);
    const auto end = static_cast<std::size_t>(position + moved);
    if (end > DISK_FILE_SIZE) return -1;
    file->resize(std::max(file->size(), end));
    std::copy_n(static_cast<const std::uint8_t *>(buffer), moved, file->begin() + position);
    position += moved;
    return static_cast<std::int32_t>(moved);
}

std::int32_t memory_seek(std::int32_t fd, std::int32_t offset, std::int32_t whence)
{
    auto &[file, position, writable] = descriptors.at(static_cast<std::size_t>(fd));
    const std::int32_t fault = next_fault();
    const std::array<std::int64_t, 3> starts{0, position, std::ssize(*file)};
    const std::int64_t wanted =
        starts.at(static_cast<std::size_t>(whence)) + offset + (fault == DISK_STANDS_OFF ? 1 : 0);
    if ((fault != DISK_IS_FINE && fault != DISK_STANDS_OFF) || wanted < 0 || wanted > INT32_MAX)
        return -1;
    position = wanted;
    return static_cast<std::int32_t>(wanted);
}

std::int32_t memory_lend(std::int32_t fd, std::int32_t offset, std::int32_t count,
                         std::int32_t /*discards*/, img_io_use_fn use, void *arg)
{
    const bytes &file = *descriptors.at(static_cast<std::size_t>(fd)).file;
    if (offset < 0 || count < 1 || std::int64_t{offset} + count > std::ssize(file)) return -1;
    const bytes lent(file.begin() + offset, file.begin() + offset + count);  // and not a byte more
    use(arg, lent.data());
    return 0;
}

}  // namespace

void memory_disk_register()
{
    for (const char *const name : {"memory", "lending"})
        img_register_io_method(name, nullptr, memory_open, memory_close, memory_read, memory_write,
                               memory_seek, nullptr, nullptr);
    img_offer_lending("lending", memory_lend);
    img_allow_merging("lending");
}
