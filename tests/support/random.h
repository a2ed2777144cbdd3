// Random numbers that are the same in every run.
#ifndef IMG_TEST_RANDOM_H
#define IMG_TEST_RANDOM_H

#include <cstdint>
#include <random>

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

#endif
