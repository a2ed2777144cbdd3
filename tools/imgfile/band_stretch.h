// How often each value occurs, and the stretch to bytes that follows from it.
#ifndef TOOL_BAND_STRETCH_H
#define TOOL_BAND_STRETCH_H

#include "image.h"

#include <cstdint>
#include <vector>

// How the values of one band are stretched to bytes, as the library does it with a window: the
// lowest half and the highest one of a hundred samples are cut off, 0 is not counted.
class stretch {
public:
    explicit stretch(std::int32_t nbits);
    // The highest 8 bits as they are, without a cut.
    static stretch straight(std::int32_t nbits);
    // Counts every fourth sample of each line; `first` is the place of the samples in their line.
    void count(const block &samples, std::int32_t band, std::int32_t first);
    void finish();  // after the last sample was counted

    // Of a value; those that are more than the bits allow map as the highest.
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

// Stretches all of a block to one byte per sample; one stretch for each of its bands.
block stretched(const block &from, const std::vector<stretch> &by);

// Measures the stretches of a window.
std::vector<stretch> measure_stretches(image_reader &from, const window &part,
                                       const band_list &bands);

// Counts the samples that are more than `highest`.
std::int64_t count_beyond(const block &samples, std::int32_t highest);

#endif
