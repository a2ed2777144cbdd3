// Regions of untiled, band sequential images: lines of one band. Arguments and results are those of
// std_region.h.
#ifndef IMG_STD_LINES_H
#define IMG_STD_LINES_H

#include <cstdint>

struct img_desc;

// `exchange` says whether two-byte samples change their byte order.
std::int32_t img_std_read_lines(img_desc *desc, std::int32_t line, std::int32_t samp,
                                std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                std::uint8_t *buffer, std::int32_t stride, bool exchange);
std::int32_t img_std_write_lines(img_desc *desc, std::int32_t line, std::int32_t samp,
                                 std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                 const std::uint8_t *buffer, std::int32_t stride, bool exchange);

// The read for samples that are stored again: never from lent bytes, and without exchange. On a
// failure `*missed` becomes, as an errno value, why bytes that the file holds were not read; it
// stays as it is when the file ends there.
std::int32_t img_std_pre_read_lines(img_desc *desc, std::int32_t line, std::int32_t samp,
                                    std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                    std::uint8_t *buffer, std::int32_t stride, int *missed);

// Reads and writes with the byte order of the image. The write ignores `fill`.
std::int32_t img_read_nontiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                               std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                               std::uint8_t *buffer, std::int32_t stride);
std::int32_t img_std_write_nontiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                                    std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                    const std::uint8_t *buffer, std::int32_t stride,
                                    const std::uint8_t *fill);

#endif
