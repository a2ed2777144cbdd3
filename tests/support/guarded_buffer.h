// Memory at whose ends every access is fatal.
#ifndef IMG_TEST_GUARDED_BUFFER_H
#define IMG_TEST_GUARDED_BUFFER_H

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <span>

#include <sys/mman.h>
#include <unistd.h>

class guarded_buffer {
public:
    guarded_buffer()
        : m_page(static_cast<std::size_t>(::sysconf(_SC_PAGESIZE))),
          m_pages(::mmap(nullptr, 3 * m_page, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0))
    {
        if (m_pages == MAP_FAILED ||
            ::mprotect(bytes().data(), m_page, PROT_READ | PROT_WRITE) != 0)
            std::abort();
    }
    ~guarded_buffer() { ::munmap(m_pages, 3 * m_page); }
    guarded_buffer(const guarded_buffer &) = delete;
    guarded_buffer &operator=(const guarded_buffer &) = delete;
    // One page, between two that cannot be accessed.
    std::span<std::uint8_t> bytes() const
    {
        return {static_cast<std::uint8_t *>(m_pages) + m_page, m_page};
    }

private:
    std::size_t m_page;
    void *m_pages;
};

#endif
