// The `read` and `write` operations of types that are built on the standard driver.
//
// A region is `nlines` x `nsamps` samples of one band from (`line`, `samp`) on, inside the image;
// row i of `buffer` starts at sample i * `stride`, and its samples are in host order. The transfers
// of all layouts take these arguments. They return 0, or -1 after a message; samples moved before a
// failure stay moved. Writes do not modify `buffer`.
#ifndef IMG_STD_REGION_H
#define IMG_STD_REGION_H

#include <cstdint>

struct img_desc;

// Hand the region to the transfer of the image's layout. An empty region moves nothing; one that is
// not inside the image is refused quietly.
std::int32_t img_std_read(img_desc *desc, std::int32_t line, std::int32_t samp, std::int32_t nlines,
                          std::int32_t nsamps, std::int32_t band, std::uint8_t *buffer,
                          std::int32_t stride);
std::int32_t img_std_write(img_desc *desc, std::int32_t line, std::int32_t samp,
                           std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                           const std::uint8_t *buffer, std::int32_t stride,
                           const std::uint8_t *fill);

#endif
