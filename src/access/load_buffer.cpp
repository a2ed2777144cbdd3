// Reading a window: where its samples come from, the fill around them, and the image's chain.
#include "access/buffer.h"
#include "api/fill.h"
#include "api/img_desc.h"
#include "api/report.h"
#include "api/types.h"
#include "chain/chain.h"

#include <algorithm>
#include <cstring>
#include <new>

namespace {

// Returns the image when the host may read this window of it, else null after a message.
img_desc *readable_image(img_handle handle, std::int32_t nsamps, std::int32_t band,
                         std::int32_t stride)
{
    if (img_validate_img_handle(handle) != 0) {
        img_fail("img_load_buffer: img_validate_img_handle()\n");
        return nullptr;
    }
    img_desc *const desc = img_find_image(handle);
    if (img_access_mode(desc) == IMG_OPEN_WRITE_ONLY || img_type_of(desc).read == nullptr) {
        img_fail("img_load_buffer: not a readable image!\n");
    } else if (nsamps > stride) {
        img_fail("img_load_buffer: nsamps cannot exceed stride!\n");
    } else if (band < 0 || band >= desc->nbands) {
        img_fail("img_load_buffer: band %d not available!\n", band);
    } else {
        return desc;
    }
    return nullptr;
}

std::int32_t read_window(img_desc *desc, const img_window &window, std::int32_t band,
                         std::uint8_t *buffer, std::int32_t stride)
{
    if (desc->merge_bands != 0 && desc->merge_fn != nullptr)
        return img_load_merged(desc, window.line, window.samp, window.nlines, window.nsamps, buffer,
                               stride);
    return img_type_of(desc).read(desc, window.line, window.samp, window.nlines, window.nsamps,
                                  band, buffer, stride);
}

// Puts the window that `def` describes into `buffer`: the fill where it leaves the image, and
// the image's samples.
std::int32_t fill_and_read(img_desc *desc, const img_buffer_def &def, std::int32_t band,
                           std::uint8_t *buffer)
{
    img_window window{def.line, def.samp, def.nlines, def.nsamps};
    const std::int32_t place =
        desc->unclipped != 0
            ? IMG_WINDOW_PARTIAL
            : img_window_test(desc->handle, def.line, def.samp, def.nlines, def.nsamps);
    if (place != IMG_WINDOW_INSIDE) {
        std::array<std::uint8_t, 2> value{static_cast<std::uint8_t>(def.fill)};
        if (def.nbytes != 1) std::memcpy(value.data(), &def.fill, sizeof def.fill);
        img_fill_window(buffer, def.stride, def.nsamps, def.nlines, def.nbytes, value.data());
    }
    if (place == IMG_WINDOW_OUTSIDE) return 0;
    if (place == IMG_WINDOW_PARTIAL && desc->unclipped == 0)
        buffer += img_clip_window(desc, &window, def.stride) * static_cast<std::size_t>(def.nbytes);
    return read_window(desc, window, band, buffer, def.stride);
}

// Brings one axis of a window into 0..extent. Returns what it lost before its first element.
std::int64_t clip_axis(std::int32_t *first, std::int32_t *count, std::int32_t extent)
{
    const std::int64_t end = std::min(std::int64_t{*first} + *count, std::int64_t{extent});
    const std::int64_t skipped = *first < 0 ? -std::int64_t{*first} : 0;
    *first = std::max(*first, 0);
    *count = static_cast<std::int32_t>(end - *first);
    return skipped;
}

}  // namespace

std::int32_t img_load_buffer(img_handle handle, std::int32_t line, std::int32_t samp,
                             std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                             void *buffer, std::int32_t stride, const std::uint8_t *fill)
{
    img_desc *const desc = readable_image(handle, nsamps, band, stride);
    if (desc == nullptr) return -1;
    if (nlines < 1 || nsamps < 1) return 0;
    const std::int64_t samples = (std::int64_t{nlines} - 1) * stride + nsamps;
    if (buffer == nullptr || !img_fits_a_buffer(samples, img_chain_out_nbytes(handle))) return -1;

    const img_buffer_def def{
        .nlines = nlines,
        .nsamps = nsamps,
        .line = line,
        .samp = samp,
        .stride = stride,
        .nbytes = img_chain_out_nbytes(handle),
        .nbits = img_chain_out_bits(handle),
        .fill = static_cast<std::uint16_t>(fill != nullptr ? *fill : 0),
    };
    img_buffer_def work_def;
    std::uint8_t *const work =
        img_chain_prepare_operations(handle, static_cast<std::uint8_t *>(buffer), &def, &work_def);
    if (work == nullptr) return -1;
    if (const std::int32_t result = fill_and_read(desc, work_def, band, work); result != 0) {
        img_chain_release(handle);
        return result;
    }
    return img_apply_img_chain(handle);
}

std::int32_t img_window_test(img_handle handle, std::int32_t line, std::int32_t samp,
                             std::int32_t nlines, std::int32_t nsamps)
{
    const img_desc *const desc = img_find_image(handle);
    if (desc == nullptr) return IMG_WINDOW_OUTSIDE;
    const std::int64_t line_end = std::int64_t{line} + nlines;
    const std::int64_t samp_end = std::int64_t{samp} + nsamps;
    if (line_end < 1 || line >= desc->nlines || samp_end < 1 || samp >= desc->nsamps)
        return IMG_WINDOW_OUTSIDE;
    if (line < 0 || samp < 0 || line_end > desc->nlines || samp_end > desc->nsamps)
        return IMG_WINDOW_PARTIAL;
    return IMG_WINDOW_INSIDE;
}

bool img_fits_a_buffer(std::int64_t samples, std::int32_t nbytes)
{
    return samples <= INT32_MAX && samples * nbytes <= INT32_MAX;
}

std::size_t img_clip_window(const img_desc *desc, img_window *window, std::int32_t stride)
{
    const std::int64_t lines = clip_axis(&window->line, &window->nlines, desc->nlines);
    const std::int64_t samps = clip_axis(&window->samp, &window->nsamps, desc->nsamps);
    return static_cast<std::size_t>(lines * stride + samps);
}

void img_fill_window(std::uint8_t *buffer, std::int32_t stride, std::int32_t nsamps,
                     std::int32_t nlines, std::int32_t nbytes, const std::uint8_t *value)
{
    auto count = static_cast<std::size_t>(nsamps);
    if (stride == nsamps) {
        count *= static_cast<std::size_t>(nlines);
        nlines = 1;
    }
    const std::size_t step = static_cast<std::size_t>(stride) * static_cast<std::size_t>(nbytes);
    for (std::int32_t i = 0; i < nlines; ++i)
        img_fill_samples(buffer + static_cast<std::size_t>(i) * step, count, nbytes, value);
}

std::int32_t img_load_merged(img_desc *desc, std::int32_t line, std::int32_t samp,
                             std::int32_t nlines, std::int32_t nsamps, std::uint8_t *buffer,
                             std::int32_t stride)
{
    const auto nbands = static_cast<std::size_t>(desc->nbands);
    const std::size_t band_length = static_cast<std::size_t>(nlines) *
                                    static_cast<std::size_t>(stride) *
                                    static_cast<std::size_t>(desc->nbytes);
    using band_buffer = std::unique_ptr<std::uint8_t[]>;
    const std::unique_ptr<band_buffer[]> bands(new (std::nothrow) band_buffer[nbands]);
    const std::unique_ptr<const std::uint8_t *[]> table(new (std::nothrow)
                                                            const std::uint8_t *[nbands]);
    bool complete = bands && table;
    for (std::size_t band = 0; complete && band < nbands; ++band) {
        bands[band].reset(new (std::nothrow) std::uint8_t[band_length]{});
        table[band] = bands[band].get();
        complete = bands[band] != nullptr;
    }
    if (!complete) return img_fail_errno("img_load_buffer:malloc failed for merge buffer");

    for (std::int32_t band = 0; band < desc->nbands; ++band) {
        const std::int32_t result =
            img_type_of(desc).read(desc, line, samp, nlines, nsamps, band,
                                   bands[static_cast<std::size_t>(band)].get(), stride);
        if (result != 0) return result;
    }
    desc->merge_fn(0, 0, nlines, nsamps, stride, desc->nbytes, desc->nbands, table.get(), buffer);
    return 0;
}
