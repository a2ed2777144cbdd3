// Regions of untiled, pixel interleaved images. A read takes whole lines of pixels, on loan or by
// one call each, and picks the band's samples. A write makes a call for every sample, so that the
// bytes of other bands are never rewritten. Read std_interleaved_lines.h, then std_bytes.h.
#include "std/std_interleaved_lines.h"

#include "base/count.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "base/scratch.h"
#include "std/std.h"
#include "std/std_bytes.h"
#include "std/std_offset.h"
#include "std/std_samples.h"

#include <array>

namespace {

std::int32_t pixel_length(const img_desc *desc)
{
    return desc->nbands * desc->nbytes;
}

// Copies the band's samples of `nlines` stored lines of pixels, the first of which begin at
// `pixels`.
void copy_band(const img_desc *desc, const std::uint8_t *pixels, std::int32_t nlines,
               std::int32_t nsamps, std::int32_t band, std::uint8_t *buffer, std::int32_t stride)
{
    const std::size_t step = img_count(pixel_length(desc));
    img_std_copy_rows({pixels + img_std_sample_bytes(desc, band),
                       step * img_count(desc->std_file->padded_nsamps), step},
                      buffer, img_std_sample_bytes(desc, stride), img_count(nlines),
                      img_count(nsamps), desc->nbytes, img_std_exchanges_bytes(desc));
}

std::int32_t read_in_memory(const img_desc *desc, std::int32_t line, std::int32_t samp,
                            std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                            std::uint8_t *buffer, std::int32_t stride)
{
    const std::int32_t row_length = pixel_length(desc) * nsamps;
    // unreachable: the end of the loop; memory that holds all of the region is lent
    for (std::int32_t i = 0; i < nlines; ++i) {
        const std::int64_t offset = img_std_pixel_offset(desc, std::int64_t{line} + i, samp);
        if (offset + row_length - 1 > desc->std_file->veof_max)
            return img_fail("img_std_read_nontiled_interleaved: read beyond virtual eof!!\n");
        copy_band(desc, desc->mem_image.get() + offset, 1, nsamps, band,
                  buffer + img_count(i) * img_std_sample_bytes(desc, stride), stride);
    }
    return 0;
}

std::int32_t read_by_calls(img_desc *desc, std::int32_t line, std::int32_t samp,
                           std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                           std::uint8_t *buffer, std::int32_t stride)
{
    const std::int32_t row_length = pixel_length(desc) * nsamps;
    const img_scratch row = img_take_scratch(img_count(row_length));
    if (!row) return img_fail_errno("img_std_read_nontiled_interleaved:malloc");
    for (std::int32_t i = 0; i < nlines; ++i) {
        const std::int64_t offset = img_std_pixel_offset(desc, std::int64_t{line} + i, samp);
        const std::int32_t got = img_std_read_at(desc, offset, row.get(), row_length);
        if (got == -1) return img_fail_errno("img_std_read_nontiled_interleaved:read");
        if (got != row_length)
            return img_fail("img_std_read_nontiled_interleaved: %d of %d bytes read!!\n", got,
                            row_length);
        copy_band(desc, row.get(), 1, nsamps, band,
                  buffer + img_count(i) * img_std_sample_bytes(desc, stride), stride);
    }
    return 0;
}

// Writes this band's samples of one line of pixels into the file, from `offset` on, and steps over
// those of the other bands.
std::int32_t write_samples(img_desc *desc, std::int64_t offset, std::int32_t nsamps,
                           const std::uint8_t *samples)
{
    const img_io_method *const method = desc->io_method;
    const std::int32_t fd = desc->std_file->data_fd;
    const std::size_t width = img_count(desc->nbytes);
    for (std::int32_t i = 0; i < nsamps; ++i) {
        std::array<std::uint8_t, 2> sample;
        img_std_copy_samples(samples + img_std_sample_bytes(desc, i), width, sample.data(), width,
                             1, desc->nbytes, img_std_exchanges_bytes(desc));
        const std::int32_t written =
            method->write(fd, sample.data(), static_cast<std::uint32_t>(desc->nbytes));
        if (written == -1) return img_fail_errno("img_std_write_nontiled_interleaved:write");
        if (written != desc->nbytes)
            return img_fail("img_std_write_nontiled_inter: %d of %d bytes written!!\n", written,
                            desc->nbytes);
        offset += pixel_length(desc);
        const std::int32_t next =
            method->seek(fd, pixel_length(desc) - desc->nbytes, IMG_SEEK_CURRENT);
        // The seek after the last sample may lead beyond 31 bits; nothing is written there.
        if (i + 1 < nsamps && img_std_check_position(next, offset) == -1)
            return img_fail_errno("img_std_write_nontiled_interleaved:write");
    }
    return 0;
}

std::int32_t write_line(img_desc *desc, std::int64_t offset, std::int32_t nsamps,
                        const std::uint8_t *samples)
{
    if (img_std_seek_to_write(desc, offset) == -1)
        return img_fail_errno("img_std_write_nontiled_interleaved:write");
    const std::int32_t result = write_samples(desc, offset, nsamps, samples);
    // Samples that were written before a failure may have made the file longer.
    if (img_std_update_veof(desc) == -1 && result == 0)
        return img_fail_errno("img_std_write_nontiled_interleaved:write");
    return result;
}

std::int32_t write_line_in_memory(img_desc *desc, std::int64_t offset, std::int32_t nsamps,
                                  std::int32_t band, const std::uint8_t *samples)
{
    std::uint8_t *const pixels = img_std_memory_to_write(desc, offset, pixel_length(desc) * nsamps);
    if (pixels == nullptr)
        return img_fail("img_std_write_nontiled_interleaved: Write past virtual eof!!\n");
    img_std_copy_samples(samples, img_count(desc->nbytes),
                         pixels + img_std_sample_bytes(desc, band), img_count(pixel_length(desc)),
                         img_count(nsamps), desc->nbytes, img_std_exchanges_bytes(desc));
    return 0;
}

}  // namespace

std::int32_t img_std_read_nontiled_interleaved(img_desc *desc, std::int32_t line, std::int32_t samp,
                                               std::int32_t nlines, std::int32_t nsamps,
                                               std::int32_t band, std::uint8_t *buffer,
                                               std::int32_t stride)
{
    if (nlines < 1) return 0;
    const std::int64_t begin = img_std_pixel_offset(desc, line, samp);
    const std::int64_t end =
        img_std_pixel_offset(desc, std::int64_t{line} + nlines - 1, samp + nsamps);
    if (img_std_lend(desc, begin, end - begin, false, [&](const std::uint8_t *bytes) {
            copy_band(desc, bytes, nlines, nsamps, band, buffer, stride);
        }))
        return 0;
    return desc->mem_image ? read_in_memory(desc, line, samp, nlines, nsamps, band, buffer, stride)
                           : read_by_calls(desc, line, samp, nlines, nsamps, band, buffer, stride);
}

std::int32_t img_std_write_nontiled_interleaved(img_desc *desc, std::int32_t line,
                                                std::int32_t samp, std::int32_t nlines,
                                                std::int32_t nsamps, std::int32_t band,
                                                const std::uint8_t *buffer, std::int32_t stride,
                                                const std::uint8_t * /*fill*/)
{
    for (std::int32_t i = 0; i < nlines; ++i) {
        const std::int64_t offset = img_std_pixel_offset(desc, std::int64_t{line} + i, samp);
        const std::uint8_t *const row = buffer + img_count(i) * img_std_sample_bytes(desc, stride);
        const std::int32_t result =
            desc->mem_image
                ? write_line_in_memory(desc, offset, nsamps, band, row)
                : write_line(desc, offset + std::int64_t{band} * desc->nbytes, nsamps, row);
        if (result == -1) return -1;
    }
    return 0;
}
