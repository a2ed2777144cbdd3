// Catching bus errors in mappings. Read bus_error_guard_posix.h first.
//
// Who may be interrupted, and when:
//
//   A thread that reads a mapping meets a bus error of the processor. The handler maps zero pages
//   over the whole mapping and counts that; the instruction is repeated and succeeds, and `use`
//   goes on to its end. The handler never jumps out. Each reader of the mapping sees the count.
//
//   Any thread may meet another bus error while the handler is installed: the handler calls the
//   host's.
//
//   A program may send SIGBUS with kill at any time. If a reader gets it while the host blocks
//   SIGBUS in this thread, the signal is recorded (`must_raise`) and raised again when the reader
//   is done: the host finds it pending, as it would have.
//
// The host may install a handler of its own at any time, which may call ours as the one that it
// found. Readers look which handler is installed; a new one of the host is recorded and ours comes
// in front of it again. Which of the recorded handlers a bus error is due to depends on who called
// ours: the system, or a handler of the host.
//
// The handler takes a lock that spins. Threads hold it for a few instructions, in which they meet
// no bus error and have SIGBUS blocked: no handler interrupts them.
#include "io/bus_error_guard_posix.h"

#include <algorithm>
#include <array>
#include <csignal>
#include <cstring>

#include <pthread.h>
#include <sys/mman.h>

// To the thread sanitizer, a mapping that replaces another one is a write that no lock protects.
#if defined(__SANITIZE_THREAD__)
#define IMG_THREAD_SANITIZER
#elif defined(__has_feature)
#if __has_feature(thread_sanitizer)
#define IMG_THREAD_SANITIZER
#endif
#endif
#ifdef IMG_THREAD_SANITIZER
extern "C" void AnnotateIgnoreWritesBegin(const char *file, int line);
extern "C" void AnnotateIgnoreWritesEnd(const char *file, int line);
#endif

namespace {

// A thread that reads although the host blocks SIGBUS there.
struct unblocked_reader {
    pthread_t thread;
    bool must_raise;  // a SIGBUS was deferred
    unblocked_reader *next;
};

// A bus error that was passed to a handler of the host.
struct passed_error {
    const void *context;  // of the interrupted code; null: free
    const void *frame;    // of our handler
    std::size_t level;    // index of the host's handler
};

// All that follows is guarded by this lock.
std::atomic<bool> is_locked = false;

img_guarded_mapping *mappings = nullptr;
unblocked_reader *unblocked_readers = nullptr;
// Handlers of the host, each installed in front of the ones before.
std::array<struct sigaction, 8> host_actions;
std::size_t host_count = 0;
std::array<passed_error, 16> passed_errors{};
std::size_t next_passed = 0;  // the entry that is taken when none is free

class spin_lock {
public:
    spin_lock()
    {
        while (is_locked.exchange(true, std::memory_order_acquire)) {}
    }
    ~spin_lock() { is_locked.store(false, std::memory_order_release); }
    spin_lock(const spin_lock &) = delete;
    spin_lock &operator=(const spin_lock &) = delete;
};

sigset_t bus_errors()
{
    sigset_t set;
    ::sigemptyset(&set);
    ::sigaddset(&set, SIGBUS);
    return set;
}

// Blocks SIGBUS in this thread while it lives.
class blocked_bus_errors {
public:
    blocked_bus_errors()
    {
        const sigset_t set = bus_errors();
        ::pthread_sigmask(SIG_BLOCK, &set, &m_mask);
    }
    ~blocked_bus_errors() { ::pthread_sigmask(SIG_SETMASK, &m_mask, nullptr); }
    blocked_bus_errors(const blocked_bus_errors &) = delete;
    blocked_bus_errors &operator=(const blocked_bus_errors &) = delete;

private:
    sigset_t m_mask;
};

// Sent with kill or raise, not by the processor.
bool is_sent_by_a_program(const siginfo_t *info)
{
    return info->si_code <= 0;
}

// Maps over a mapping, in its place.
bool map_fixed(std::uint8_t *begin, std::size_t size, int flags, int fd)
{
#ifdef IMG_THREAD_SANITIZER
    AnnotateIgnoreWritesBegin(__FILE__, __LINE__);
#endif
    const void *const bytes = ::mmap(begin, size, PROT_READ, flags | MAP_FIXED, fd, 0);
#ifdef IMG_THREAD_SANITIZER
    AnnotateIgnoreWritesEnd(__FILE__, __LINE__);
#endif
    // unreachable: a failure; what replaces a mapping finds room
    return bytes != MAP_FAILED;
}

// Replaces the mapping in which a bus error was met. Returns false when it was met elsewhere.
bool replace_mapping(const siginfo_t *info)
{
    if (is_sent_by_a_program(info)) return false;
    const auto address = reinterpret_cast<std::uintptr_t>(info->si_addr);
    const spin_lock lock;
    img_guarded_mapping *hit = mappings;
    while (hit != nullptr && address - reinterpret_cast<std::uintptr_t>(hit->begin) >= hit->size)
        hit = hit->next;
    if (hit == nullptr) return false;
    // A host that locks its memory has a limit on it: the zero pages count in addition.
    ::munlock(hit->begin, hit->size);
    hit->cuts.fetch_add(1);  // before a thread can read a zero
    return map_fixed(hit->begin, hit->size, MAP_PRIVATE | MAP_ANONYMOUS, -1);
}

// Returns true for a SIGBUS sent by a program that waits until this thread has read.
bool is_deferred(const siginfo_t *info)
{
    if (!is_sent_by_a_program(info)) return false;
    const spin_lock lock;
    unblocked_reader *self = unblocked_readers;
    // uncounted: two such threads at once
    while (self != nullptr && ::pthread_equal(self->thread, ::pthread_self()) == 0)
        self = self->next;
    if (self != nullptr) self->must_raise = true;
    return self != nullptr;
}

void on_bus_error(int signal, siginfo_t *info, void *context);

bool is_ours(const struct sigaction &action)
{
    return (action.sa_flags & SA_SIGINFO) != 0 && action.sa_sigaction == on_bus_error;
}

bool is_same(const struct sigaction &a, const struct sigaction &b)
{
    return a.sa_flags == b.sa_flags &&
           ((a.sa_flags & SA_SIGINFO) != 0 ? a.sa_sigaction == b.sa_sigaction
                                           : a.sa_handler == b.sa_handler);
}

std::size_t recorded_level(const struct sigaction &action)
{
    const auto *const end = host_actions.begin() + host_count;
    const auto *const found = std::find_if(host_actions.cbegin(), end,
                                           [&](const auto &each) { return is_same(each, action); });
    return static_cast<std::size_t>(found - host_actions.cbegin());
}

// Returns the number of recorded handlers that lie behind the caller of our handler. The frame of a
// call from a handler of the host lies deeper in the stack than the one that called the host.
std::size_t handlers_behind(const void *context, const void *frame)
{
    const auto passed = std::ranges::find(passed_errors, context, &passed_error::context);
    // uncounted: what a handler has left that jumped out
    if (passed != passed_errors.end() && std::less<>()(frame, passed->frame)) return passed->level;
    struct sigaction installed;
    ::sigaction(SIGBUS, nullptr, &installed);
    return is_ours(installed) ? host_count : recorded_level(installed);
}

// The entry of a bus error that is passed to the host's handler at `level`.
passed_error *enter_passed(const void *context, const void *frame, std::size_t level)
{
    auto *entry = std::ranges::find(passed_errors, context, &passed_error::context);
    if (entry == passed_errors.end())
        entry = std::ranges::find(passed_errors, nullptr, &passed_error::context);
    // uncounted: handlers of the host that jumped out have left their entries
    if (entry == passed_errors.end()) entry = &passed_errors[next_passed++ % passed_errors.size()];
    *entry = {context, frame, level};
    return entry;
}

// Does what the host has set for bus errors.
void leave_to_host(int signal, siginfo_t *info, void *context)
{
    const void *const frame = __builtin_frame_address(0);
    struct sigaction host = {};
    host.sa_handler = SIG_DFL;
    passed_error outer = {}, *entry = nullptr;
    {
        const spin_lock lock;
        // uncounted: the process ends; the host has called ours as the first handler of all
        if (const std::size_t behind = handlers_behind(context, frame); behind > 0) {
            host = host_actions[behind - 1];
            const auto found = std::ranges::find(passed_errors, context, &passed_error::context);
            if (found != passed_errors.end()) outer = *found;
            entry = enter_passed(context, frame, behind - 1);
            if ((static_cast<unsigned>(host.sa_flags) & SA_RESETHAND) != 0) {
                host_actions[behind - 1].sa_handler = SIG_DFL;
                host_actions[behind - 1].sa_flags = 0;
            }
        }
    }
    if ((static_cast<unsigned>(host.sa_flags) & SA_NODEFER) != 0) {
        const sigset_t set = bus_errors();
        ::pthread_sigmask(SIG_UNBLOCK, &set, nullptr);
    }
    const bool sent_by_a_program = is_sent_by_a_program(info);
    const bool is_default = host.sa_handler == SIG_DFL;
    const bool is_ignored = host.sa_handler == SIG_IGN;
    // uncounted: the processor's own error cannot be ignored, so the process ends as by default
    if (is_default || (is_ignored && !sent_by_a_program)) {
        host.sa_handler = SIG_DFL;
        ::sigaction(signal, &host, nullptr);
        // uncounted: the process ends
        if (sent_by_a_program) ::raise(signal);  // the processor's own error comes again by itself
    } else if ((host.sa_flags & SA_SIGINFO) != 0) {
        host.sa_sigaction(signal, info, context);
    } else if (!is_ignored) {  // uncounted: the process ends before it counts
        host.sa_handler(signal);
    }
    if (entry == nullptr) return;  // uncounted: the process ends
    const spin_lock lock;
    *entry = outer;
}

void on_bus_error(int signal, siginfo_t *info, void *context)
{
    if (!replace_mapping(info) && !is_deferred(info)) leave_to_host(signal, info, context);
}

// Puts our handler in front of the host's, and records that. Returns false when there is no room
// for the record. The caller holds the lock.
bool install()
{
    struct sigaction installed, ours = {};
    ::sigaction(SIGBUS, nullptr, &installed);
    ours.sa_sigaction = on_bus_error;
    ours.sa_flags = SA_SIGINFO | SA_ONSTACK | SA_RESTART;  // SIGBUS is blocked in the handler
    while (!is_ours(installed)) {
        const std::size_t level = recorded_level(installed);
        if (level == host_actions.size()) return false;
        host_actions[level] = installed;
        host_count = level + 1;
        ::sigaction(SIGBUS, &ours, &installed);
        // The host may have installed another one in between.
        // uncounted: false
        if (is_same(installed, host_actions[level])) return true;
    }
    return true;
}

// Takes our handler out, unless the host has one in front of it. The caller holds the lock.
void uninstall()
{
    struct sigaction installed;
    ::sigaction(SIGBUS, nullptr, &installed);
    if (is_ours(installed)) ::sigaction(SIGBUS, &host_actions[host_count - 1], nullptr);
}

// True when a bus error of the processor reaches our handler.
bool is_installed()
{
    struct sigaction installed;
    ::sigaction(SIGBUS, nullptr, &installed);
    if (is_ours(installed)) return true;
    const blocked_bus_errors blocked;
    const spin_lock lock;
    return install();
}

// Reads with SIGBUS unblocked in a thread where the host blocks it.
void use_unblocked(const sigset_t &host_mask, const std::uint8_t *bytes, img_io_use_fn use,
                   void *arg)
{
    unblocked_reader self{::pthread_self(), false, nullptr};
    {
        const blocked_bus_errors blocked;
        const spin_lock lock;
        self.next = unblocked_readers;
        unblocked_readers = &self;
    }
    const sigset_t set = bus_errors();
    ::pthread_sigmask(SIG_UNBLOCK, &set, nullptr);
    use(arg, bytes);
    ::pthread_sigmask(SIG_SETMASK, &host_mask, nullptr);
    {
        const spin_lock lock;
        unblocked_reader **place = &unblocked_readers;
        // uncounted: two such threads at once
        while (*place != &self) place = &(*place)->next;
        *place = self.next;
    }
    if (self.must_raise) ::raise(SIGBUS);
}

}  // namespace

bool img_map_again(img_guarded_mapping *mapping, int fd, std::uint32_t *cuts)
{
    const blocked_bus_errors blocked;
    const spin_lock lock;
    *cuts = mapping->cuts;
    return map_fixed(mapping->begin, mapping->size, MAP_SHARED, fd);
}

void img_guard_mapping(img_guarded_mapping *mapping)
{
    const blocked_bus_errors blocked;
    const spin_lock lock;
    mapping->next = mappings;
    mappings = mapping;
    install();
}

void img_unguard_mapping(img_guarded_mapping *mapping)
{
    const blocked_bus_errors blocked;
    const spin_lock lock;
    img_guarded_mapping **place = &mappings;
    while (*place != mapping) place = &(*place)->next;
    *place = mapping->next;
    if (mappings == nullptr) uninstall();
}

bool img_use_guarded(const img_guarded_mapping &mapping, std::uint32_t cuts,
                     const std::uint8_t *bytes, img_io_use_fn use, void *arg)
{
    if (!is_installed()) return false;
    sigset_t host_mask;  // a bus error that is blocked ends the process
    ::pthread_sigmask(SIG_BLOCK, nullptr, &host_mask);
    if (::sigismember(&host_mask, SIGBUS) == 0)
        use(arg, bytes);
    else
        use_unblocked(host_mask, bytes, use, arg);
    return mapping.cuts.load() == cuts;
}

void img_bus_errors_after_fork()
{
    // Another thread may have been in the handler.
    is_locked.store(false);
    passed_errors = {};
}

void img_leave_bus_errors()
{
    const blocked_bus_errors blocked;
    const spin_lock lock;
    uninstall();
}
