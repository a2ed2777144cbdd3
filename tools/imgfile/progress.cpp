// One line on the terminal, rewritten ten times a second and removed at the end. Read progress.h
// first.
#include "progress.h"

#include "notes.h"

#include <cstdio>

#include <unistd.h>

progress::progress(std::int64_t total_bytes)
    : m_total(total_bytes), m_wanted(!quiet && ::isatty(STDERR_FILENO) == 1)
{
}

progress::~progress()
{
    if (m_is_shown) std::fputs("\r\033[K", stderr);
}

void progress::add(std::int64_t bytes)
{
    m_done += bytes;
    const auto now = clock::now();
    if (!m_wanted || m_done == 0 || now - m_start < std::chrono::milliseconds(500) ||
        (m_is_shown && now - m_shown < std::chrono::milliseconds(100)))
        return;
    m_shown = now;
    m_is_shown = true;
    const double taken = std::chrono::duration<double>(now - m_start).count();
    const auto done = static_cast<double>(m_done);
    const auto total = static_cast<double>(m_total);
    std::fprintf(stderr, "\r\033[K%3.0f %%  %.0f MB/s  %.0f s left", 100 * done / total,
                 done / taken / 1e6, taken / done * (total - done));
}
