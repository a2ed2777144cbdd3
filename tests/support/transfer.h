// Transfers of windows and whole tiles, as records with named parts.
#ifndef IMG_TEST_TRANSFER_H
#define IMG_TEST_TRANSFER_H

#include "imgfile/img.h"

#include <optional>

// A window of one band, or with `tiles` the run of `nlines` whole tiles from tile `line` on.
struct transfer {
    std::int32_t band = 0, line = 0, samp = 0, nlines = 1, nsamps = 1;
    std::optional<std::int32_t> stride{};  // none: `nsamps`
    bool tiles = false, writes = false;

    std::int32_t pitch() const { return stride.value_or(nsamps); }
};

inline constexpr std::uint8_t UNTOUCHED = 0xEE, FILL = 0x55;

inline std::int32_t load(img_handle image, const transfer &request, void *buffer,
                         const std::uint8_t *fill = nullptr)
{
    if (request.tiles)
        return img_load_tiles(image, request.line, request.nlines, request.band, buffer);
    return img_load_buffer(image, request.line, request.samp, request.nlines, request.nsamps,
                           request.band, buffer, request.pitch(), fill);
}

inline std::int32_t dump(img_handle image, const transfer &request, const void *buffer,
                         const std::uint8_t *fill = nullptr)
{
    if (request.tiles)
        return img_dump_tiles(image, request.line, request.nlines, request.band, buffer);
    return img_dump_buffer(image, request.line, request.samp, request.nlines, request.nsamps,
                           request.band, buffer, request.pitch(), fill);
}

inline std::int32_t carry_out(img_handle image, const transfer &request, void *buffer,
                              const std::uint8_t *fill = nullptr)
{
    return request.writes ? dump(image, request, buffer, fill) : load(image, request, buffer, fill);
}

#endif
