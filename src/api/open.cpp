// The life of an image: opening, creating, closing, and the record that lives in between. A record
// is in the table of images from its allocation on, also while types probe the file; other calls
// find it once it is published. Read open.h first, then base/types.h for the order in which a
// type's operations are called.
#include "api/open.h"

#include "access/tile_cache.h"
#include "api/calls.h"
#include "api/library.h"
#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "base/settings.h"
#include "base/types.h"
#include "chain/chain_links.h"
#include "chain/stretch.h"
#include "io/io_method.h"
#include "std/std_bytes.h"
#include "std/std_samples.h"

#include <cerrno>
#include <new>
#include <numeric>
#include <utility>

namespace {

// Error numbers of the interface, of the same value on every system.
constexpr int NO_FREE_HANDLE = 24;
constexpr int INVALID_ARGUMENT = 22;

constexpr std::int32_t CREATE_FLAGS = IMG_OPEN_READ_WRITE | IMG_OPEN_CREATE | IMG_OPEN_TRUNCATE;

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

// Frees the record. The handle remains taken.
void free_image(img_desc *desc, std::int32_t flush)
{
    const img_handle handle = desc->handle;
    img_tile_cache_destroy(std::exchange(desc->tile_cache, nullptr), flush);
    if (img_type_of(desc).close != nullptr) img_type_of(desc).close(desc);
    delete desc;
    img_image_slot(handle) = nullptr;
    img_chain_init(handle);
}

// Gives up an image that was not published.
void release_image(img_desc *desc, std::int32_t flush)
{
    const img_handle handle = desc->handle;
    free_image(desc, flush);
    img_give_back_handle(handle);
}

img_handle release_without_memory(img_desc *desc)
{
    img_fail("Out of memory!!!\n");
    release_image(desc, 0);
    return -1;
}

// The name of an image, as a caller states it.
struct image_name {
    const char *text;
    bool is_plain;                // false: an "@" in the text begins the name of the access method
    const img_io_method *method;  // of a plain name; null: the default one
};

// Stores the name in the record. Returns -1 when memory is short.
std::int32_t give_name(img_desc *desc, const image_name &name)
{
    const char *const text = name.text != nullptr ? name.text : "";
    if (!name.is_plain) return img_split_name(text, &desc->filename, &desc->io_method);
    desc->io_method = name.method != nullptr ? name.method : img_lookup_io_method("");
    desc->filename = img_copy_name(text);
    return desc->filename ? 0 : -1;
}

// Takes a handle and makes its record. Returns null after a message.
img_desc *allocate_image(const image_name &name, std::int32_t flags)
{
    img_library_init();
    const img_handle handle = img_take_handle();
    if (handle == -1) {
        img_fail("No more open images available!!!\n");
        errno = NO_FREE_HANDLE;
        return nullptr;
    }
    img_desc *const desc = new_record(handle, flags | IMG_OPEN_BINARY);
    img_image_slot(handle) = desc;
    if (desc == nullptr) {
        img_fail("Out of memory!!!\n");
        img_give_back_handle(handle);
        return nullptr;
    }
    if (give_name(desc, name) == -1) {
        release_without_memory(desc);
        return nullptr;
    }
    return desc;
}

// Makes the three identity LUTs of an image with one-byte samples, unless it has LUTs already.
// Returns 0, or -1 when memory is short; the record then has none.
std::int32_t img_init_luts(img_desc *desc)
{
    if (desc->nbytes != 1 || desc->lut_size != 0) return 0;
    const auto size = std::size_t{1} << (static_cast<std::uint32_t>(desc->nbits) & 31U);
    for (auto &lut : desc->lut) {
        lut.reset(new (std::nothrow) std::uint8_t[size]);
        if (!lut) {
            desc->lut = {};
            return -1;
        }
        std::iota(lut.get(), lut.get() + size, std::uint8_t{0});
    }
    desc->lut_size = static_cast<std::int32_t>(size);
    return 0;
}

// Puts the stretch of two-byte samples to 8 bits into the image's chain: a link that computes it
// from each window, and a link that applies it. Returns 0, or -1 after a message.
std::int32_t img_set_auto_16to8bit_mapdown(img_handle handle)
{
    img_chain_remove_link(handle, img_mapdown_src_slot);
    img_chain_remove_link(handle, img_mapdown_slot);
    if (img_chain_add_lut_create_link(handle, img_mapdown_src_slot, /*arg=*/nullptr,
                                      img_chain_create_16to8_lut, img_mapdown_slot,
                                      img_query_nbits(handle), /*bits_out=*/8, /*remap=*/1,
                                      /*lut=*/nullptr, /*owned=*/0) != 0)
        return img_fail("img_set_auto_16to8bit_mapdown: Error installing auto mapdown in image "
                        "chain\n");
    return 0;
}

// Makes the chain of an image whose storage is set up. Returns the handle, or -1 after a message
// and with the image released.
img_handle finish_opening(img_desc *desc)
{
    img_chain_init(desc->handle);
    if (desc->nbytes == 2 && img_set_auto_16to8bit_mapdown(desc->handle) != 0) {
        img_fail("DO_16_TO_8: Error in img_set_auto_16to8bit_mapdown()\n");
        release_image(desc, 0);
        return -1;
    }
    img_publish_image(desc->handle);
    return desc->handle;
}

// Offers the file to the types in slot order. Returns true when one of them accepts it.
bool open_as_some_type(img_desc *desc)
{
    for (std::int32_t slot = 0; slot < IMG_MAX_TYPES; ++slot) {
        const img_type_desc &type = img_type_slot(slot);
        if (type.enabled == 0 || type.open == nullptr) continue;
        desc->type = slot;
        if (type.open(desc) != -1) return true;
    }
    desc->type = IMG_NO_TYPE;
    return false;
}

img_handle open_image(const image_name &name, std::int32_t flags)
{
    const img_call call;
    img_desc *const desc = allocate_image(name, flags);
    if (desc == nullptr) return -1;
    if (!open_as_some_type(desc)) {
        release_image(desc, 0);
        errno = INVALID_ARGUMENT;
        return -1;
    }
    if (img_init_luts(desc) == -1) return release_without_memory(desc);
    return finish_opening(desc);
}

// The geometry of a new image, as a caller states it.
struct new_geometry {
    std::int32_t nlines, nsamps, nbands, type, tile_nsamps, tile_nlines, nbytes;
};

void set_geometry(img_desc *desc, const new_geometry &geometry)
{
    desc->type = geometry.type;
    img_set_image_params(desc, geometry.nlines, geometry.nsamps, geometry.tile_nsamps,
                         geometry.tile_nlines, geometry.nbands, geometry.nbytes, /*nbits=*/-1,
                         IMG_LAYOUT_DEFAULT, /*lut_size=*/0, nullptr, nullptr, nullptr);
}

img_handle create_image(const image_name &name, new_geometry geometry)
{
    const img_call call;
    img_library_init();
    if (name.text == nullptr || *name.text == '\0')
        return img_fail("No image file name specified!!\n");
    if (geometry.type < 0 || geometry.type > IMG_NO_TYPE) geometry.type = IMG_NO_TYPE;
    const img_type_desc &type = img_type_slot(geometry.type);
    if (type.write == nullptr) return img_fail("Unwritable image type specified as output!!\n");
    if (type.enabled == 0) return img_fail("Unsupported image file type!!\n");

    img_desc *const desc = allocate_image(name, CREATE_FLAGS);
    if (desc == nullptr) return -1;
    set_geometry(desc, geometry);
    if (img_init_luts(desc) == -1) return release_without_memory(desc);
    if (type.create == nullptr || type.create(desc) == -1) {
        release_image(desc, 0);
        return img_fail("img_createfile: could not create %s!\n", name.text);
    }
    return finish_opening(desc);
}

// Returns the record of an image without a handle, or null with errno set.
img_raw_image new_raw_record(const char *filename, const img_io_method *method, std::int32_t flags)
{
    img_library_init();
    img_raw_image image(new_record(/*handle=*/-1, flags | IMG_OPEN_BINARY));
    if (image &&
        give_name(image.get(), {.text = filename, .is_plain = true, .method = method}) == 0)
        return image;
    errno = ENOMEM;
    return nullptr;
}

}  // namespace

img_handle img_alloc_image(const char *name, std::int32_t flags)
{
    const img_call call;
    const img_desc *const desc =
        allocate_image({.text = name, .is_plain = false, .method = nullptr}, flags);
    if (desc == nullptr) return -1;
    img_publish_image(desc->handle);
    return desc->handle;
}

void img_release_image(img_handle handle, std::int32_t flush)
{
    const img_call call;
    {
        const img_image_use image(handle, img_purpose::close);
        if (image.desc() != nullptr) free_image(image.desc(), flush);
    }
    img_give_back_handle(handle);
}

img_handle img_openfile(const char *name, std::int32_t flags)
{
    return open_image({.text = name, .is_plain = false, .method = nullptr}, flags);
}

img_handle img_open_plain_file(const char *filename, const img_io_method *method,
                               std::int32_t flags)
{
    return open_image({.text = filename, .is_plain = true, .method = method}, flags);
}

img_handle img_createfile(const char *name, std::int32_t nlines, std::int32_t nsamps,
                          std::int32_t nbands, std::int32_t type, std::int32_t tile_nsamps,
                          std::int32_t tile_nlines, std::int32_t nbytes)
{
    return create_image({.text = name, .is_plain = false, .method = nullptr},
                        {nlines, nsamps, nbands, type, tile_nsamps, tile_nlines, nbytes});
}

img_handle img_create_plain_file(const char *filename, const img_io_method *method,
                                 std::int32_t nlines, std::int32_t nsamps, std::int32_t nbands,
                                 std::int32_t type, std::int32_t tile_nsamps,
                                 std::int32_t tile_nlines, std::int32_t nbytes)
{
    return create_image({.text = filename, .is_plain = true, .method = method},
                        {nlines, nsamps, nbands, type, tile_nsamps, tile_nlines, nbytes});
}

std::int32_t img_closefile(img_handle handle)
{
    const img_call call;
    {
        const img_image_use image(handle, img_purpose::close);
        if (image.desc() == nullptr) return 0;
        free_image(image.desc(), 1);
    }
    // Only now may another image get the handle.
    img_give_back_handle(handle);
    return 0;
}

void img_raw_close::operator()(img_desc *desc) const
{
    const img_call call;
    if (img_type_of(desc).close != nullptr) img_type_of(desc).close(desc);
    delete desc;
}

img_raw_image img_open_raw(const char *filename, const img_io_method *method, std::int32_t flags)
{
    const img_call call;
    img_raw_image image = new_raw_record(filename, method, flags);
    if (!image) return nullptr;
    errno = 0;
    if (open_as_some_type(image.get())) return image;
    const int error = errno == EMFILE ? EMFILE : INVALID_ARGUMENT;
    image.reset();
    errno = error;
    return nullptr;
}

img_raw_image img_create_raw(const char *filename, const img_io_method *method, std::int32_t nlines,
                             std::int32_t nsamps, std::int32_t nbands, std::int32_t type,
                             std::int32_t tile_nsamps, std::int32_t tile_nlines,
                             std::int32_t nbytes)
{
    const img_call call;
    img_raw_image image = new_raw_record(filename, method, CREATE_FLAGS);
    if (!image) return nullptr;
    set_geometry(image.get(), {nlines, nsamps, nbands, type, tile_nsamps, tile_nlines, nbytes});
    errno = 0;
    const img_type_desc &type_of_file = img_type_of(image.get());
    if (type_of_file.create != nullptr && type_of_file.create(image.get()) != -1) return image;
    const int error = errno != 0 ? errno : INVALID_ARGUMENT;
    image.reset();
    errno = error;
    return nullptr;
}

std::int32_t img_read_raw(img_desc *desc, std::int32_t line, std::int32_t samp, std::int32_t nlines,
                          std::int32_t nsamps, std::int32_t band, std::uint8_t *buffer,
                          std::int32_t stride)
{
    const img_call call;
    return img_type_of(desc).read(desc, line, samp, nlines, nsamps, band, buffer, stride);
}

std::int32_t img_write_raw(img_desc *desc, std::int32_t line, std::int32_t samp,
                           std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                           const std::uint8_t *buffer, std::int32_t stride)
{
    const img_call call;
    return img_type_of(desc).write(desc, line, samp, nlines, nsamps, band, buffer, stride,
                                   /*fill=*/nullptr);
}

std::int32_t img_read_raw_run(img_desc *desc, std::int64_t offset, std::int32_t nsamps,
                              std::uint8_t *buffer)
{
    const img_call call;
    const std::int32_t length = nsamps * desc->nbytes;
    if (img_std_read_at(desc, offset, buffer, length) != length) return -1;
    if (img_std_exchanges_bytes(desc))
        img_std_exchange_bytes(buffer, buffer, static_cast<std::size_t>(nsamps));
    return 0;
}
