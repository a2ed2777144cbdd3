// Through an image of any size, one piece after the other.
#ifndef TOOL_WALK_H
#define TOOL_WALK_H

#include "image.h"

#include <chrono>
#include <functional>

inline bool quiet = false;  // no progress, no notes

// Tells on standard error, if that is a terminal, how far a longer work is.
class progress {
public:
    explicit progress(std::int64_t bytes_in_all);
    ~progress();
    progress(const progress &) = delete;
    progress &operator=(const progress &) = delete;
    void add(std::int64_t bytes);

private:
    using clock = std::chrono::steady_clock;
    clock::time_point m_start = clock::now(), m_shown = m_start;
    std::int64_t m_done = 0, m_all;
    bool m_wanted, m_is_shown = false;
};

// Reads a window piece by piece and calls `use` with the place of each piece in the window and its
// samples: from the top on, from left to right, and as the reader and what the samples go to need
// it. Takes some 8 MiB; more only for longer lines that must be whole, which are refused from
// 64 MiB on.
void walk(image_reader &from, const window &part, const band_list &bands, const access_needs &to,
          const std::function<void(const window &place, const block &samples)> &use);

inline window whole(const shape &of)
{
    return {0, 0, of.nlines, of.nsamps};
}

// Prints a note about a file, unless notes are not wanted.
void note(const std::string &file, const std::string &what);

// "1,234,567"
std::string grouped(std::int64_t number);

#endif
