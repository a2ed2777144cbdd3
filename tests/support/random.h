// Random numbers that are the same in every run.
#ifndef IMG_TEST_RANDOM_H
#define IMG_TEST_RANDOM_H

#include <cstdint>
#include <random>
#include <utility>

class random_numbers {
public:
    explicit random_numbers(std::uint32_t seed) : m_engine(seed) {}
    // Returns a number from 0 to `count` - 1.
    std::uint32_t below(std::uint32_t count)
    {
        return static_cast<std::uint32_t>(m_engine() % count);
    }
    // Returns a number from `first` to `last`.
    std::int32_t within(std::int32_t first, std::int32_t last)
    {
        return first +
               static_cast<std::int32_t>(below(static_cast<std::uint32_t>(last - first + 1)));
    }

private:
    std::mt19937 m_engine;
};

// The arguments of one of the 7^n calls that n arguments allow which lie at an edge of their range,
// just beyond it, or nowhere near. Consecutive calls have little in common.
class extreme_arguments {
public:
    extreme_arguments(int call, int calls) : m_which(call * 10007 % calls) {}
    std::int32_t next(std::int32_t edge)
    {
        const std::int32_t extremes[] = {INT32_MIN, -1, 0, 1, edge, edge + 1, INT32_MAX};
        return extremes[std::exchange(m_which, m_which / 7) % 7];
    }

private:
    int m_which;
};

#endif
