// The stretch of a band's samples to bytes.
#ifndef TOOL_BAND_STRETCH_H
#define TOOL_BAND_STRETCH_H

#include "codecs/image.h"

#include <cstdint>
#include <vector>

// Maps the values of one band to bytes, as the library does for a window. Zeros are not counted;
// the lowest 0.5 % and the highest 1 % of the other samples are clipped.
class band_stretch {
public:
    explicit band_stretch(std::int32_t nbits);
    // A mapping to the highest 8 bits, without clipping.
    static band_stretch straight(std::int32_t nbits);
    // Counts every fourth sample of each line; the samples of the block begin at sample
    // `first_samp` of their lines.
    void count(const block &samples, std::int32_t band, std::int32_t first_samp);
    // Computes the mapping, after the last sample was counted.
    void finish();

    // Returns the byte of a value. Values beyond the stated bits map as the highest value.
    std::uint8_t operator()(std::uint32_t value) const
    {
        return m_table[value < m_table.size() ? value : m_table.size() - 1];
    }
    const std::vector<std::uint8_t> &table() const { return m_table; }

private:
    std::int32_t m_nbits;
    std::vector<std::uint32_t> m_counts;
    std::vector<std::uint8_t> m_table;
};

// Returns the samples of a block stretched to one byte, with one stretch for each band.
block stretched(const block &samples, const std::vector<band_stretch> &stretches);

// Reads a window and returns the stretch of each of its bands.
std::vector<band_stretch> measure_stretches(image_reader &reader, const window &part,
                                            const band_list &bands);

// Counts the samples above `highest`.
std::int64_t count_beyond(const block &samples, std::int32_t highest);

#endif
