// The driver's state of one image: making it, the file organisation, and the bytes of the file.
#include "base/img_desc.h"
#include "base/settings.h"
#include "base/type_hooks.h"
#include "io/io_method.h"
#include "std/std.h"

#include <algorithm>
#include <cerrno>
#include <new>

namespace {

constexpr std::int32_t FILE_MODE = 0666;

// Every size below fits 31 bits or is -1, which means that it does not.

std::int64_t product(std::int64_t a, std::int64_t b)
{
    return a < 0 || b < 0 ? -1 : img_std_fitting(a * b);
}

template <typename... More>
std::int64_t product(std::int64_t a, std::int64_t b, More... more)
{
    return product(product(a, b), more...);
}

std::int64_t sum(std::int64_t known, std::int64_t size)  // `known` is no -1
{
    return size < 0 ? -1 : img_std_fitting(known + size);
}

bool within_the_drivers_limits(const img_desc *desc)
{
    const bool one_byte = desc->nbytes == 1 && desc->nbits >= 1 && desc->nbits <= 8;
    const bool two_bytes = desc->nbytes == 2 && desc->nbits >= 9 && desc->nbits <= 16;
    return desc->nlines >= 0 && desc->nsamps >= 0 && desc->tile_nlines >= 0 &&
           desc->tile_nsamps >= 0 && desc->nbands >= 0 && (one_byte || two_bytes);
}

bool gets_virtual_tiles(const img_desc *desc)
{
    return img_cache_mb != 0 && img_default_tile_nsamps > 0 && img_default_tile_nlines > 0 &&
           desc->layout == IMG_LAYOUT_BSQ && img_type_of(desc).read_tiles == img_std_read_tiles;
}

// Fills in the tile counts, which are not above the proven numbers of lines and samples of a plane,
// and the tile size. Returns false when it does not fit.
bool set_up_tiles(const img_desc *desc, img_std_file *file)
{
    const std::int64_t planes = desc->layout == IMG_LAYOUT_TILED_BIP ? desc->nbands : 1;
    const std::int64_t tile_size =
        product(desc->tile_nlines, desc->tile_nsamps, desc->nbytes, planes);
    file->tiles_across = img_whole_tiles(desc->nsamps, desc->tile_nsamps);
    file->tiles_down = img_whole_tiles(desc->nlines, desc->tile_nlines);
    if (tile_size == -1) return false;
    file->tile_size = static_cast<std::int32_t>(tile_size);
    return true;
}

// Returns the end of the bytes that whole-tile transfers of stored tiles may touch.
std::int64_t tiles_end(const img_desc *desc, const img_std_file *file)
{
    if (desc->nbands == 0 || desc->virtual_tiled != 0) return file->data_offset;
    const std::int64_t tiles = product(file->tiles_across, file->tiles_down, file->tile_size);
    std::int64_t data;
    switch (desc->layout) {
    case IMG_LAYOUT_TILED:
        data = product(tiles, desc->nbands);
        break;
    case IMG_LAYOUT_TILED_BIP:
        data = tiles;
        break;
    default:
        data = sum(product(desc->nbands - 1, file->band_size), tiles);
        break;
    }
    return sum(file->data_offset, data);
}

// Fills in the stored size of a line and of a band plane. Returns false when they do not fit.
bool set_up_planes(img_desc *desc, img_std_file *file)
{
    const img_type_hooks &hooks = img_hooks_of(desc);
    file->padded_nsamps =
        hooks.padded_nsamps_fn != nullptr ? hooks.padded_nsamps_fn(desc) : desc->nsamps;
    file->padded_nlines =
        hooks.padded_nlines_fn != nullptr ? hooks.padded_nlines_fn(desc) : desc->nlines;
    const std::int64_t band_size = product(file->padded_nlines, file->padded_nsamps, desc->nbytes);
    if (band_size == -1) return false;
    file->band_size = static_cast<std::int32_t>(band_size);
    return sum(file->data_offset, product(desc->nbands, band_size)) != -1;
}

// Chooses the layout, where that is left to the type, and sets up stored or virtual tiles.
bool set_up_layout(img_desc *desc, img_std_file *file)
{
    const bool tiled = img_is_tiled(desc);
    if (desc->layout == IMG_LAYOUT_DEFAULT)
        desc->layout = tiled ? img_hooks_of(desc).tiled_layout : img_hooks_of(desc).untiled_layout;
    desc->virtual_tiled = !tiled && gets_virtual_tiles(desc) ? 1 : 0;
    if (desc->virtual_tiled != 0) {
        desc->tile_nsamps = img_default_tile_nsamps;
        desc->tile_nlines = img_default_tile_nlines;
        desc->layout = IMG_LAYOUT_BAND_TILED;
    }
    const bool interleaved = desc->layout == IMG_LAYOUT_TILED_BIP;
    const bool in_tiles =
        interleaved || desc->layout == IMG_LAYOUT_TILED || desc->layout == IMG_LAYOUT_BAND_TILED;
    if (in_tiles && !img_is_tiled(desc)) return false;
    if (interleaved && desc->nbands > static_cast<std::int32_t>(desc->band_map.size()))
        return false;
    return !img_is_tiled(desc) || set_up_tiles(desc, file);
}

std::int32_t seek(const img_desc *desc, std::int64_t offset, std::int32_t whence)
{
    if (img_std_fitting(offset) == -1) {
        errno = EOVERFLOW;
        return -1;
    }
    return desc->io_method->seek(desc->std_file->data_fd, static_cast<std::int32_t>(offset),
                                 whence);
}

std::int32_t seek_to(const img_desc *desc, std::int64_t offset)
{
    return img_std_check_position(seek(desc, offset, IMG_SEEK_START), offset);
}

// Appends zero bytes to a file whose descriptor stands at its end, by writing the last of them.
std::int32_t append_zeros(const img_desc *desc, std::int32_t end, std::int64_t count)
{
    const std::int32_t at = seek(desc, count - 1, IMG_SEEK_CURRENT);
    if (img_std_check_position(at, end + count - 1) == -1) return -1;
    const std::int32_t written =
        desc->io_method->write(desc->std_file->data_fd, img_zero_sample.data(), 1);
    if (written == 0) errno = ENOSPC;
    return written == 1 ? 0 : -1;
}

// Makes the state of an image whose files are open on `fd`, or in memory for -1.
std::int32_t make_state(img_desc *desc, std::int32_t fd)
{
    desc->std_file = new (std::nothrow) img_std_file{
        .hdr_fd = fd,
        .data_fd = fd,
        .veof = 0,
        .veof_max = 0,
        .data_offset = 0,
        .band_size = 0,
        .tiles_across = 0,
        .tiles_down = 0,
        .tile_size = 0,
        .padded_nsamps = 0,
        .padded_nlines = 0,
        .pre_reads = 0,
        .read_error = 0,
        .companion_name = nullptr,
    };
    return desc->std_file != nullptr ? 0 : -1;
}

void free_state(img_desc *desc)
{
    delete[] desc->std_file->companion_name;
    delete desc->std_file;
    desc->std_file = nullptr;
}

std::int32_t close_descriptors(const img_desc *desc)
{
    const img_std_file *const file = desc->std_file;
    if (file->hdr_fd != file->data_fd && file->hdr_fd != -1) desc->io_method->close(file->hdr_fd);
    return file->data_fd != -1 ? desc->io_method->close(file->data_fd) : 0;
}

// Opens the file with the record's flags and makes the state.
std::int32_t open_file(img_desc *desc)
{
    if (desc->io_method == nullptr) return -1;
    const std::int32_t fd = desc->io_method->open(desc->filename.get(), desc->oflags, FILE_MODE);
    if (fd < 0) return -1;
    if (make_state(desc, fd) == 0) return 0;
    desc->io_method->close(fd);
    return -1;
}

// Grows a file that is shorter than its data to its full size, with zero bytes. What cannot be
// completed, a file opened read-only for one, stays as it is: there is nobody to tell. (A method
// whose calls are counted is asked all the same, and refuses the write.)
void complete(img_desc *desc)
{
    if (img_access_mode(desc) == IMG_OPEN_READ_ONLY && img_std_joins_calls(desc)) return;
    const img_std_file *const file = desc->std_file;
    const std::int32_t expected = desc->nbands * file->band_size + file->data_offset;
    const std::int32_t length = seek(desc, 0, IMG_SEEK_END);
    if (length >= 0 && length < expected) append_zeros(desc, length, expected - length);
}

// Tells a read that failed, or stopped although the file goes on, from one that met its end.
void note_bytes_not_read(img_desc *desc, std::int64_t offset, std::int32_t got, std::int32_t count)
{
    img_std_file *const file = desc->std_file;
    if (got == -1) {
        file->read_error = errno != 0 ? errno : EIO;
    } else if (const std::int32_t end = seek(desc, 0, IMG_SEEK_END);
               got < 0 || got > count || end < 0 || end > offset + got) {
        file->read_error = EIO;
    }
}

}  // namespace

std::int32_t img_std_open(img_desc *desc)
{
    if (open_file(desc) == -1) return -1;
    const img_type_hooks &hooks = img_hooks_of(desc);
    if (hooks.probe(desc) != 0 && hooks.read_header(desc) != -1 && img_std_setup(desc) != -1)
        return 0;
    img_std_fail_close(desc);
    return -1;
}

std::int32_t img_std_create(img_desc *desc)
{
    if (open_file(desc) == -1) return -1;
    if (img_hooks_of(desc).write_header(desc) != -1 && img_std_setup(desc) != -1) return 0;
    img_std_fail_close(desc);
    return -1;
}

std::int32_t img_std_create_mem(img_desc *desc)
{
    if (make_state(desc, -1) == -1) return -1;
    img_std_file *const file = desc->std_file;
    if (img_std_setup(desc) == 0) {
        // In layout 4 a tile counts all bands already; there is room for them once more.
        const std::int64_t size =
            file->tile_size != 0
                ? product(file->tiles_down, file->tiles_across, desc->nbands, file->tile_size)
                : product(file->padded_nsamps, desc->nlines, desc->nbytes, desc->nbands);
        if (size != -1)
            desc->mem_image.reset(new (std::nothrow)
                                      std::uint8_t[static_cast<std::size_t>(size)]{});
        file->veof = file->veof_max = static_cast<std::int32_t>(size) - 1;
    }
    if (desc->mem_image) return 0;
    img_std_close(desc);
    return -1;
}

std::int32_t img_std_close(img_desc *desc)
{
    std::int32_t result = 0;
    if (desc->std_file == nullptr) return result;
    desc->mem_image.reset();
    if (desc->std_file->data_fd != -1) {
        complete(desc);
        result = close_descriptors(desc);
    }
    free_state(desc);
    return result;
}

void img_std_fail_close(img_desc *desc)
{
    if (desc->std_file == nullptr) return;
    close_descriptors(desc);
    free_state(desc);
}

std::int32_t img_std_delete(img_desc *desc)
{
    const std::unique_ptr<char[]> companion(desc->std_file->companion_name);
    desc->std_file->companion_name = nullptr;
    img_std_fail_close(desc);
    if (desc->io_method == nullptr) return -1;  // an in-memory image may have none
    if (companion) desc->io_method->unlink(companion.get());
    return desc->io_method->unlink(desc->filename.get());
}

std::int32_t img_std_setup(img_desc *desc)
{
    img_std_file *const file = desc->std_file;
    if (!within_the_drivers_limits(desc) || !set_up_planes(desc, file) ||
        !set_up_layout(desc, file) || tiles_end(desc, file) == -1)
        return -1;
    if (file->data_fd == -1) return 0;
    if (img_std_update_veof(desc) == -1) return -1;
    file->veof_max = file->veof;
    return seek_to(desc, 0);
}

std::int32_t img_std_check_position(std::int32_t position, std::int64_t expected)
{
    if (position == expected) return 0;
    if (position != -1) errno = EIO;  // the method stands elsewhere than it was told to
    return -1;
}

std::int32_t img_std_extend(img_desc *desc, std::int32_t count)
{
    if (desc->mem_image) return 0;
    const std::int32_t end = seek(desc, 0, IMG_SEEK_END);
    return end != -1 ? append_zeros(desc, end, count) : -1;
}

std::int32_t img_std_seek_to_write(img_desc *desc, std::int64_t offset)
{
    if (offset <= desc->std_file->veof || img_std_fitting(offset) == -1)
        return seek_to(desc, offset);
    // The file may have grown since it was last looked at: what is missing counts from its end.
    const std::int32_t end = seek(desc, 0, IMG_SEEK_END);
    if (end == -1) return -1;
    if (offset <= end) return seek_to(desc, offset);
    if (append_zeros(desc, end, offset - end) == -1) return -1;
    desc->std_file->veof = static_cast<std::int32_t>(offset);
    return 0;
}

std::int32_t img_std_update_veof(img_desc *desc)
{
    const std::int32_t end = seek(desc, 0, IMG_SEEK_END);
    if (end == -1) return -1;
    desc->std_file->veof = end;
    return 0;
}

std::int32_t img_std_read_at(img_desc *desc, std::int64_t offset, void *buffer, std::int32_t count)
{
    std::int32_t got = seek_to(desc, offset);
    if (got == 0)
        got = desc->io_method->read(desc->std_file->data_fd, buffer,
                                    static_cast<std::uint32_t>(count));
    if (got != count && desc->std_file->pre_reads > 0)
        note_bytes_not_read(desc, offset, got, count);
    return got;
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

std::uint8_t *img_std_memory_to_write(const img_desc *desc, std::int64_t offset, std::int32_t count)
{
    img_std_file *const file = desc->std_file;
    const std::int64_t last = offset + count - 1;
    if (last > file->veof_max) return nullptr;
    file->veof = std::max(file->veof, static_cast<std::int32_t>(last));
    return desc->mem_image.get() + offset;
}

bool img_std_lend(const img_desc *desc, std::int64_t offset, std::int64_t count, img_io_use_fn use,
                  void *arg)
{
    const img_std_file *const file = desc->std_file;
    if (desc->mem_image) {
        if (offset + count - 1 > file->veof) return false;
        use(arg, desc->mem_image.get() + offset);
        return true;
    }
    // What a refused use left in its buffer must not stand for what the file does not hold.
    return file->pre_reads == 0 && img_std_joins_calls(desc) &&
           desc->io_method->lend(file->data_fd, static_cast<std::int32_t>(offset),
                                 static_cast<std::int32_t>(count), use, arg) == 0;
}

bool img_std_joins_calls(const img_desc *desc)
{
    return desc->io_method->lend != nullptr;
}
