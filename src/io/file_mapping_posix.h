// A file's bytes where they lie in memory: a mapping that is kept while the file is open.
#ifndef IMG_FILE_MAPPING_POSIX_H
#define IMG_FILE_MAPPING_POSIX_H

#include "io/io_method.h"

#include <cstdint>

#include <sys/types.h>

// Nanoseconds since 1970.
using img_file_time = std::int64_t;

// A shared, read-only mapping of a file from its start.
class img_file_mapping {
public:
    // Calls `use` with the bytes [offset, offset + count) of the file open on `fd`. Returns true
    // when the file had these bytes until `use` returned. False: the bytes cannot be lent, or were
    // not those of the file; `use` may have been called, and its result must be discarded.
    bool lend(int fd, std::int32_t offset, std::int32_t count, img_io_use_fn use, void *arg);
    // Ends the mapping. The next loan maps the file again.
    void drop();

private:
    // What the system says of a file.
    struct status {
        std::int64_t length;
        img_file_time change;
        dev_t device;
        ino_t inode;
        bool has_holes;
    };

    static bool is_same_file(const status &first, const status &second);
    bool update_status(int fd);
    bool would_show_changes() const;
    bool map_up_to(int fd, std::int64_t end);

    status m_last = {};                  // as last asked for
    bool m_has_fine_timestamps = false;  // each change after the last status shows
    bool m_cannot_map = false;           // a mapping was refused; do not try again

    std::uint8_t *m_bytes = nullptr;  // null: not mapped
    std::int64_t m_size = 0;          // the mapping may reach beyond the end of the file
    status m_mapped = {};             // of the file when it was mapped
    bool m_is_in_memory = false;      // the file system keeps its files in memory
};

#endif
