// Lending the bytes of a mapped file. The descriptor decides what the file holds: behind its end
// the last page of a mapping goes on with zero bytes, and pages that are truncated and written
// again hold zeros in between. So the file's length and the time of its last change are compared
// before and after each use. Read file_mapping_posix.h, then bus_error_guard_posix.h.
#include "io/file_mapping_posix.h"

#include "io/bus_error_guard_posix.h"

#include <algorithm>
#include <array>
#include <bit>
#include <ctime>

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

bool img_file_mapping::is_same_file(const status &first, const status &second)
{
    return first.device == second.device && first.inode == second.inode;
}

// Returns false when the system does not answer.
bool img_file_mapping::update_status(int fd)
{
    struct stat answer;
    if (::fstat(fd, &answer) == -1) return false;
    const status now{.length = answer.st_size,
                     .change = time_of(answer.st_ctim),
                     .device = answer.st_dev,
                     .inode = answer.st_ino,
                     .has_holes = answer.st_blocks * STATUS_BLOCK < answer.st_size};
    // Timestamps of a coarse clock are at least a millisecond apart.
    const img_file_time since = now.change - m_last.change;
    if (!is_same_file(now, m_last))
        m_has_fine_timestamps = false;
    else if (since > 0 && since < MILLISECOND / 2)
        m_has_fine_timestamps = true;
    m_last = now;
    return true;
}

// True when a later change would get a later timestamp. A coarse clock ticks at least every 10
// milliseconds, or counts whole seconds: it must have ticked since the last change.
bool img_file_mapping::would_show_changes() const
{
    if (m_has_fine_timestamps) return true;
    std::timespec now;
    ::clock_gettime(CLOCK_REALTIME, &now);
    const bool counts_seconds = m_last.change % SECOND == 0;
    return m_last.change < time_of(now) - (counts_seconds ? 2 * SECOND : 20 * MILLISECOND);
}

// Makes the mapping reach `end`, which lies in the file. It is made larger than the file, so that a
// file that grows is not mapped again for each of its lines.
bool img_file_mapping::map_up_to(int fd, std::int64_t end)
{
    if (end <= m_size && is_same_file(m_mapped, m_last)) return true;
    drop();
    const std::uint32_t file_system = local_file_system(fd);
    if (file_system == 0) return false;
    constexpr std::uint64_t smallest = 1U << 16U;
    constexpr std::uint64_t largest = 1U << 31U;
    const std::uint64_t size =
        std::bit_ceil(std::clamp(static_cast<std::uint64_t>(m_last.length), smallest, largest));
    void *const bytes = ::mmap(nullptr, size, PROT_READ, MAP_SHARED, fd, 0);
    if (bytes == MAP_FAILED) return false;
    m_bytes = static_cast<std::uint8_t *>(bytes);
    m_size = static_cast<std::int64_t>(size);
    m_mapped = m_last;
    m_is_in_memory = file_system == TMPFS;
    return true;
}

void img_file_mapping::drop()
{
    if (m_bytes != nullptr) ::munmap(m_bytes, static_cast<std::size_t>(m_size));
    m_bytes = nullptr;
    m_size = 0;
}

bool img_file_mapping::lend(int fd, std::int32_t offset, std::int32_t count, img_io_use_fn use,
                            void *arg)
{
    const std::int64_t end = std::int64_t{offset} + count;
    if (m_cannot_map || offset < 0 || count < 1 || !update_status(fd) || end > m_last.length ||
        !would_show_changes())
        return false;
    m_cannot_map = !map_up_to(fd, end);
    // Reading a hole of a file in memory would take memory for it.
    if (m_cannot_map || (m_is_in_memory && m_last.has_holes)) return false;

    const status before = m_last;
    if (!img_use_guarded(m_bytes, static_cast<std::size_t>(m_size), offset, use, arg)) {
        drop();
        return false;
    }
    return update_status(fd) && is_same_file(m_last, before) && m_last.change == before.change &&
           m_last.length == before.length;
}
