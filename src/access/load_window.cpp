// Reading a window. Samples outside the image get the fill, those inside come from the type's
// `read`, and all of them pass the image's chain on their way to the host. Several threads may load
// windows of one image at the same time. Read load_window.h and chain/chain.h first.
#include "access/load_window.h"

#include "access/merged_bands.h"
#include "base/count.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "base/types.h"
#include "chain/chain_apply.h"
#include "chain/chain_prepare.h"
#include "chain/mapdown.h"

#include <cstring>

namespace {

// Returns 0 when the host may read such a window of the image, else -1 after a message.
std::int32_t check_readable(const img_desc *desc, std::int32_t nsamps, std::int32_t band,
                            std::int32_t stride)
{
    if (img_access_mode(desc) == IMG_OPEN_WRITE_ONLY || img_type_of(desc).read == nullptr)
        return img_fail("img_load_buffer: not a readable image!\n");
    if (nsamps > stride) return img_fail("img_load_buffer: nsamps cannot exceed stride!\n");
    if (band < 0 || band >= desc->nbands)
        return img_fail("img_load_buffer: band %d not available!\n", band);
    return 0;
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
    const std::int32_t window_class =
        desc->unclipped != 0 ? IMG_WINDOW_PARTIAL : img_window_class(desc, window);
    if (window_class != IMG_WINDOW_INSIDE) {
        std::array<std::uint8_t, sizeof def.fill> value{static_cast<std::uint8_t>(def.fill)};
        if (def.nbytes != 1) std::memcpy(value.data(), &def.fill, sizeof def.fill);
        img_fill_window(buffer, def.stride, def.nsamps, def.nlines, def.nbytes, value.data());
    }
    if (window_class == IMG_WINDOW_OUTSIDE) return 0;
    if (window_class == IMG_WINDOW_PARTIAL && desc->unclipped == 0)
        buffer += img_clip_window(desc, &window, def.stride) * img_count(def.nbytes);
    if (window.nlines < 1 || window.nsamps < 1) return 0;  // an empty image has nothing to read
    return read_window(desc, window, band, buffer, def.stride);
}

// Loads a window that passes the links of a chain, which this load alone uses.
std::int32_t load_through(img_chain &chain, img_desc *desc, const img_buffer_def &def,
                          std::int32_t band, std::uint8_t *buffer)
{
    img_buffer_def work_def;
    std::uint8_t *const work = img_chain_prepare(chain, desc, buffer, &def, &work_def);
    if (work == nullptr) return -1;
    if (const std::int32_t result = fill_and_read(desc, work_def, band, work); result != 0) {
        img_chain_release(chain);
        return result;
    }
    return img_chain_apply(chain);
}

}  // namespace

std::int32_t img_load_window(img_desc *desc, const img_window &window, std::int32_t band,
                             std::uint8_t *buffer, std::int32_t stride, const std::uint8_t *fill)
{
    if (check_readable(desc, window.nsamps, band, stride) == -1) return -1;
    if (window.nlines < 1 || window.nsamps < 1) return 0;
    img_chain &chain = img_chain_of(desc->handle);
    const std::int32_t nbytes = img_chain_nbytes(chain.out_bits);
    const std::int64_t samples = (std::int64_t{window.nlines} - 1) * stride + window.nsamps;
    if (buffer == nullptr || !img_fits_a_buffer(samples, nbytes)) return -1;

    const img_buffer_def def{
        .nlines = window.nlines,
        .nsamps = window.nsamps,
        .line = window.line,
        .samp = window.samp,
        .stride = stride,
        .nbytes = nbytes,
        .nbits = chain.out_bits,
        .fill = static_cast<std::uint16_t>(fill != nullptr ? *fill : 0),
    };
    if (chain.identity != 0) return fill_and_read(desc, def, band, buffer);
    if (img_is_mapdown(chain)) {
        img_mapdown_copy own(chain);
        if (own.chain() != nullptr) return load_through(*own.chain(), desc, def, band, buffer);
    }
    const img_mutex_lock lock(chain.mutex);
    return load_through(chain, desc, def, band, buffer);
}
