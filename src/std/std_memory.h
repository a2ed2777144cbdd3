// Between an image in memory and a file image, and single samples of an image in memory: the
// `io_virtual` and `pix_io_virtual` operations of a type slot.
#ifndef IMG_STD_MEMORY_H
#define IMG_STD_MEMORY_H

#include <cstdint>

struct img_desc;

// Copies the whole in-memory image `mem_desc` into the file image `desc`, or fills it from there
// (`writing` 0); its first sample lies at (`line0`, `samp0`) of the file image. Both must agree in
// width and bands. Tiled file images must agree in tile sizes, and meet the other image at a tile
// corner. Bytes are not exchanged.
// Returns 0, or -1 after a message; quietly if an image lacks its file or memory, or if the place
// lies beyond 31 bits.
std::int32_t img_std_io_virtual(std::int32_t writing, img_desc *desc, img_desc *mem_desc,
                                std::int32_t line0, std::int32_t samp0);
// Copies one sample, `nbytes` bytes, between an in-memory image and `value` (`writing` 0: out of
// the image). Returns 0, or -1 after a message; quietly for a file image or a negative position.
std::int32_t img_std_pix_io_virtual(std::int32_t writing, img_desc *desc, std::int32_t line,
                                    std::int32_t samp, std::int32_t band, std::uint8_t *value);

#endif
