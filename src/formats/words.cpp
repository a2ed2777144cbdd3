// Reversing the bytes of words, in place or on the way out of a block. Assumes nothing of the
// host's byte order. Read words.h first.
#include "formats/words.h"

std::uint32_t img_swap32(const std::uint8_t *bytes)
{
    std::uint32_t word;
    std::memcpy(&word, bytes, sizeof word);
    return img_swapped_word(word);
}

void img_swap_words(std::span<std::uint8_t> block, std::size_t first, std::size_t end)
{
    for (std::size_t offset = first; offset < end; offset += sizeof(std::uint32_t))
        img_put_word(block, offset, img_swapped_word(img_get_word(block, offset)));
}
