// Files as they lie in memory.
#ifndef IMG_LEND_POSIX_H
#define IMG_LEND_POSIX_H

#include "io/io_method.h"

#include <cstdint>

// Nanoseconds since 1970.
using img_file_time = std::int64_t;

// A shared, read-only mapping of a file from its start.
class img_file_mapping {
public:
    // Calls `use` with the bytes [offset, offset + count) of the file. Returns 0 when the file had
    // them until `use` came back, else -1. Also -1 while others than this process change the file.
    std::int32_t lend(int fd, std::int32_t offset, std::int32_t count, img_io_use_fn use,
                      void *arg);
    // Tells that this process has changed the file.
    void note_change() { m_changed = true; }
    void drop();

private:
    bool covers(int fd, std::int64_t end);

    std::int64_t m_length = 0;       // of the file when it was last looked at
    bool m_changed = false;          // by this process, and `m_own_change` is not up to date
    img_file_time m_own_change = 0;  // when this process changed it last

    std::uint8_t *m_bytes = nullptr;  // null: not mapped
    std::int64_t m_size = 0;          // the mapping may reach beyond the end of the file
};

#endif
