#include "api/img_desc.h"

#include "access/tile_cache.h"
#include "api/report.h"
#include "api/types.h"
#include "chain/chain.h"
#include "io/io_method.h"

#include <cerrno>
#include <cstring>
#include <new>
#include <utility>

namespace {

constexpr int NO_FREE_HANDLE = 24;  // error number, of the same value on every system

img_desc *&table_slot(img_handle handle)
{
    return img_open_images[static_cast<std::size_t>(handle)];
}

// Returns a record that names no file and no type yet, or null.
img_desc *new_record(img_handle handle, std::int32_t oflags)
{
    return new (std::nothrow) img_desc{
        .type = IMG_NO_TYPE,
        .filename = nullptr,
        .io_method = nullptr,
        .oflags = oflags,
        .nsamps = 0,
        .nlines = 0,
        .tile_nsamps = 0,
        .tile_nlines = 0,
        .nbands = 0,
        .nbytes = 0,
        .nbits = 0,
        .swap = 0,
        .layout = IMG_LAYOUT_DEFAULT,
        .band_map = {0, 1, 2},
        .mem_image = nullptr,
        .lut_size = 0,
        .lut = {},
        .unclipped = 0,
        .header = nullptr,
        .std_file = nullptr,
        .handle = handle,
        .tile_cache = nullptr,
        .cache_mb = img_cache_mb,
        .cache_pending = 1,
        .virtual_tiled = 0,
        .merge_bands = 0,
        .merge_fn = nullptr,
    };
}

// Significant bits of samples of which only the bytes are known. Any number of bytes may come from
// a header or a host; the set-up refuses it afterwards.
std::int32_t default_nbits(std::int32_t nbytes)
{
    return nbytes == 2 ? 12 : static_cast<std::int32_t>(8U * static_cast<std::uint32_t>(nbytes));
}

}  // namespace

img_desc *img_find_image(img_handle handle)
{
    return handle >= 0 && handle < IMG_MAX_HANDLES ? table_slot(handle) : nullptr;
}

img_handle img_alloc_image(const char *name, std::int32_t flags)
{
    img_library_init();
    const img_handle handle = img_pool_take(img_handle_pool);
    if (handle == -1) {
        img_fail("No more open images available!!!\n");
        errno = NO_FREE_HANDLE;
        return -1;
    }
    img_desc *const desc = new_record(handle, flags | IMG_OPEN_BINARY);
    table_slot(handle) = desc;
    if (desc == nullptr ||
        img_split_name(name != nullptr ? name : "", &desc->filename, &desc->io_method) == -1) {
        img_fail("Out of memory!!!\n");
        img_release_image(handle, 0);
        return -1;
    }
    return handle;
}

void img_release_image(img_handle handle, std::int32_t flush)
{
    if (img_desc *const desc = img_find_image(handle); desc != nullptr) {
        img_tile_cache_destroy(std::exchange(desc->tile_cache, nullptr), flush);
        if (img_type_of(desc).close != nullptr) img_type_of(desc).close(desc);
        delete desc;
        table_slot(handle) = nullptr;
        img_chain_init(handle);
    }
    img_pool_give_back(img_handle_pool, handle);
}

std::int32_t img_validate_img_handle(img_handle handle)
{
    if (handle < 0 || handle >= IMG_MAX_HANDLES)
        return img_fail("img_validate_img_handle: img_handle is out of range\n");
    if (table_slot(handle) == nullptr)
        return img_fail("img_validate_img_handle: img_handle not open\n");
    return 0;
}

std::int32_t img_query_nbits(img_handle handle)
{
    const img_desc *const desc = img_find_image(handle);
    return desc != nullptr ? desc->nbits : -1;
}

std::int32_t img_query_dimension(img_handle handle, std::int32_t *nlines_out,
                                 std::int32_t *nsamps_out)
{
    const img_desc *const desc = img_find_image(handle);
    if (desc == nullptr) return -1;
    if (nlines_out != nullptr) *nlines_out = desc->nlines;
    if (nsamps_out != nullptr) *nsamps_out = desc->nsamps;
    return 0;
}

std::int32_t img_query_tile_size(img_handle handle, std::int32_t *tile_nsamps_out,
                                 std::int32_t *tile_nlines_out)
{
    const img_desc *const desc = img_find_image(handle);
    if (desc == nullptr) return -1;
    if (tile_nsamps_out != nullptr) *tile_nsamps_out = desc->tile_nsamps;
    if (tile_nlines_out != nullptr) *tile_nlines_out = desc->tile_nlines;
    return 0;
}

std::int32_t img_query_image_type(img_handle handle)
{
    const img_desc *const desc = img_find_image(handle);
    return desc != nullptr ? desc->type : IMG_NO_TYPE;
}

std::int32_t img_query_num_bands(img_handle handle)
{
    const img_desc *const desc = img_find_image(handle);
    if (desc == nullptr) return -1;
    return desc->merge_bands != 0 ? 1 : desc->nbands;
}

void img_set_image_params(img_desc *desc, std::int32_t nlines, std::int32_t nsamps,
                          std::int32_t tile_nsamps, std::int32_t tile_nlines, std::int32_t nbands,
                          std::int32_t nbytes, std::int32_t nbits, std::int32_t layout,
                          std::int32_t lut_size, std::unique_ptr<std::uint8_t[]> lut0,
                          std::unique_ptr<std::uint8_t[]> lut1,
                          std::unique_ptr<std::uint8_t[]> lut2)
{
    desc->nlines = nlines;
    desc->nsamps = nsamps;
    desc->tile_nsamps = tile_nsamps;
    desc->tile_nlines = tile_nlines;
    desc->nbands = nbands;
    desc->nbytes = nbytes;
    desc->nbits = nbits != -1 ? nbits : default_nbits(nbytes);
    desc->layout = layout;
    desc->lut_size = lut_size;
    desc->lut = {std::move(lut0), std::move(lut1), std::move(lut2)};
    desc->band_map = {0, 1, 2};
    desc->unclipped = 0;
}

std::uint32_t img_swap32(const std::uint8_t *bytes)
{
    std::uint32_t word;
    std::memcpy(&word, bytes, sizeof word);
    return word << 24U | (word & 0xFF00U) << 8U | (word >> 8U & 0xFF00U) | word >> 24U;
}
