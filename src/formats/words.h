// The 32-bit words of header blocks. A block is bytes and named offsets; its words are read and
// written one by one, so that alignment and byte order of the host do not matter.
#ifndef IMG_WORDS_H
#define IMG_WORDS_H

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>

// Files are written big-endian on every host.
inline constexpr bool IMG_WRITES_SWAPPED = std::endian::native == std::endian::little;

// Returns the word with its four bytes reversed.
constexpr std::uint32_t img_swapped_word(std::uint32_t word)
{
    return word << 24U | (word & 0xFF00U) << 8U | (word >> 8U & 0xFF00U) | word >> 24U;
}

// Returns the four bytes at `bytes` as a word of the host's order with its bytes reversed.
std::uint32_t img_swap32(const std::uint8_t *bytes);

inline std::uint32_t img_get_word(std::span<const std::uint8_t> block, std::size_t offset)
{
    std::uint32_t word;
    std::memcpy(&word, block.subspan(offset, sizeof word).data(), sizeof word);
    return word;
}

inline void img_put_word(std::span<std::uint8_t> block, std::size_t offset, std::uint32_t word)
{
    std::memcpy(block.subspan(offset, sizeof word).data(), &word, sizeof word);
}

// The words are signed 32-bit numbers to those who use them.
inline std::int32_t img_get_int(std::span<const std::uint8_t> block, std::size_t offset)
{
    return static_cast<std::int32_t>(img_get_word(block, offset));
}

inline void img_put_int(std::span<std::uint8_t> block, std::size_t offset, std::int32_t value)
{
    img_put_word(block, offset, static_cast<std::uint32_t>(value));
}

// Reverses the bytes of each word from offset `first` to `end`.
void img_swap_words(std::span<std::uint8_t> block, std::size_t first, std::size_t end);

#endif
