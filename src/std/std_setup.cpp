// Opening, creating and closing, and the file organisation. Sizes come from headers and hosts: they
// are multiplied in 64 bits and validated here, once, so that transfers need no checks of their
// own. Read std.h first, then std_setup.h.
#include "std/std_setup.h"

#include "base/img_desc.h"
#include "base/settings.h"
#include "base/type_hooks.h"
#include "io/io_method.h"
#include "std/std.h"
#include "std/std_bytes.h"
#include "std/std_tiles.h"

#include <new>
#include <utility>

namespace {

constexpr std::int32_t FILE_MODE = 0666;

// Every size below fits 31 bits, or is -1 where it does not.

std::int64_t product(std::int64_t first, std::int64_t second)
{
    return first < 0 || second < 0 ? -1 : img_std_fit31(first * second);
}

template <typename... More>
std::int64_t product(std::int64_t first, std::int64_t second, More... more)
{
    return product(product(first, second), more...);
}

// `known` is not -1.
std::int64_t sum(std::int64_t known, std::int64_t size)
{
    return size < 0 ? -1 : img_std_fit31(known + size);
}

bool is_within_limits(const img_desc *desc)
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

// Fills in the tile counts and the tile size. The counts need no check: they are not above the
// lines and samples of a plane, which was validated before. Returns false when the size does not
// fit.
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

// Chooses the layout, where the image leaves that to its type, and sets up stored or virtual tiles.
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

// Makes the state of an image whose files are open on `fd`, or in memory for -1. Returns false when
// memory is short.
bool make_state(img_desc *desc, std::int32_t fd)
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
        .companion_name = nullptr,
        .position_mutex = {},
    };
    return desc->std_file != nullptr;
}

void free_state(img_desc *desc)
{
    delete std::exchange(desc->std_file, nullptr);
}

std::int32_t close_descriptors(const img_desc *desc)
{
    const img_std_file *const file = desc->std_file;
    if (file->hdr_fd != file->data_fd && file->hdr_fd != -1) desc->io_method->close(file->hdr_fd);
    return file->data_fd != -1 ? desc->io_method->close(file->data_fd) : 0;
}

// Opens the file with the record's flags and makes the state.
bool open_file(img_desc *desc)
{
    if (desc->io_method == nullptr) return false;
    const std::int32_t fd = desc->io_method->open(desc->filename.get(), desc->oflags, FILE_MODE);
    if (fd < 0) return false;
    if (make_state(desc, fd)) return true;
    desc->io_method->close(fd);
    return false;
}

// Grows a file that is shorter than its data to its full size, with zero bytes. A failure is
// ignored: img_closefile has no failure result. A file opened read-only stays as it is. A method
// whose transfers may not be merged still gets the write, and refuses it.
void complete(img_desc *desc)
{
    if (img_access_mode(desc) == IMG_OPEN_READ_ONLY && img_std_may_merge(desc)) return;
    const img_std_file *const file = desc->std_file;
    const std::int32_t expected = desc->nbands * file->band_size + file->data_offset;
    const std::int32_t length = img_std_length(desc);
    if (length >= 0 && length < expected) img_std_append_zeros(desc, length, expected - length);
}

}  // namespace

std::int32_t img_std_open(img_desc *desc)
{
    if (!open_file(desc)) return -1;
    const img_type_hooks &hooks = img_hooks_of(desc);
    if (hooks.probe(desc) != 0 && hooks.read_header(desc) != -1 && img_std_setup(desc) != -1)
        return 0;
    img_std_fail_close(desc);
    return -1;
}

std::int32_t img_std_create(img_desc *desc)
{
    if (!open_file(desc)) return -1;
    if (img_hooks_of(desc).write_header(desc) != -1 && img_std_setup(desc) != -1) return 0;
    img_std_fail_close(desc);
    return -1;
}

std::int32_t img_std_create_mem(img_desc *desc)
{
    if (!make_state(desc, -1)) return -1;
    img_std_file *const file = desc->std_file;
    if (img_std_setup(desc) == 0) {
        // In layout 4 a tile counts all bands already; there is room for them once more.
        const std::int64_t size =
            file->tile_size != 0
                ? product(file->tiles_down, file->tiles_across, desc->nbands, file->tile_size)
                : product(file->padded_nsamps, desc->nlines, desc->nbytes, desc->nbands);
        if (size != -1) desc->mem_image.reset(new (std::nothrow) std::uint8_t[img_count(size)]{});
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
    const std::unique_ptr<char[]> companion = std::move(desc->std_file->companion_name);
    img_std_fail_close(desc);
    if (desc->io_method == nullptr) return -1;  // an in-memory image may have none
    if (companion) desc->io_method->unlink(companion.get());
    return desc->io_method->unlink(desc->filename.get());
}

std::int32_t img_std_setup(img_desc *desc)
{
    img_std_file *const file = desc->std_file;
    if (!is_within_limits(desc) || !set_up_planes(desc, file) || !set_up_layout(desc, file) ||
        tiles_end(desc, file) == -1)
        return -1;
    if (file->data_fd == -1) return 0;
    if (img_std_update_veof(desc) == -1) return -1;
    file->veof_max = file->veof;
    return img_std_seek_to(desc, 0);
}
