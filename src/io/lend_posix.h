// Files as they lie in memory.
#ifndef IMG_LEND_POSIX_H
#define IMG_LEND_POSIX_H

#include "io/io_method.h"

#include <cstdint>

#include <sys/types.h>

// Nanoseconds since 1970.
using img_file_time = std::int64_t;

// A shared, read-only mapping of a file from its start.
class img_file_mapping {
public:
    // Calls `use` with the bytes [offset, offset + count) of the file. Returns 0 when the file had
    // them until `use` came back, else -1. Also -1, before a use, where it could not be known.
    std::int32_t lend(int fd, std::int32_t offset, std::int32_t count, img_io_use_fn use,
                      void *arg);
    void drop();

private:
    // What a descriptor says of its file.
    struct state {
        std::int64_t length;
        img_file_time change;
        dev_t device;
        ino_t inode;
        bool has_holes;
    };

    static bool is_same_file(const state &a, const state &b);
    bool look_at(int fd);
    bool shows_changes() const;
    bool reach(int fd, std::int64_t end);

    state m_seen = {};               // when it was last looked at
    bool m_has_fine_stamps = false;  // each change after a look shows
    bool m_unfit = false;            // it cannot be mapped, or is not to be

    std::uint8_t *m_bytes = nullptr;  // null: not mapped
    std::int64_t m_size = 0;          // the mapping may reach beyond the end of the file
    state m_mapped = {};              // the file when it was mapped
    bool m_is_in_memory = false;      // there is no disk under it
};

#endif
