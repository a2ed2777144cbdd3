// Copying samples: the kernels of all transfers.
#ifndef IMG_STD_SAMPLES_H
#define IMG_STD_SAMPLES_H

#include <cstddef>
#include <cstdint>

struct img_desc;

// Returns the bytes of `count` samples of the image.
std::size_t img_std_sample_bytes(const img_desc *desc, std::int64_t count);

// True when two-byte samples change their byte order between the image and a caller's buffer.
bool img_std_exchanges_bytes(const img_desc *desc);

// Copies `count` samples of `nbytes` bytes; a step is the bytes from one sample to the next.
// `exchange`: the two bytes of each sample change places. Any alignment. `source` and `target` must
// not overlap, unless they are the same and bytes are exchanged.
void img_std_copy_samples(const std::uint8_t *source, std::size_t source_step, std::uint8_t *target,
                          std::size_t target_step, std::size_t count, std::int32_t nbytes,
                          bool exchange);
// Copies `count` two-byte samples that lie side by side and exchanges the bytes of each.
void img_std_exchange_bytes(const std::uint8_t *source, std::uint8_t *target, std::size_t count);

// Rows of samples in memory: sample k of row i lies at `first` + i * `pitch` + k * `step` bytes.
struct img_std_rows {
    const std::uint8_t *first;
    std::size_t pitch, step;
};
// Copies `nrows` rows of `nsamps` samples to rows that are `target_pitch` bytes apart, in which the
// samples lie side by side.
void img_std_copy_rows(const img_std_rows &rows, std::uint8_t *target, std::size_t target_pitch,
                       std::size_t nrows, std::size_t nsamps, std::int32_t nbytes, bool exchange);

#endif
