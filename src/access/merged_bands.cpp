// Images that show all their bands merged into one. No type of the library makes such images: the
// path is for types that set `merge_bands` and `merge_fn`. Read merged_bands.h first.
#include "access/merged_bands.h"

#include "base/count.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "base/types.h"

#include <new>

std::int32_t img_load_merged(img_desc *desc, std::int32_t line, std::int32_t samp,
                             std::int32_t nlines, std::int32_t nsamps, std::uint8_t *buffer,
                             std::int32_t stride)
{
    const std::size_t nbands = img_count(desc->nbands);
    const std::size_t band_length = img_count(nlines) * img_count(stride) * img_count(desc->nbytes);
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
        const std::int32_t result = img_type_of(desc).read(desc, line, samp, nlines, nsamps, band,
                                                           bands[img_count(band)].get(), stride);
        if (result != 0) return result;
    }
    desc->merge_fn(0, 0, nlines, nsamps, stride, desc->nbytes, desc->nbands, table.get(), buffer);
    return 0;
}
