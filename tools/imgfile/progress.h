// The progress of work that takes longer than half a second.
#ifndef TOOL_PROGRESS_H
#define TOOL_PROGRESS_H

#include <chrono>
#include <cstdint>

// Shows on standard error, if that is a terminal, how much of the work is done.
class progress {
public:
    explicit progress(std::int64_t total_bytes);
    ~progress();
    progress(const progress &) = delete;
    progress &operator=(const progress &) = delete;
    void add(std::int64_t bytes);

private:
    using clock = std::chrono::steady_clock;
    clock::time_point m_start = clock::now(), m_shown = m_start;
    std::int64_t m_done = 0, m_total;
    bool m_wanted, m_is_shown = false;
};

#endif
