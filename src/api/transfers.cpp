// The four exported transfers. Each looks its handle up, once, locks the image and passes the
// record down: windows and whole tiles are in access/. Their contracts stand in imgfile/img.h.
#include "access/dump_window.h"
#include "access/load_window.h"
#include "access/tiles.h"
#include "api/calls.h"
#include "base/image_table.h"
#include "base/report.h"
#include "imgfile/img.h"

std::int32_t img_load_buffer(img_handle handle, std::int32_t line, std::int32_t samp,
                             std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                             void *buffer, std::int32_t stride, const std::uint8_t *fill)
{
    const img_call call;
    const img_image_use image(handle, img_purpose::load);
    if (image.desc() == nullptr) {
        img_report_invalid_handle(handle);
        return img_fail("img_load_buffer: img_validate_img_handle()\n");
    }
    return img_load_window(image.desc(), {line, samp, nlines, nsamps}, band,
                           static_cast<std::uint8_t *>(buffer), stride, fill);
}

std::int32_t img_dump_buffer(img_handle handle, std::int32_t line, std::int32_t samp,
                             std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                             const void *buffer, std::int32_t stride, const void *fill)
{
    const img_call call;
    const img_image_use image(handle, img_purpose::dump);
    if (image.desc() == nullptr) return -1;
    return img_dump_window(image.desc(), {line, samp, nlines, nsamps}, band,
                           static_cast<const std::uint8_t *>(buffer), stride,
                           static_cast<const std::uint8_t *>(fill));
}

std::int32_t img_load_tiles(img_handle handle, std::int32_t first_tile, std::int32_t ntiles,
                            std::int32_t band, void *buffer)
{
    const img_call call;
    const img_image_use image(handle, img_purpose::load);
    if (image.desc() == nullptr) return -1;
    return img_load_tile_run(image.desc(), first_tile, ntiles, band,
                             static_cast<std::uint8_t *>(buffer));
}

std::int32_t img_dump_tiles(img_handle handle, std::int32_t first_tile, std::int32_t ntiles,
                            std::int32_t band, const void *buffer)
{
    const img_call call;
    const img_image_use image(handle, img_purpose::dump);
    if (image.desc() == nullptr) return -1;
    return img_dump_tile_run(image.desc(), first_tile, ntiles, band,
                             static_cast<const std::uint8_t *>(buffer));
}
