#include "preview.h"

#include <algorithm>
#include <cstddef>
#include <png.h>
#include <stdexcept>
#include <vector>

namespace {

// Stores the means of blocks of `factor` x `factor` samples of a packed window in every
// `step`-th byte of `out`. What does not fill a block at the right and the bottom is left out.
void average(const std::vector<std::uint8_t> &from, std::int32_t nsamps, std::int32_t factor,
             std::int32_t out_nlines, std::int32_t out_nsamps, std::uint8_t *out, int step)
{
    for (std::int32_t line = 0; line < out_nlines; ++line) {
        for (std::int32_t samp = 0; samp < out_nsamps; ++samp, out += step) {
            std::int64_t sum = 0;
            for (std::int32_t l = line * factor; l < (line + 1) * factor; ++l) {
                const auto row = static_cast<std::size_t>(l) * static_cast<std::size_t>(nsamps);
                const auto first = row + static_cast<std::size_t>(samp * factor);
                for (std::int32_t i = 0; i < factor; ++i)
                    sum += from[first + static_cast<std::size_t>(i)];
            }
            *out = static_cast<std::uint8_t>(sum / factor / factor);
        }
    }
}

}  // namespace

void write_preview(const std::string &name, img_handle image, const window &area)
{
    // A narrow window keeps at least one sample of its shorter side.
    const std::int32_t longer = std::max(area.nlines, area.nsamps);
    const std::int32_t factor =
        std::min((longer + 1023) / 1024, std::min(area.nlines, area.nsamps));
    const std::int32_t nlines = area.nlines / factor, nsamps = area.nsamps / factor;
    const int nbands = img_query_num_bands(image) == 3 ? 3 : 1;

    const auto count = [](std::int32_t lines, std::int32_t samps) {
        return static_cast<std::size_t>(lines) * static_cast<std::size_t>(samps);
    };
    std::vector<std::uint8_t> plane(count(area.nlines, area.nsamps));
    std::vector<std::uint8_t> pixels(count(nlines, nsamps) * static_cast<std::size_t>(nbands));
    const std::uint8_t fill = 0;
    for (int band = 0; band < nbands; ++band) {
        if (img_load_buffer(image, area.line, area.samp, area.nlines, area.nsamps, band,
                            plane.data(), area.nsamps, &fill) != 0)
            throw std::runtime_error(name + ": its window cannot be read");
        average(plane, area.nsamps, factor, nlines, nsamps, pixels.data() + band, nbands);
    }

    png_image png{};
    png.version = PNG_IMAGE_VERSION;
    png.width = static_cast<png_uint_32>(nsamps);
    png.height = static_cast<png_uint_32>(nlines);
    png.format = nbands == 3 ? PNG_FORMAT_RGB : PNG_FORMAT_GRAY;
    if (!png_image_write_to_file(&png, name.c_str(), 0, pixels.data(), 0, nullptr))
        throw std::runtime_error(name + ": " + png.message);
}
