// A file's bytes where they lie in memory: a mapping that is kept while the file is open.
#ifndef IMG_FILE_MAPPING_POSIX_H
#define IMG_FILE_MAPPING_POSIX_H

#include "base/shared_lock.h"
#include "io/bus_error_guard_posix.h"
#include "io/io_method.h"

#include <array>
#include <atomic>
#include <cstdint>

#include <sys/types.h>

// Nanoseconds since 1970.
using img_file_time = std::int64_t;

// Shared, read-only mappings of a file from its start. Lent to any number of threads at the same
// time; the readers of a file that does not change write nothing that other readers touch.
class img_file_mapping {
public:
    // Calls `use` with the bytes [offset, offset + count) of the file open on `fd`. Returns true
    // when the file had these bytes until `use` returned. False: the bytes cannot be lent, or were
    // not those of the file; `use` may have been called, and its result must be discarded.
    // `discards` false: `use` is called once at most, and not where the file is known to have
    // changed before.
    bool lend(int fd, std::int32_t offset, std::int32_t count, bool discards, img_io_use_fn use,
              void *arg);
    // The file is about to be changed.
    void forget_status() { m_settled_change = 0; }
    // Ends the mappings, alone. The next loan maps the file again.
    void drop();

private:
    // What the system says of a file.
    struct status {
        img_file_time change;
        std::int64_t length;
        bool has_holes;
        dev_t device;
        ino_t inode;
    };
    // A mapping. One that becomes too short for its file stays for its readers.
    struct view : img_guarded_mapping {
        std::atomic<std::uint32_t> whole_at = 0;  // the count of cuts at which it was mapped
    };

    bool ask_for_status(int fd, status *now);
    bool settled_status(int fd, status *found);
    bool would_show_changes(img_file_time change) const;
    bool is_mapped_file(const status &found) const;
    bool lend_since(const status &before, int fd, std::int32_t offset, std::int64_t end,
                    img_io_use_fn use, void *arg);
    view *view_up_to(int fd, std::int64_t end, const status &now);
    view *map_up_to(int fd, std::int64_t end, const status &now);

    // A status that is old enough: each later change would change it. Stored last to first.
    std::atomic<img_file_time> m_settled_change = 0;  // 0: none
    std::atomic<std::int64_t> m_settled_length = 0;
    std::atomic<bool> m_settled_has_holes = false;

    std::atomic<img_file_time> m_last_change = 0;     // as last seen; 0: not yet
    std::atomic<bool> m_has_fine_timestamps = false;  // each change after the last status shows
    std::atomic<bool> m_was_asked = false;
    std::atomic<bool> m_cannot_map = false;    // a mapping was refused; do not try again
    std::atomic<bool> m_is_in_memory = false;  // the file system keeps its files in memory

    img_mutex m_mutex;  // for those who map
    std::atomic<std::int32_t> m_view = NO_VIEW;
    std::atomic<dev_t> m_device = 0;  // of the mapped file
    std::atomic<ino_t> m_inode = 0;
    // By size: the smallest has 64 KiB, each other one twice as much as the one before.
    static constexpr std::int32_t NO_VIEW = -1;
    static constexpr std::int32_t SMALLEST = 16, LARGEST = 31;
    std::array<view, LARGEST - SMALLEST + 1> m_views;
};

#endif
