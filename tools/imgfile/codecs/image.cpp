// What all images have in common. Read image.h first.
#include "codecs/image.h"

#include "failure.h"

#include "formats/helava.h"
#include "formats/vitec.h"

#include <array>
#include <numeric>

const char *name_of(file_format format)
{
    constexpr std::array<const char *, 7> names{IMG_VITEC_NAME, IMG_HELAVA_NAME, "PGM", "PPM",
                                                "PNM",          "PNG",           "TIFF"};
    return names.at(static_cast<std::size_t>(format));
}

band_list image_reader::all_bands() const
{
    constexpr std::int32_t most = 4096;  // a header may state any number
    if (form.nbands > most)
        throw failure(
            name, text("states ", form.nbands, " bands; at most ", most, " are supported at once"));
    band_list bands(static_cast<std::size_t>(form.nbands));
    std::iota(bands.begin(), bands.end(), 0);
    return bands;
}
