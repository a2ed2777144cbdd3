// Bytes of an image's data. An access method is a host's code: each position that it returns is
// checked, and a count above the requested one is an error. Read std_bytes.h and
// io/io_method.h first.
#include "std/std_bytes.h"

#include "base/img_desc.h"
#include "std/std.h"

#include <algorithm>
#include <cerrno>

namespace {

std::int32_t seek(const img_desc *desc, std::int64_t offset, std::int32_t whence)
{
    if (img_std_fit31(offset) == -1) {
        errno = EOVERFLOW;
        return -1;
    }
    return desc->io_method->seek(desc->std_file->data_fd, static_cast<std::int32_t>(offset),
                                 whence);
}

}  // namespace

std::int32_t img_std_check_position(std::int32_t position, std::int64_t expected)
{
    if (position == expected) return 0;
    if (position != -1) errno = EIO;
    return -1;
}

std::int32_t img_std_seek_to(const img_desc *desc, std::int64_t offset)
{
    return img_std_check_position(seek(desc, offset, IMG_SEEK_START), offset);
}

std::int32_t img_std_seek_to_write(img_desc *desc, std::int64_t offset)
{
    if (offset <= desc->std_file->veof || img_std_fit31(offset) == -1)
        return img_std_seek_to(desc, offset);
    // The file may have grown since veof was set: the gap counts from its present end.
    const std::int32_t end = img_std_length(desc);
    if (end == -1) return -1;
    if (offset <= end) return img_std_seek_to(desc, offset);
    if (img_std_append_zeros(desc, end, offset - end) == -1) return -1;
    desc->std_file->veof = static_cast<std::int32_t>(offset);
    return 0;
}

std::int32_t img_std_length(const img_desc *desc)
{
    return seek(desc, 0, IMG_SEEK_END);
}

std::int32_t img_std_update_veof(img_desc *desc)
{
    const std::int32_t end = img_std_length(desc);
    if (end == -1) return -1;
    desc->std_file->veof = end;
    return 0;
}

std::int32_t img_std_append_zeros(const img_desc *desc, std::int32_t end, std::int64_t count)
{
    const std::int32_t position = seek(desc, count - 1, IMG_SEEK_CURRENT);
    if (img_std_check_position(position, end + count - 1) == -1) return -1;
    const std::int32_t written =
        desc->io_method->write(desc->std_file->data_fd, img_zero_sample.data(), 1);
    if (written == 0) errno = ENOSPC;
    return written == 1 ? 0 : -1;
}

std::int32_t img_std_extend(img_desc *desc, std::int32_t count)
{
    if (desc->mem_image) return 0;
    const std::int32_t end = img_std_length(desc);
    return end != -1 ? img_std_append_zeros(desc, end, count) : -1;
}

std::int32_t img_std_read_at(const img_desc *desc, std::int64_t offset, void *buffer,
                             std::int32_t count)
{
    const img_io_method *const method = desc->io_method;
    img_std_file *const file = desc->std_file;
    if (method->read_at != nullptr && img_std_fit31(offset) != -1)
        return method->read_at(file->data_fd, static_cast<std::int32_t>(offset), buffer,
                               static_cast<std::uint32_t>(count));
    const img_mutex_lock lock(file->position_mutex);
    if (img_std_seek_to(desc, offset) == -1) return -1;
    return method->read(file->data_fd, buffer, static_cast<std::uint32_t>(count));
}

std::int32_t img_std_write_at(img_desc *desc, std::int64_t offset, const void *buffer,
                              std::int32_t count)
{
    if (img_std_seek_to_write(desc, offset) == -1) return -1;
    const std::int32_t written =
        desc->io_method->write(desc->std_file->data_fd, buffer, static_cast<std::uint32_t>(count));
    const int error = errno;
    const std::int32_t updated = img_std_update_veof(desc);  // a write that stops may grow it, too
    if (written == count) return updated == 0 ? written : -1;
    errno = error;
    return written;
}

void img_std_note_missed(const img_desc *desc, std::int64_t offset, std::int32_t got,
                         std::int32_t count, int *missed)
{
    if (got == -1) {
        *missed = errno != 0 ? errno : EIO;
    } else if (const std::int32_t end = img_std_length(desc);
               got < 0 || got > count || end < 0 || end > offset + got) {
        *missed = EIO;
    }
}

std::uint8_t *img_std_memory_to_write(img_desc *desc, std::int64_t offset, std::int32_t count)
{
    img_std_file *const file = desc->std_file;
    const std::int64_t last = offset + count - 1;
    if (last > file->veof_max) return nullptr;
    file->veof = std::max(file->veof, static_cast<std::int32_t>(last));
    return desc->mem_image.get() + offset;
}

bool img_std_may_merge(const img_desc *desc)
{
    return desc->io_method->may_merge_transfers != 0;
}

img_scratch img_std_between(const img_desc *desc, std::size_t size)
{
    constexpr std::size_t small_region = 16384;
    const bool is_in_a_lent_file = !desc->mem_image && desc->io_method->lend != nullptr;
    if (!is_in_a_lent_file || size > small_region) return nullptr;
    const int error = errno;
    img_scratch between = img_take_scratch(size);
    if (!between) errno = error;  // it can be done without
    return between;
}

bool img_std_lend(const img_desc *desc, std::int64_t offset, std::int64_t count, bool discards,
                  img_io_use_fn use, void *arg)
{
    const img_std_file *const file = desc->std_file;
    if (desc->mem_image) {
        if (offset + count - 1 > file->veof) return false;
        use(arg, desc->mem_image.get() + offset);
        return true;
    }
    return desc->io_method->lend != nullptr &&
           desc->io_method->lend(file->data_fd, static_cast<std::int32_t>(offset),
                                 static_cast<std::int32_t>(count), discards ? 1 : 0, use, arg) == 0;
}
