// What the formats share: 32-bit words of header blocks, and the header's bytes in the file.
#ifndef IMG_WORDS_H
#define IMG_WORDS_H

#include "base/img_desc.h"
#include "io/io_method.h"

#include <bit>
#include <cstdint>
#include <cstring>
#include <span>

// Files are written big-endian on every host.
inline constexpr bool IMG_WRITES_SWAPPED = std::endian::native == std::endian::little;

inline std::uint32_t img_get_word(std::span<const std::uint8_t> block, std::size_t at)
{
    std::uint32_t word;
    std::memcpy(&word, block.subspan(at, sizeof word).data(), sizeof word);
    return word;
}

inline void img_put_word(std::span<std::uint8_t> block, std::size_t at, std::uint32_t word)
{
    std::memcpy(block.subspan(at, sizeof word).data(), &word, sizeof word);
}

// The words are signed 32-bit numbers to those who use them.
inline std::int32_t img_get_int(std::span<const std::uint8_t> block, std::size_t at)
{
    return static_cast<std::int32_t>(img_get_word(block, at));
}

inline void img_put_int(std::span<std::uint8_t> block, std::size_t at, std::int32_t value)
{
    img_put_word(block, at, static_cast<std::uint32_t>(value));
}

// Returns the four bytes at `bytes` as a word of the host's order with its bytes reversed.
std::uint32_t img_swap32(const std::uint8_t *bytes);

// Reverses the bytes of each word from offset `first` to `end`.
inline void img_swap_words(std::span<std::uint8_t> block, std::size_t first, std::size_t end)
{
    for (std::size_t at = first; at < end; at += sizeof(std::uint32_t))
        img_put_word(block, at, img_swap32(&block[at]));
}

// Moves the header descriptor; `whence` is an IMG_SEEK_ code. Returns the new position, or -1
// also for an offset that does not fit 31 bits and its sign.
std::int32_t img_header_seek(const img_desc *desc, std::int64_t offset, std::int32_t whence);
// Move the whole block at the header descriptor's position. Return 0, or -1 when less was moved.
std::int32_t img_header_read(const img_desc *desc, std::span<std::uint8_t> block);
std::int32_t img_header_write(const img_desc *desc, std::span<const std::uint8_t> block);

// Returns 1 and sets the image's `swap` when the word at `offset` of the file is `magic`, in the
// host's byte order or, `swapped_magic`, in the other; then the header descriptor stands at
// `offset`. Else 0, also when the word cannot be read.
std::int32_t img_probe_magic(img_desc *desc, std::uint32_t magic, std::uint32_t swapped_magic,
                             std::int32_t offset);

// The type_op of types that have no operation of their own: does nothing and returns -1.
std::int32_t img_no_type_op();

#endif
