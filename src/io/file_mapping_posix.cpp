// Lending the bytes of a mapped file. The descriptor decides what the file holds: behind its end
// the last page of a mapping goes on with zero bytes, and pages that are truncated and written
// again hold zeros in between. So the file's length and the time of its last change must be the
// same before and after each use. Where the result of a failed loan is discarded, the status of an
// earlier loan serves as the one before. Read file_mapping_posix.h, then bus_error_guard_posix.h.
#include "io/file_mapping_posix.h"

#include "base/count.h"

#include <algorithm>
#include <bit>
#include <ctime>
#include <utility>

#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <unistd.h>

namespace {

constexpr img_file_time MILLISECOND = 1'000'000;
constexpr img_file_time SECOND = 1'000 * MILLISECOND;
constexpr std::int64_t STATUS_BLOCK = 512;  // unit of st_blocks, in bytes

img_file_time time_of(const std::timespec &time)
{
    return img_file_time{time.tv_sec} * SECOND + time.tv_nsec;
}

constexpr std::uint32_t TMPFS = 0x01021994;

// Returns the magic number of a local file system, 0 for any other. Local: timestamps are of this
// machine's clock, and a descriptor and its mapping always show the same file. An overlay is
// not local: a descriptor follows its file into the upper layer, the mapping does not.
std::uint32_t local_file_system(int fd)
{
    constexpr std::array<std::uint32_t, 9> known{0xEF53,      // ext2, ext3, ext4
                                                 0x58465342,  // XFS
                                                 0x9123683E,  // Btrfs
                                                 0xF2F52010,  // F2FS
                                                 0xCA451A4E,  // bcachefs
                                                 0x2FC12FC1,  // ZFS
                                                 0x73717368,  // squashfs
                                                 0x9660,      // ISO 9660
                                                 TMPFS};
    struct statfs system = {};
    ::fstatfs(fd, &system);
    const auto magic = static_cast<std::uint32_t>(system.f_type);
    return std::ranges::count(known, magic) != 0 ? magic : 0;
}

}  // namespace

// Returns false when the system does not answer. Notes how fine the timestamps are.
bool img_file_mapping::ask_for_status(int fd, status *now)
{
    struct stat answer;
    if (!m_was_asked) m_was_asked = true;  // a write that other readers must not see each time
    if (::fstat(fd, &answer) == -1) return false;
    *now = {.change = time_of(answer.st_ctim),
            .length = answer.st_size,
            .has_holes = answer.st_blocks * STATUS_BLOCK < answer.st_size,
            .device = answer.st_dev,
            .inode = answer.st_ino};
    const img_file_time last = m_last_change.load(std::memory_order_relaxed);
    if (now->change == last) return true;
    // Timestamps of a coarse clock are at least a millisecond apart.
    const img_file_time since = now->change - last;
    if (last != 0 && since > 0 && since < MILLISECOND / 2) m_has_fine_timestamps = true;
    m_last_change.store(now->change, std::memory_order_relaxed);
    return true;
}

// True when a later change would get a later timestamp. A coarse clock ticks at least every 10
// milliseconds, or counts whole seconds: it must have ticked since the last change.
bool img_file_mapping::would_show_changes(img_file_time change) const
{
    if (m_has_fine_timestamps) return true;
    std::timespec now;
    ::clock_gettime(CLOCK_REALTIME, &now);
    const bool counts_seconds = change % SECOND == 0;
    return change < time_of(now) - (counts_seconds ? 2 * SECOND : 20 * MILLISECOND);
}

// Asks for a status that every later change alters. Returns false when the last change is too
// recent.
bool img_file_mapping::settled_status(int fd, status *found)
{
    if (!ask_for_status(fd, found)) return false;
    if (found->change == m_settled_change.load(std::memory_order_acquire) &&
        found->length == m_settled_length)
        return true;
    if (!would_show_changes(found->change)) return false;
    m_settled_has_holes = found->has_holes;
    m_settled_length = found->length;
    m_settled_change.store(found->change, std::memory_order_release);
    return true;
}

// False when the host has put another file under the descriptor.
bool img_file_mapping::is_mapped_file(const status &found) const
{
    return std::pair(found.device, found.inode) == std::pair(m_device.load(), m_inode.load());
}

// Returns a mapping that reaches `end`, which lies in the file, and is whole; null when the file
// cannot be mapped.
img_file_mapping::view *img_file_mapping::view_up_to(int fd, std::int64_t end, const status &now)
{
    const std::int32_t index = m_view.load(std::memory_order_acquire);
    if (index != NO_VIEW) {
        view &last = m_views[img_count(index)];
        if (end <= static_cast<std::int64_t>(last.size) && last.cuts == last.whole_at) return &last;
    }
    const img_mutex_lock lock(m_mutex);
    view *const mapped = map_up_to(fd, end, now);
    if (mapped == nullptr) m_cannot_map = true;
    return mapped;
}

// The same, for one thread at a time. A mapping is made larger than the file, so that a file that
// grows is not mapped again for each of its lines. One that was cut is mapped again in its place:
// other threads may be reading it.
img_file_mapping::view *img_file_mapping::map_up_to(int fd, std::int64_t end, const status &now)
{
    std::int32_t index = m_view.load();
    if (index == NO_VIEW) {
        m_device = now.device;
        m_inode = now.inode;
    }
    if (index == NO_VIEW || static_cast<std::int64_t>(m_views[img_count(index)].size) < end) {
        const std::uint32_t file_system = local_file_system(fd);
        if (file_system == 0) return nullptr;
        m_is_in_memory = file_system == TMPFS;
        const auto wanted = static_cast<std::uint64_t>(std::max(end, now.length));
        index =
            std::clamp(static_cast<std::int32_t>(std::bit_width(wanted - 1)), SMALLEST, LARGEST) -
            SMALLEST;
    }
    view &chosen = m_views[img_count(index)];
    const bool is_new = chosen.begin == nullptr;
    std::uint32_t cuts = chosen.cuts;
    if (!is_new && cuts == chosen.whole_at) return &chosen;
    const std::size_t size = std::size_t{1} << static_cast<std::uint32_t>(SMALLEST + index);
    if (!is_new) {
        // unreachable: a mapping that replaces another one finds room
        if (!img_map_again(&chosen, fd, &cuts)) return nullptr;
        chosen.whole_at = cuts;
        return &chosen;
    }
    void *const bytes = ::mmap(nullptr, size, PROT_READ, MAP_SHARED, fd, 0);
    if (bytes == MAP_FAILED) return nullptr;
    chosen.whole_at = cuts;
    chosen.begin = static_cast<std::uint8_t *>(bytes);
    chosen.size = size;
    img_guard_mapping(&chosen);
    m_view.store(index, std::memory_order_release);
    return &chosen;
}

void img_file_mapping::drop()
{
    if (!m_was_asked) return;
    for (view &each : m_views) {
        if (each.begin == nullptr) continue;
        img_unguard_mapping(&each);
        ::munmap(each.begin, each.size);
        each.begin = nullptr;
        each.size = 0;
    }
    m_view = NO_VIEW;
    m_was_asked = false;
    m_settled_change = m_last_change = 0;
    m_has_fine_timestamps = m_cannot_map = false;
}

// Lends bytes if the file has the status `before`, seen earlier, until `use` has returned. False as
// for lend().
bool img_file_mapping::lend_since(const status &before, int fd, std::int32_t offset,
                                  std::int64_t end, img_io_use_fn use, void *arg)
{
    if (end > before.length) return false;
    const view *const mapped = view_up_to(fd, end, before);
    // Reading a hole of a file in memory would take memory for it.
    if (mapped == nullptr || !is_mapped_file(before) || (m_is_in_memory && before.has_holes))
        return false;
    status after;
    if (img_use_guarded(*mapped, mapped->whole_at, mapped->begin + offset, use, arg) &&
        ask_for_status(fd, &after) && is_mapped_file(after) && after.change == before.change &&
        after.length == before.length)
        return true;
    forget_status();
    return false;
}

bool img_file_mapping::lend(int fd, std::int32_t offset, std::int32_t count, bool discards,
                            img_io_use_fn use, void *arg)
{
    const std::int64_t end = std::int64_t{offset} + count;
    if (m_cannot_map || offset < 0 || count < 1) return false;
    // The identity of the file is known once it is mapped. A refusal may be out of date, too.
    if (discards && m_view.load(std::memory_order_acquire) != NO_VIEW) {
        const status known{.change = m_settled_change.load(std::memory_order_acquire),
                           .length = m_settled_length,
                           .has_holes = m_settled_has_holes,
                           .device = m_device,
                           .inode = m_inode};
        if (known.change != 0 && lend_since(known, fd, offset, end, use, arg)) return true;
    }
    status before;
    return settled_status(fd, &before) && lend_since(before, fd, offset, end, use, arg);
}
