// Regions of untiled, band sequential images. A read takes the lines on loan, if the access method
// lends them, else line by line: one seek and one read each. Read std_lines.h, then std_bytes.h.
#include "std/std_lines.h"

#include "base/count.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "base/scratch.h"
#include "std/std.h"
#include "std/std_bytes.h"
#include "std/std_offset.h"
#include "std/std_samples.h"

#include <algorithm>
#include <utility>

namespace {

void copy_row(const img_desc *desc, const std::uint8_t *source, std::uint8_t *target,
              std::int32_t nsamps, bool exchange)
{
    const std::size_t width = img_count(desc->nbytes);
    img_std_copy_samples(source, width, target, width, img_count(nsamps), desc->nbytes, exchange);
}

std::int32_t read_lines_in_memory(const img_desc *desc, std::int32_t line, std::int32_t samp,
                                  std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                  std::uint8_t *buffer, std::int32_t stride, bool exchange)
{
    const std::int32_t row_length = desc->nbytes * nsamps;
    // unreachable: the end of the loop; memory that holds all of the region is lent
    for (std::int32_t i = 0; i < nlines; ++i) {
        const std::int64_t offset = img_std_line_offset(desc, std::int64_t{line} + i, samp, band);
        if (offset + row_length - 1 > desc->std_file->veof)
            return img_fail("img_read_nontiled: read beyond virtual eof!!\n");
        copy_row(desc, desc->mem_image.get() + offset,
                 buffer + img_count(i) * img_std_sample_bytes(desc, stride), nsamps, exchange);
    }
    return 0;
}

// `missed` null: not a pre-read.
std::int32_t read_lines_by_calls(img_desc *desc, std::int32_t line, std::int32_t samp,
                                 std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                 std::uint8_t *buffer, std::int32_t stride, bool exchange,
                                 int *missed)
{
    const std::int32_t row_length = desc->nbytes * nsamps;
    for (std::int32_t i = 0; i < nlines; ++i) {
        const std::int64_t offset = img_std_line_offset(desc, std::int64_t{line} + i, samp, band);
        std::uint8_t *const row = buffer + img_count(i) * img_std_sample_bytes(desc, stride);
        const std::int32_t got = img_std_read_at(desc, offset, row, row_length);
        if (got == row_length) {
            if (exchange) copy_row(desc, row, row, nsamps, exchange);
            continue;
        }
        if (missed != nullptr) img_std_note_missed(desc, offset, got, row_length, missed);
        return got == -1 ? img_fail_errno("img_read_nontiled:read")
                         : img_fail("img_read_nontiled: %d of %d bytes read!!\n", got, row_length);
    }
    return 0;
}

std::int32_t write_lines_in_memory(img_desc *desc, std::int32_t line, std::int32_t samp,
                                   std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                   const std::uint8_t *buffer, std::int32_t stride, bool exchange)
{
    for (std::int32_t i = 0; i < nlines; ++i) {
        const std::int64_t offset = img_std_line_offset(desc, std::int64_t{line} + i, samp, band);
        std::uint8_t *const row = img_std_memory_to_write(desc, offset, desc->nbytes * nsamps);
        if (row == nullptr) return img_fail("img_write_nontiled: Write past virtual eof!!\n");
        copy_row(desc, buffer + img_count(i) * img_std_sample_bytes(desc, stride), row, nsamps,
                 exchange);
    }
    return 0;
}

// How a write cuts its region into calls.
struct write_plan {
    std::int32_t nlines;  // lines per call
    img_scratch packed;   // room for so many lines without gaps; null: the caller's rows are used
};

// Plans one call for all lines that lie side by side in the file, if the access method allows it.
// Lines that must be gathered first are written in pieces that fit the processor's cache.
write_plan plan_write(const img_desc *desc, std::int32_t nlines, std::int32_t nsamps,
                      std::int32_t stride, bool exchange)
{
    constexpr std::int32_t cached_bytes = 1 << 18;
    const bool has_gaps = stride != nsamps;
    std::int32_t at_once = 1;
    if (img_std_may_merge(desc) && nsamps == desc->std_file->padded_nsamps)
        at_once = exchange || has_gaps
                      ? std::clamp(cached_bytes / (desc->nbytes * nsamps), 1, nlines)
                      : nlines;
    const bool gathers = exchange || (has_gaps && at_once > 1);
    if (!gathers) return {at_once, nullptr};
    const std::size_t line_length = img_std_sample_bytes(desc, nsamps);
    img_scratch packed = img_take_scratch(line_length * img_count(at_once));
    if (packed || at_once == 1) return {at_once, std::move(packed)};
    return {1, img_take_scratch(line_length)};
}

}  // namespace

std::int32_t img_std_read_lines(img_desc *desc, std::int32_t line, std::int32_t samp,
                                std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                std::uint8_t *buffer, std::int32_t stride, bool exchange)
{
    if (nlines < 1) return 0;
    const std::int64_t begin = img_std_line_offset(desc, line, samp, band);
    const std::int64_t end =
        img_std_line_offset(desc, std::int64_t{line} + nlines - 1, samp + nsamps, band);
    const img_std_target target{.rows = buffer,
                                .nrows = img_count(nlines),
                                .row_length = img_std_sample_bytes(desc, nsamps),
                                .pitch = img_std_sample_bytes(desc, stride)};
    const auto copy = [&](const std::uint8_t *bytes, std::uint8_t *rows, std::size_t pitch) {
        img_std_copy_rows({bytes, img_std_sample_bytes(desc, desc->std_file->padded_nsamps),
                           img_count(desc->nbytes)},
                          rows, pitch, img_count(nlines), img_count(nsamps), desc->nbytes,
                          exchange);
    };
    if (img_std_lend_rows(desc, begin, end - begin, target, copy)) return 0;
    if (desc->mem_image)
        return read_lines_in_memory(desc, line, samp, nlines, nsamps, band, buffer, stride,
                                    exchange);
    return read_lines_by_calls(desc, line, samp, nlines, nsamps, band, buffer, stride, exchange,
                               nullptr);
}

std::int32_t img_std_pre_read_lines(img_desc *desc, std::int32_t line, std::int32_t samp,
                                    std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                    std::uint8_t *buffer, std::int32_t stride, int *missed)
{
    return read_lines_by_calls(desc, line, samp, nlines, nsamps, band, buffer, stride, false,
                               missed);
}

std::int32_t img_read_nontiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                               std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                               std::uint8_t *buffer, std::int32_t stride)
{
    return img_std_read_lines(desc, line, samp, nlines, nsamps, band, buffer, stride,
                              img_std_exchanges_bytes(desc));
}

std::int32_t img_std_write_lines(img_desc *desc, std::int32_t line, std::int32_t samp,
                                 std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                 const std::uint8_t *buffer, std::int32_t stride, bool exchange)
{
    if (nlines < 1) return 0;
    if (desc->mem_image)
        return write_lines_in_memory(desc, line, samp, nlines, nsamps, band, buffer, stride,
                                     exchange);
    write_plan plan = plan_write(desc, nlines, nsamps, stride, exchange);
    if (exchange && !plan.packed) return img_fail_errno("img_std_write_nontiled:malloc");

    const std::int32_t row_length = desc->nbytes * nsamps;
    const std::size_t buffer_pitch = img_std_sample_bytes(desc, stride);
    for (std::int32_t i = 0; i < nlines;) {
        const std::int32_t count = std::min(plan.nlines, nlines - i);
        const std::uint8_t *rows = buffer + img_count(i) * buffer_pitch;
        if (plan.packed) {
            img_std_copy_rows({rows, buffer_pitch, img_count(desc->nbytes)}, plan.packed.get(),
                              img_count(row_length), img_count(count), img_count(nsamps),
                              desc->nbytes, exchange);
            rows = plan.packed.get();
        }
        const std::int64_t offset = img_std_line_offset(desc, std::int64_t{line} + i, samp, band);
        const std::int32_t written = img_std_write_at(desc, offset, rows, count * row_length);
        if (written == count * row_length) {
            i += count;
        } else if (count > 1) {
            // Again line by line, from the first that was not written whole: its failure counts.
            i += std::max(written, 0) / row_length;
            plan.nlines = 1;
        } else {
            return written == -1 ? img_fail_errno("img_std_write_nontiled:write")
                                 : img_fail("img_std_write_nontiled: %d of %d bytes written!!\n",
                                            written, row_length);
        }
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
