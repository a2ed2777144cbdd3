#include "io/lend_posix.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <bit>
#include <csignal>
#include <ctime>

#include <poll.h>
#include <pthread.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <unistd.h>

namespace {

// The mapping whose bytes are in use, or were last, and by whom.
struct {
    std::atomic<pthread_t> thread;  // 0: nobody uses it
    // For that thread alone:
    std::uint8_t *begin;
    std::size_t size;
    sigset_t mask;                         // which signals the host blocks
    volatile std::sig_atomic_t torn;       // 1: some of the bytes were not there
    volatile std::sig_atomic_t held_back;  // 1: a signal came that is to come later
    // For all threads:
    struct sigaction found;        // what the host does about bus errors
    std::atomic<bool> knows_host;  // false: `found` is about to be filled
} in_use;
static_assert(decltype(in_use.thread)::is_always_lock_free, "a signal handler takes no locks");

bool is_sent_by_a_program(const siginfo_t *info)
{
    return info->si_code <= 0;
}

bool is_in_use_here()
{
    return in_use.thread.load(std::memory_order_relaxed) == ::pthread_self();
}

// True when an error is a read of the mapping by the thread that uses it.
bool is_torn(const siginfo_t *info)
{
    if (is_sent_by_a_program(info) || !is_in_use_here()) return false;
    const auto address = reinterpret_cast<std::uintptr_t>(info->si_addr);
    const auto begin = reinterpret_cast<std::uintptr_t>(in_use.begin);
    return address >= begin && address - begin < in_use.size;
}

bool knows_host()
{
    return in_use.knows_host.load(std::memory_order_acquire);
}

// True for a signal that finds this thread where it must not leave it to the host yet.
bool is_too_early(const siginfo_t *info)
{
    return is_sent_by_a_program(info) && is_in_use_here() &&
           (!knows_host() || ::sigismember(&in_use.mask, SIGBUS) == 1);
}

// Does what would have happened without this library.
void leave_to_host(int signal, siginfo_t *info, void *context)
{
    while (!knows_host()) ::poll(nullptr, 0, 1);  // another thread is about to
    const struct sigaction host = in_use.found;
    const bool sent_by_a_program = is_sent_by_a_program(info);
    if ((static_cast<unsigned>(host.sa_flags) & SA_RESETHAND) != 0) {
        in_use.found.sa_handler = SIG_DFL;
        in_use.found.sa_flags = 0;
    }
    // uncounted: a process in which the processor's error is ignored ends, as in the default case
    if (host.sa_handler == SIG_IGN && sent_by_a_program) return;
    // uncounted: the same
    if (host.sa_handler == SIG_DFL || host.sa_handler == SIG_IGN) {
        ::sigaction(signal, &host, nullptr);
        // uncounted: the same
        if (sent_by_a_program) ::raise(signal);  // the processor's comes again by itself
    } else if ((host.sa_flags & SA_SIGINFO) != 0) {
        host.sa_sigaction(signal, info, context);
    } else {
        host.sa_handler(signal);
    }
}

// Bytes that another program cuts off the file, or that the disk does not give, raise a bus error
// where they are read. Zero bytes take the place of the whole mapping then, so that the reading
// goes on and comes to its end, where it is told that it was for nothing. All other bus errors
// belong to the host.
void on_bus_error(int signal, siginfo_t *info, void *context)
{
    if (!is_torn(info)) {
        if (is_too_early(info))
            in_use.held_back = 1;
        else
            leave_to_host(signal, info, context);
        return;
    }
    // Of a host that locks its memory, what is mapped here counts as more than what it replaces.
    ::munlock(in_use.begin, in_use.size);
    const void *const zeros = ::mmap(in_use.begin, in_use.size, PROT_READ,
                                     MAP_PRIVATE | MAP_ANONYMOUS | MAP_FIXED, -1, 0);
    in_use.torn = 1;
    // unreachable: what takes the place of a mapping finds room
    if (zeros == MAP_FAILED) leave_to_host(signal, info, context);
}

bool is_ours(const struct sigaction &action)
{
    return (action.sa_flags & SA_SIGINFO) != 0 && action.sa_sigaction == on_bus_error;
}

// Takes bus errors from the host while it lives.
class bus_error_guard {
public:
    bus_error_guard()
    {
        struct sigaction ours;
        ours.sa_sigaction = on_bus_error;
        ours.sa_flags = SA_SIGINFO | SA_NODEFER | SA_ONSTACK | SA_RESTART;
        ::sigemptyset(&ours.sa_mask);
        ::sigemptyset(&in_use.mask);
        in_use.held_back = 0;
        in_use.knows_host.store(false, std::memory_order_release);
        struct sigaction found;
        ::sigaction(SIGBUS, &ours, &found);
        // Ours is found where a handler of the host has jumped out of an earlier use.
        if (!is_ours(found)) in_use.found = found;
        in_use.knows_host.store(true, std::memory_order_release);

        sigset_t bus_errors;  // a blocked one ends the process
        ::sigemptyset(&bus_errors);
        ::sigaddset(&bus_errors, SIGBUS);
        ::pthread_sigmask(SIG_UNBLOCK, &bus_errors, &in_use.mask);
    }
    ~bus_error_guard()
    {
        const sigset_t mask = in_use.mask;
        if (::sigismember(&mask, SIGBUS) != 0) ::pthread_sigmask(SIG_SETMASK, &mask, nullptr);
        if (in_use.held_back != 0) ::raise(SIGBUS);  // the host finds it pending again
        struct sigaction last;
        ::sigaction(SIGBUS, &in_use.found, &last);
        // What another thread has installed meanwhile is to stay.
        if (!is_ours(last)) ::sigaction(SIGBUS, &last, nullptr);
    }
    bus_error_guard(const bus_error_guard &) = delete;
    bus_error_guard &operator=(const bus_error_guard &) = delete;
};

// Calls `use` while bus errors in the mapping are caught. Returns false when there was one.
bool use_guarded(std::uint8_t *mapping, std::size_t size, std::int32_t offset, img_io_use_fn use,
                 void *arg)
{
    in_use.begin = mapping;
    in_use.size = size;
    in_use.torn = 0;
    in_use.thread.store(::pthread_self(), std::memory_order_relaxed);
    {
        const bus_error_guard guard;
        use(arg, mapping + offset);
    }
    in_use.thread.store(0, std::memory_order_relaxed);
    return in_use.torn == 0;
}

constexpr img_file_time SECOND = 1'000'000'000;

img_file_time time_of(const std::timespec &time)
{
    return img_file_time{time.tv_sec} * SECOND + time.tv_nsec;
}

constexpr std::uint32_t TMPFS = 0x01021994;

// Returns the kind of a file system whose stamps are of this machine's clock, and where a
// descriptor and its mapping are of the same file for good; 0: it may not be one. (An overlay is
// not: a descriptor follows its file into the upper layer, the mapping does not.)
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
    const auto kind = static_cast<std::uint32_t>(system.f_type);
    return std::ranges::count(known, kind) != 0 ? kind : 0;
}

}  // namespace

bool img_file_mapping::is_same_file(const state &a, const state &b)
{
    return a.device == b.device && a.inode == b.inode;
}

// Returns false when there is nothing to be seen.
bool img_file_mapping::look_at(int fd)
{
    struct stat status;
    if (::fstat(fd, &status) == -1) return false;
    const state now{.length = status.st_size,
                    .change = time_of(status.st_ctim),
                    .device = status.st_dev,
                    .inode = status.st_ino,
                    .has_holes = status.st_blocks * 512 < status.st_size};
    // Where stamps come from a clock that stands still for a while, two that differ are a
    // millisecond apart at least.
    const img_file_time since = now.change - m_seen.change;
    if (!is_same_file(now, m_seen))
        m_has_fine_stamps = false;
    else if (since > 0 && since < SECOND / 2'000)
        m_has_fine_stamps = true;
    m_seen = now;
    return true;
}

// True when a change from now on gets another stamp than the last one did: a clock that stands
// still for up to 10 milliseconds, or counts seconds alone, must have gone on since.
bool img_file_mapping::shows_changes() const
{
    if (m_has_fine_stamps) return true;
    std::timespec now;
    ::clock_gettime(CLOCK_REALTIME, &now);
    const bool counts_seconds = m_seen.change % SECOND == 0;
    return m_seen.change < time_of(now) - (counts_seconds ? 2 * SECOND : SECOND / 50);
}

// Makes the mapping reach `end`, which lies in the file. It is made larger than the file, so that
// one that grows is not mapped anew for each of its lines.
bool img_file_mapping::reach(int fd, std::int64_t end)
{
    if (end <= m_size && is_same_file(m_mapped, m_seen)) return true;
    drop();
    const std::uint32_t kind = local_file_system(fd);
    if (kind == 0) return false;
    constexpr std::uint64_t smallest = 1U << 16U;
    constexpr std::uint64_t largest = 1U << 31U;
    const std::uint64_t size =
        std::bit_ceil(std::clamp(static_cast<std::uint64_t>(m_seen.length), smallest, largest));
    void *const bytes = ::mmap(nullptr, size, PROT_READ, MAP_SHARED, fd, 0);
    if (bytes == MAP_FAILED) return false;
    m_bytes = static_cast<std::uint8_t *>(bytes);
    m_size = static_cast<std::int64_t>(size);
    m_mapped = m_seen;
    m_is_in_memory = kind == TMPFS;
    return true;
}

void img_file_mapping::drop()
{
    if (m_bytes != nullptr) ::munmap(m_bytes, static_cast<std::size_t>(m_size));
    m_bytes = nullptr;
    m_size = 0;
}

// The descriptor decides what there is: after the end of the file its last page goes on with zero
// bytes, and so do pages that are cut off and written again meanwhile. The latter show in the time
// of the last change alone.
std::int32_t img_file_mapping::lend(int fd, std::int32_t offset, std::int32_t count,
                                    img_io_use_fn use, void *arg)
{
    const std::int64_t end = std::int64_t{offset} + count;
    if (m_unfit || offset < 0 || count < 1 || !look_at(fd) || end > m_seen.length ||
        !shows_changes())
        return -1;
    m_unfit = !reach(fd, end);
    // Reading a mapping takes room for what is missing of a file in memory.
    if (m_unfit || (m_is_in_memory && m_seen.has_holes)) return -1;

    const state before = m_seen;
    if (!use_guarded(m_bytes, static_cast<std::size_t>(m_size), offset, use, arg)) {
        drop();
        return -1;
    }
    return look_at(fd) && is_same_file(m_seen, before) && m_seen.change == before.change &&
                   m_seen.length == before.length
               ? 0
               : -1;
}
