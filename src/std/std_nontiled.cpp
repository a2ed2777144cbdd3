// Regions of untiled images, line by line.
#include "base/img_desc.h"
#include "base/report.h"
#include "base/scratch.h"
#include "std/std.h"

#include <algorithm>

namespace {

std::size_t bytes_of(const img_desc *desc, std::int32_t nsamps)
{
    return static_cast<std::size_t>(nsamps) * static_cast<std::size_t>(desc->nbytes);
}

// Byte of the caller's buffer at which row `row` begins.
std::size_t row_start(const img_desc *desc, std::int32_t row, std::int32_t stride)
{
    return static_cast<std::size_t>(row) * bytes_of(desc, stride);
}

void copy_row(const img_desc *desc, const std::uint8_t *from, std::uint8_t *to, std::int32_t nsamps,
              bool exchange)
{
    const std::size_t step = bytes_of(desc, 1);
    img_std_copy_samples(from, step, to, step, static_cast<std::size_t>(nsamps), desc->nbytes,
                         exchange);
}

// Writes this band's samples of one line of pixels into the file, from offset `at` on, and steps
// over those of the other bands.
std::int32_t write_interleaved_samples(const img_desc *desc, std::int64_t at, std::int32_t nsamps,
                                       const std::uint8_t *from)
{
    const img_io_method *const method = desc->io_method;
    const std::int32_t fd = desc->std_file->data_fd;
    const std::int32_t pixel_length = desc->nbands * desc->nbytes;
    for (std::int32_t i = 0; i < nsamps; ++i) {
        std::array<std::uint8_t, 2> sample;
        copy_row(desc, from + bytes_of(desc, i), sample.data(), 1, img_std_exchanges_bytes(desc));
        const std::int32_t written =
            method->write(fd, sample.data(), static_cast<std::uint32_t>(desc->nbytes));
        if (written == -1) return img_fail_errno("img_std_write_nontiled_interleaved:write");
        if (written != desc->nbytes)
            return img_fail("img_std_write_nontiled_inter: %d of %d bytes written!!\n", written,
                            desc->nbytes);
        at += pixel_length;
        const std::int32_t next = method->seek(fd, pixel_length - desc->nbytes, IMG_SEEK_CURRENT);
        // Behind the last sample may be the end of all that can be addressed.
        if (i + 1 < nsamps && img_std_check_position(next, at) == -1)
            return img_fail_errno("img_std_write_nontiled_interleaved:write");
    }
    return 0;
}

std::int32_t write_interleaved_line(img_desc *desc, std::int64_t at, std::int32_t nsamps,
                                    const std::uint8_t *from)
{
    if (img_std_seek_to_write(desc, at) == -1)
        return img_fail_errno("img_std_write_nontiled_interleaved:write");
    const std::int32_t result = write_interleaved_samples(desc, at, nsamps, from);
    // Samples that were written before a failure may have made the file longer.
    if (img_std_update_veof(desc) == -1 && result == 0)
        return img_fail_errno("img_std_write_nontiled_interleaved:write");
    return result;
}

std::int32_t write_lines_in_memory(const img_desc *desc, std::int32_t line, std::int32_t samp,
                                   std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                   const std::uint8_t *buffer, std::int32_t stride, bool exchange)
{
    for (std::int32_t i = 0; i < nlines; ++i) {
        const std::int64_t offset = img_std_line_offset(desc, std::int64_t{line} + i, samp, band);
        std::uint8_t *const to = img_std_memory_to_write(desc, offset, desc->nbytes * nsamps);
        if (to == nullptr) return img_fail("img_write_nontiled: Write past virtual eof!!\n");
        copy_row(desc, buffer + row_start(desc, i, stride), to, nsamps, exchange);
    }
    return 0;
}

// How many lines of a region one call may write: all, or as many as fit the processor's cache where
// they have to be gathered first, when they lie side by side in the file and nobody counts the
// calls.
std::int32_t lines_at_once(const img_desc *desc, std::int32_t nlines, std::int32_t nsamps,
                           bool gathered)
{
    constexpr std::int32_t cached_bytes = 1 << 18;
    if (!img_std_joins_calls(desc) || nsamps != desc->std_file->padded_nsamps) return 1;
    return gathered ? std::clamp(cached_bytes / (desc->nbytes * nsamps), 1, nlines) : nlines;
}

// Returns room for `count` packed rows; for one, which `count` becomes, when memory is short; null
// when there is none even for that.
img_scratch room_for_rows(const img_desc *desc, std::int32_t nsamps, std::int32_t *count)
{
    img_scratch rows = img_take_scratch(bytes_of(desc, nsamps) * static_cast<std::size_t>(*count));
    if (rows || *count == 1) return rows;
    *count = 1;
    return img_take_scratch(bytes_of(desc, nsamps));
}

}  // namespace

bool img_std_exchanges_bytes(const img_desc *desc)
{
    return desc->nbytes == 2 && desc->swap != 0;
}

std::int32_t img_std_read_lines(img_desc *desc, std::int32_t line, std::int32_t samp,
                                std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                std::uint8_t *buffer, std::int32_t stride, bool exchange)
{
    if (nlines < 1) return 0;
    const std::int64_t begin = img_std_line_offset(desc, line, samp, band);
    const std::int64_t end =
        img_std_line_offset(desc, std::int64_t{line} + nlines - 1, samp + nsamps, band);
    if (img_std_lend(desc, begin, end - begin, [&](const std::uint8_t *bytes) {
            img_std_copy_rows(
                {bytes, bytes_of(desc, desc->std_file->padded_nsamps), bytes_of(desc, 1)}, buffer,
                bytes_of(desc, stride), static_cast<std::size_t>(nlines),
                static_cast<std::size_t>(nsamps), desc->nbytes, exchange);
        }))
        return 0;

    const std::int32_t row_length = desc->nbytes * nsamps;
    for (std::int32_t i = 0; i < nlines; ++i) {
        const std::int64_t offset = img_std_line_offset(desc, std::int64_t{line} + i, samp, band);
        std::uint8_t *const row = buffer + row_start(desc, i, stride);
        if (desc->mem_image) {
            if (offset + row_length - 1 > desc->std_file->veof)
                return img_fail("img_read_nontiled: read beyond virtual eof!!\n");
            copy_row(desc, desc->mem_image.get() + offset, row, nsamps, exchange);
            continue;
        }
        const std::int32_t got = img_std_read_at(desc, offset, row, row_length);
        if (got != row_length && img_std_report_errors == 0) return -1;  // virtual tiles
        if (got == -1) return img_fail_errno("img_read_nontiled:read");
        if (got != row_length)
            return img_fail("img_read_nontiled: %d of %d bytes read!!\n", got, row_length);
        if (exchange) copy_row(desc, row, row, nsamps, exchange);
    }
    return 0;
}

std::int32_t img_read_nontiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                               std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                               std::uint8_t *buffer, std::int32_t stride)
{
    return img_std_read_lines(desc, line, samp, nlines, nsamps, band, buffer, stride,
                              img_std_exchanges_bytes(desc));
}

std::int32_t img_std_read_nontiled_interleaved(img_desc *desc, std::int32_t line, std::int32_t samp,
                                               std::int32_t nlines, std::int32_t nsamps,
                                               std::int32_t band, std::uint8_t *buffer,
                                               std::int32_t stride)
{
    if (nlines < 1) return 0;
    const std::size_t pixel_length = bytes_of(desc, desc->nbands);
    const std::int64_t begin = img_std_pixel_offset(desc, line, samp);
    const std::int64_t end =
        img_std_pixel_offset(desc, std::int64_t{line} + nlines - 1, samp + nsamps);
    const auto copy_rows = [&](const std::uint8_t *pixels, std::int32_t first, std::int32_t count) {
        img_std_copy_rows({pixels + bytes_of(desc, band),
                           pixel_length * static_cast<std::size_t>(desc->std_file->padded_nsamps),
                           pixel_length},
                          buffer + row_start(desc, first, stride), bytes_of(desc, stride),
                          static_cast<std::size_t>(count), static_cast<std::size_t>(nsamps),
                          desc->nbytes, img_std_exchanges_bytes(desc));
    };
    if (img_std_lend(desc, begin, end - begin,
                     [&](const std::uint8_t *bytes) { copy_rows(bytes, 0, nlines); }))
        return 0;

    const std::int32_t row_length = desc->nbands * desc->nbytes * nsamps;
    img_scratch row;  // an in-memory image is read where it lies
    if (!desc->mem_image && !(row = img_take_scratch(static_cast<std::size_t>(row_length))))
        return img_fail_errno("img_std_read_nontiled_interleaved:malloc");
    for (std::int32_t i = 0; i < nlines; ++i) {
        const std::int64_t offset = img_std_pixel_offset(desc, std::int64_t{line} + i, samp);
        const std::uint8_t *pixels = row.get();
        if (desc->mem_image) {
            if (offset + row_length - 1 > desc->std_file->veof_max)
                return img_fail("img_std_read_nontiled_interleaved: read beyond virtual eof!!\n");
            pixels = desc->mem_image.get() + offset;
        } else {
            const std::int32_t got = img_std_read_at(desc, offset, row.get(), row_length);
            if (got == -1) return img_fail_errno("img_std_read_nontiled_interleaved:read");
            if (got != row_length)
                return img_fail("img_std_read_nontiled_interleaved: %d of %d bytes read!!\n", got,
                                row_length);
        }
        copy_rows(pixels, i, 1);
    }
    return 0;
}

std::int32_t img_std_write_lines(img_desc *desc, std::int32_t line, std::int32_t samp,
                                 std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                 const std::uint8_t *buffer, std::int32_t stride, bool exchange)
{
    if (nlines < 1) return 0;
    if (desc->mem_image)
        return write_lines_in_memory(desc, line, samp, nlines, nsamps, band, buffer, stride,
                                     exchange);
    // The caller's rows are not to be modified.
    const bool has_gaps = stride != nsamps;
    std::int32_t count = lines_at_once(desc, nlines, nsamps, exchange || has_gaps);
    img_scratch gathered;
    if (exchange || (has_gaps && count > 1)) gathered = room_for_rows(desc, nsamps, &count);
    if (exchange && !gathered) return img_fail_errno("img_std_write_nontiled:malloc");

    const std::int32_t row_length = desc->nbytes * nsamps;
    for (std::int32_t i = 0; i < nlines;) {
        count = std::min(count, nlines - i);
        const std::uint8_t *rows = buffer + row_start(desc, i, stride);
        if (gathered) {
            img_std_copy_rows({rows, bytes_of(desc, stride), bytes_of(desc, 1)}, gathered.get(),
                              bytes_of(desc, nsamps), static_cast<std::size_t>(count),
                              static_cast<std::size_t>(nsamps), desc->nbytes, exchange);
            rows = gathered.get();
        }
        const std::int64_t offset = img_std_line_offset(desc, std::int64_t{line} + i, samp, band);
        const std::int32_t written = img_std_write_at(desc, offset, rows, count * row_length);
        if (written == count * row_length) {
            i += count;
            continue;
        }
        if (count == 1)
            return written == -1 ? img_fail_errno("img_std_write_nontiled:write")
                                 : img_fail("img_std_write_nontiled: %d of %d bytes written!!\n",
                                            written, row_length);
        // Once more, line by line from the first that was not written whole.
        i += std::max(written, 0) / row_length;
        count = 1;
    }
    return 0;
}

std::int32_t img_std_write_nontiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                                    std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                    const std::uint8_t *buffer, std::int32_t stride,
                                    const std::uint8_t * /*fill*/)
{
    return img_std_write_lines(desc, line, samp, nlines, nsamps, band, buffer, stride,
                               img_std_exchanges_bytes(desc));
}

std::int32_t img_std_write_nontiled_interleaved(img_desc *desc, std::int32_t line,
                                                std::int32_t samp, std::int32_t nlines,
                                                std::int32_t nsamps, std::int32_t band,
                                                const std::uint8_t *buffer, std::int32_t stride,
                                                const std::uint8_t * /*fill*/)
{
    const std::size_t pixel_length = bytes_of(desc, desc->nbands);
    const std::int32_t row_length = desc->nbands * desc->nbytes * nsamps;
    for (std::int32_t i = 0; i < nlines; ++i) {
        const std::int64_t offset = img_std_pixel_offset(desc, std::int64_t{line} + i, samp);
        const std::uint8_t *const row = buffer + row_start(desc, i, stride);
        if (desc->mem_image) {
            std::uint8_t *const pixels = img_std_memory_to_write(desc, offset, row_length);
            if (pixels == nullptr)
                return img_fail("img_std_write_nontiled_interleaved: Write past virtual eof!!\n");
            img_std_copy_samples(row, bytes_of(desc, 1), pixels + bytes_of(desc, band),
                                 pixel_length, static_cast<std::size_t>(nsamps), desc->nbytes,
                                 img_std_exchanges_bytes(desc));
        } else if (write_interleaved_line(desc, offset + std::int64_t{band} * desc->nbytes, nsamps,
                                          row) == -1) {
            return -1;
        }
    }
    return 0;
}
