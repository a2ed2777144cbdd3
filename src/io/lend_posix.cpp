#include "io/lend_posix.h"

#include <algorithm>
#include <bit>
#include <csignal>
#include <ctime>

#include <pthread.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// The mapping whose bytes are in use, or were last, and by whom.
struct {
    pthread_t thread;
    std::uint8_t *begin;
    std::size_t size;
    struct sigaction found;           // what the host does about bus errors
    volatile std::sig_atomic_t torn;  // 1: some of the bytes were not there
} in_use;

// True when an error is a read of the mapping by the thread that uses it.
bool is_torn(const siginfo_t *info)
{
    const auto *const address = static_cast<const std::uint8_t *>(info->si_addr);
    return info->si_code > 0 && ::pthread_equal(::pthread_self(), in_use.thread) != 0 &&
           address >= in_use.begin && address < in_use.begin + in_use.size;
}

// Does what would have happened without this library.
void leave_to_host(int signal, siginfo_t *info, void *context)
{
    const struct sigaction &host = in_use.found;
    const bool sent_by_a_program = info->si_code <= 0;
    // unreachable: a process in which the processor's error is ignored ends, as in the default case
    if (host.sa_handler == SIG_IGN && sent_by_a_program) return;
    // unreachable: the same
    if (host.sa_handler == SIG_DFL || host.sa_handler == SIG_IGN) {
        ::sigaction(signal, &host, nullptr);
        // unreachable: the same
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
        leave_to_host(signal, info, context);
        return;
    }
    static_cast<void>(::mmap(in_use.begin, in_use.size, PROT_READ,
                             MAP_PRIVATE | MAP_ANONYMOUS | MAP_FIXED, -1, 0));
    in_use.torn = 1;
}

img_file_time time_of(const std::timespec &time)
{
    return img_file_time{time.tv_sec} * 1'000'000'000 + time.tv_nsec;
}

// A blocked bus error ends the process. To ask whether it is blocked takes a tenth of the time of a
// small window, and the answer holds for a thread until that changes its mind.
class unblocked_bus_errors {
public:
    explicit unblocked_bus_errors(img_file_time now)
    {
        if (::pthread_equal(::pthread_self(), thread_asked) != 0 && now >= asked &&
            now < asked + validity)
            return;
        sigset_t bus_errors;
        ::sigemptyset(&bus_errors);
        ::sigaddset(&bus_errors, SIGBUS);
        ::pthread_sigmask(SIG_UNBLOCK, &bus_errors, &m_mask);
        m_were_blocked = ::sigismember(&m_mask, SIGBUS) != 0;
        thread_asked = ::pthread_self();
        asked = m_were_blocked ? 0 : now;
    }
    ~unblocked_bus_errors()
    {
        if (m_were_blocked) ::pthread_sigmask(SIG_SETMASK, &m_mask, nullptr);
    }
    unblocked_bus_errors(const unblocked_bus_errors &) = delete;
    unblocked_bus_errors &operator=(const unblocked_bus_errors &) = delete;

private:
    static constexpr img_file_time validity = 1'000'000;
    static inline pthread_t thread_asked{};
    static inline img_file_time asked = 0;  // and found not blocked

    bool m_were_blocked = false;
    sigset_t m_mask;
};

// Calls `use` while bus errors in the mapping are caught. Returns false when there was one.
bool use_guarded(std::uint8_t *mapping, std::size_t size, img_file_time now, std::int32_t offset,
                 img_io_use_fn use, void *arg)
{
    in_use.thread = ::pthread_self();
    in_use.begin = mapping;
    in_use.size = size;
    in_use.torn = 0;
    struct sigaction action;
    action.sa_sigaction = on_bus_error;
    action.sa_flags = SA_SIGINFO | SA_NODEFER | SA_ONSTACK;
    ::sigemptyset(&action.sa_mask);
    ::sigaction(SIGBUS, &action, &in_use.found);
    {
        const unblocked_bus_errors meanwhile(now);
        use(arg, mapping + offset);
    }
    ::sigaction(SIGBUS, &in_use.found, nullptr);
    return in_use.torn == 0;
}

}  // namespace

// Makes the mapping reach `end`, which lies in the file. It is made larger than the file, so that
// one that grows is not mapped anew for each of its lines.
bool img_file_mapping::covers(int fd, std::int64_t end)
{
    if (end <= m_size) return true;
    drop();
    struct stat status;
    if (::fstat(fd, &status) == -1 || !S_ISREG(status.st_mode)) return false;
    constexpr std::uint64_t smallest = 1U << 16U;
    constexpr std::uint64_t largest = 1U << 31U;
    const std::uint64_t size =
        std::bit_ceil(std::clamp(static_cast<std::uint64_t>(m_length), smallest, largest));
    void *const bytes = ::mmap(nullptr, size, PROT_READ, MAP_SHARED, fd, 0);
    if (bytes == MAP_FAILED) return false;
    m_bytes = static_cast<std::uint8_t *>(bytes);
    m_size = static_cast<std::int64_t>(size);
    return true;
}

void img_file_mapping::drop()
{
    if (m_bytes != nullptr) ::munmap(m_bytes, static_cast<std::size_t>(m_size));
    m_bytes = nullptr;
    m_size = 0;
}

// The descriptor decides what there is: after the end of the file its last page goes on with zero
// bytes, and so do pages that were cut off and written again meanwhile. The latter show in the time
// of the last change alone. Files are stamped with a clock that stands still for up to 10
// milliseconds.
std::int32_t img_file_mapping::lend(int fd, std::int32_t offset, std::int32_t count,
                                    img_io_use_fn use, void *arg)
{
    struct stat status;
    if (m_changed && ::fstat(fd, &status) == 0) {
        m_own_change = time_of(status.st_ctim);
        m_changed = false;
    }
    const std::int64_t end = std::int64_t{offset} + count;
    if (end > m_length) m_length = ::lseek(fd, 0, SEEK_END);
    if (offset < 0 || count < 1 || end > m_length || !covers(fd, end)) return -1;

    std::timespec time;
    ::clock_gettime(CLOCK_REALTIME, &time);
    const img_file_time now = time_of(time);
    if (!use_guarded(m_bytes, static_cast<std::size_t>(m_size), now, offset, use, arg)) {
        drop();
        m_length = 0;
        return -1;
    }
    if (::fstat(fd, &status) == -1) return -1;
    m_length = status.st_size;
    const img_file_time change = time_of(status.st_ctim);
    constexpr img_file_time stamp_period = 20'000'000;
    const bool unchanged = change < now - stamp_period || change == m_own_change;
    return end <= m_length && unchanged ? 0 : -1;
}
