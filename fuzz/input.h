// A fuzz input, taken apart into the numbers that calls are made of. Behind its end all bytes are
// 0.
#ifndef IMG_FUZZ_INPUT_H
#define IMG_FUZZ_INPUT_H

#include <algorithm>
#include <array>
#include <cstdint>
#include <span>

class fuzz_input {
public:
    explicit fuzz_input(std::span<const std::uint8_t> content) : m_left(content) {}

    bool ended() const { return m_left.empty(); }
    std::int32_t byte()
    {
        if (ended()) return 0;
        const std::int32_t first = m_left.front();
        m_left = m_left.subspan(1);
        return first;
    }
    // Returns a number from 0 to `count` - 1; `count` is 256 at most.
    std::int32_t below(std::int32_t count) { return byte() % count; }
    // Returns any number, mostly a small one or one at which sizes overflow.
    std::int32_t number()
    {
        static constexpr std::array<std::int32_t, 16> edges{
            INT32_MIN, -65536,  -68,     255,     32768,   46340,      46341,     65535,
            65536,     0x10008, 1 << 20, 1 << 24, 1 << 30, 0x40000001, INT32_MAX, INT32_MAX - 1};
        const std::int32_t first = byte();
        if (first < 160) return first - 16;
        if (first < 240) return edges[static_cast<std::size_t>(first) % edges.size()];
        std::uint32_t word = 0;
        for (int i = 0; i < 4; ++i) word = word << 8U | static_cast<std::uint32_t>(byte());
        return static_cast<std::int32_t>(word);
    }
    // Returns mostly a position in 0..`extent` - 1 or one about its ends, else any number.
    std::int32_t near(std::int32_t extent)
    {
        const std::int32_t first = byte();
        if (first >= 240) return number();
        if (first < 160) return first % std::max(extent, 1);
        const std::int64_t end = first < 200 ? extent : 0;
        return static_cast<std::int32_t>(std::min<std::int64_t>(end + first % 5 - 2, INT32_MAX));
    }

private:
    std::span<const std::uint8_t> m_left;
};

#endif
