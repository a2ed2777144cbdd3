// Copies of samples with steps between them, by the functions of the standard driver. Read pixels.h
// first.
#include "codecs/pixels.h"

#include "std/std_samples.h"

void spread_pixels(const std::uint8_t *pixels, std::int32_t nbands, const band_list &bands,
                   const line_part &part, block &samples)
{
    const auto width = static_cast<std::size_t>(samples.nbytes);
    for (std::size_t i = 0; i < bands.size(); ++i)
        img_std_copy_samples(
            pixels + static_cast<std::size_t>(bands[i]) * width,
            static_cast<std::size_t>(nbands) * width,
            samples.row(part.first_band + static_cast<std::int32_t>(i), part.line) +
                static_cast<std::size_t>(part.samp) * width,
            width, static_cast<std::size_t>(part.count), samples.nbytes, false);
}

void gather_pixels(const block &samples, const line_part &part, std::uint8_t *pixels)
{
    const auto width = static_cast<std::size_t>(samples.nbytes);
    const auto nbands = static_cast<std::size_t>(samples.nbands - part.first_band);
    for (std::size_t i = 0; i < nbands; ++i)
        img_std_copy_samples(
            samples.row(part.first_band + static_cast<std::int32_t>(i), part.line) +
                static_cast<std::size_t>(part.samp) * width,
            width, pixels + i * width, nbands * width, static_cast<std::size_t>(part.count),
            samples.nbytes, false);
}

void exchange_bytes(std::uint8_t *samples, std::size_t count)
{
    img_std_exchange_bytes(samples, samples, count);
}
