// Between an image in memory and a file image. No function that a host calls comes here: the two
// operations are part of what a type offers. Read std_memory.h first.
#include "std/std_memory.h"

#include "base/count.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "std/std.h"
#include "std/std_bytes.h"
#include "std/std_offset.h"

#include <cstring>

namespace {

// Bytes of one band of an in-memory image, as img_std_create_mem lays them out.
std::int64_t band_bytes(const img_desc *desc)
{
    const img_std_file *const file = desc->std_file;
    if (file->tile_size != 0)
        return std::int64_t{file->tiles_down} * file->tiles_across * file->tile_size;
    return std::int64_t{file->padded_nsamps} * desc->nlines * desc->nbytes;
}

// True when the samples of all bands lie together, so that one transfer moves them.
bool moves_all_bands_at_once(const img_desc *desc)
{
    return desc->layout == IMG_LAYOUT_BIP || desc->layout == IMG_LAYOUT_TILED ||
           desc->layout == IMG_LAYOUT_TILED_BIP;
}

// Returns 0 when the images fit each other at (`line0`, `samp0`), else -1 after a message.
std::int32_t check_fit(const img_desc *desc, const img_desc *mem_desc, std::int32_t line0,
                       std::int32_t samp0)
{
    if (desc->nsamps != mem_desc->nsamps)
        return img_fail("Only images with same # samps currently supported!\n");
    if (desc->nbands != mem_desc->nbands)
        return img_fail("Only images with same # bands currently supported!\n");
    if (desc->std_file->tile_size == 0) return 0;
    if (desc->tile_nsamps != mem_desc->tile_nsamps || desc->tile_nlines != mem_desc->tile_nlines)
        return img_fail("Only images with same tile sizes currently supported!\n");
    if (line0 % desc->tile_nlines != 0 || samp0 % desc->tile_nsamps != 0)
        return img_fail("Tiled images must be loaded/dumped on tile boundaries!!\n");
    return 0;
}

std::int32_t transfer(std::int32_t writing, img_desc *desc, std::int32_t offset, std::uint8_t *data,
                      std::int32_t size)
{
    return writing != 0 ? img_std_write_at(desc, offset, data, size)
                        : img_std_read_at(desc, offset, data, size);
}

}  // namespace

std::int32_t img_std_io_virtual(std::int32_t writing, img_desc *desc, img_desc *mem_desc,
                                std::int32_t line0, std::int32_t samp0)
{
    if (check_fit(desc, mem_desc, line0, samp0) == -1) return -1;
    if (!mem_desc->mem_image || desc->std_file->data_fd == -1) return -1;
    const bool at_once = moves_all_bands_at_once(desc);
    const std::int32_t transfers = at_once ? 1 : desc->nbands;
    const std::int64_t size = band_bytes(mem_desc) * (at_once ? mem_desc->nbands : 1);
    if (size == 0) return 0;  // not even the length of the file changes
    for (std::int32_t band = 0; band < transfers; ++band) {
        const std::int32_t offset = img_std_sample_offset(desc, line0, samp0, band);
        if (offset == -1 || offset + size > INT32_MAX) return -1;
        const auto count = static_cast<std::int32_t>(size);
        const std::int32_t moved =
            transfer(writing, desc, offset, mem_desc->mem_image.get() + band * size, count);
        if (moved == -1) return img_fail_errno("img_std_io_virtual:write");
        if (moved != count && at_once)
            return img_fail("img_std_io_virtual:Only %d of %d bytes ioed!!\n", moved, count);
        if (moved != count)
            return img_fail("img_std_io_virtual: %d of %d bytes ioed!!\n", moved, count);
    }
    return 0;
}

std::int32_t img_std_pix_io_virtual(std::int32_t writing, img_desc *desc, std::int32_t line,
                                    std::int32_t samp, std::int32_t band, std::uint8_t *value)
{
    if (!desc->mem_image || line < 0 || samp < 0 || band < 0) return -1;
    const std::int32_t offset = img_std_sample_offset(desc, line, samp, band);
    if (offset == -1 || offset > desc->std_file->veof_max)
        return img_fail("img_std_pix_io_virtual:Pixel out of range.\n");
    // A two-byte sample may begin inside the image and end beyond it.
    const std::int64_t room = std::int64_t{desc->std_file->veof_max} - offset + 1;
    if (room < desc->nbytes) return -1;
    std::uint8_t *const sample = desc->mem_image.get() + offset;
    const auto width = img_count(desc->nbytes);
    if (writing != 0)
        std::memcpy(sample, value, width);
    else
        std::memcpy(value, sample, width);
    return 0;
}
