// The beginning and the end of an image: opening, creating and closing.
#include "api/img_desc.h"
#include "api/report.h"
#include "api/types.h"
#include "chain/chain.h"

#include <cerrno>
#include <new>
#include <numeric>

namespace {

constexpr int INVALID_ARGUMENT = 22;  // error number, of the same value on every system
constexpr std::int32_t CREATE_FLAGS = IMG_OPEN_READ_WRITE | IMG_OPEN_CREATE | IMG_OPEN_TRUNCATE;

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

// Puts the stretch of two-byte samples to 8 bits into the image's chain: one link that computes
// it from each window, and one that applies it. Returns 0, or -1 after a message.
std::int32_t img_set_auto_16to8bit_mapdown(img_handle handle)
{
    img_chain_remove_link(handle, img_mapdown_src_slot);
    img_chain_remove_link(handle, img_mapdown_slot);
    if (img_chain_add_lut_create_link(handle, img_mapdown_src_slot, nullptr,
                                      img_chain_create_16to8_lut, img_mapdown_slot,
                                      img_query_nbits(handle), 8, 1, nullptr, 0) != 0)
        return img_fail("img_set_auto_16to8bit_mapdown: Error installing auto mapdown in image "
                        "chain\n");
    return 0;
}

// Gives an image whose storage stands its chain. Returns the handle, or -1 after a message and
// with the image released.
img_handle finish_opening(img_handle handle)
{
    img_chain_init(handle);
    if (img_find_image(handle)->nbytes == 2 && img_set_auto_16to8bit_mapdown(handle) != 0) {
        img_fail("DO_16_TO_8: Error in img_set_auto_16to8bit_mapdown()\n");
        img_release_image(handle, 0);
        return -1;
    }
    return handle;
}

img_handle release_for_want_of_memory(img_handle handle)
{
    img_fail("Out of memory!!!\n");
    img_release_image(handle, 0);
    return -1;
}

// Offers the file to the types in slot order. Returns 0 when one of them took it, -1 when none.
std::int32_t open_as_some_type(img_desc *desc)
{
    for (std::int32_t slot = 0; slot < IMG_MAX_TYPES; ++slot) {
        const img_type_desc &type = img_type_table[static_cast<std::size_t>(slot)];
        if (type.enabled == 0 || type.open == nullptr) continue;
        desc->type = slot;
        if (type.open(desc) != -1) return 0;
    }
    desc->type = IMG_NO_TYPE;
    return -1;
}

}  // namespace

img_handle img_openfile(const char *name, std::int32_t flags)
{
    const img_handle handle = img_alloc_image(name, flags);
    if (handle == -1) return -1;
    img_desc *const desc = img_find_image(handle);
    if (open_as_some_type(desc) == -1) {
        img_release_image(handle, 0);
        errno = INVALID_ARGUMENT;
        return -1;
    }
    if (img_init_luts(desc) == -1) return release_for_want_of_memory(handle);
    return finish_opening(handle);
}

img_handle img_createfile(const char *name, std::int32_t nlines, std::int32_t nsamps,
                          std::int32_t nbands, std::int32_t type, std::int32_t tile_nsamps,
                          std::int32_t tile_nlines, std::int32_t nbytes)
{
    img_library_init();
    if (name == nullptr || *name == '\0') return img_fail("No image file name specified!!\n");
    if (type < 0 || type > IMG_NO_TYPE) type = IMG_NO_TYPE;
    const img_type_desc &slot = img_type_table[static_cast<std::size_t>(type)];
    if (slot.write == nullptr) return img_fail("Unwritable image type specified as output!!\n");
    if (slot.enabled == 0) return img_fail("Unsupported image file type!!\n");

    const img_handle handle = img_alloc_image(name, CREATE_FLAGS);
    if (handle == -1) return -1;
    img_desc *const desc = img_find_image(handle);
    desc->type = type;
    img_set_image_params(desc, nlines, nsamps, tile_nsamps, tile_nlines, nbands, nbytes, -1,
                         IMG_LAYOUT_DEFAULT, 0, nullptr, nullptr, nullptr);
    if (img_init_luts(desc) == -1) return release_for_want_of_memory(handle);
    if (slot.create == nullptr || slot.create(desc) == -1) {
        img_release_image(handle, 0);
        return img_fail("img_createfile: could not create %s!\n", name);
    }
    return finish_opening(handle);
}

std::int32_t img_closefile(img_handle handle)
{
    if (img_find_image(handle) != nullptr) img_release_image(handle, 1);
    return 0;
}
