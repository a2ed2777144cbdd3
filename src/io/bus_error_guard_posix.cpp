// Catching bus errors in one mapping. Read bus_error_guard_posix.h first.
//
// Who may be interrupted, and when:
//
//   The reading thread runs `use` with our handler installed. A bus error of the processor inside
//   the mapping interrupts it there. The handler maps zero pages over the whole mapping and
//   returns; the instruction is repeated and succeeds, and `use` goes on to its end. It never jumps
//   out.
//
//   Any thread may meet a bus error elsewhere while our handler is installed: the handler calls the
//   host's in our place. Between installing ours and recording the host's (`host_is_known` false)
//   it waits for the record.
//
//   A program may send SIGBUS with kill at any time. If the reading thread gets it while the host
//   blocks SIGBUS, or before the host's handler is known, the signal is recorded (`must_raise`) and
//   raised again when the guard ends, where the host finds it pending as it would have.
//
// The handler only uses functions that are safe in signal handlers, and variables of types that are
// read and written in one step.
#include "io/bus_error_guard_posix.h"

#include <atomic>
#include <csignal>

#include <poll.h>
#include <pthread.h>
#include <sys/mman.h>

namespace {

// The mapping that is being read, and the signals of its reader.
struct {
    std::atomic<pthread_t> thread;  // the reader; 0: nobody reads
    std::uint8_t *begin;            // of the mapping
    std::size_t size;
    sigset_t host_mask;                     // signals that the host blocks in this thread
    volatile std::sig_atomic_t was_cut;     // 1: a bus error was met in the mapping
    volatile std::sig_atomic_t must_raise;  // 1: a SIGBUS was deferred
} reader;
static_assert(decltype(reader.thread)::is_always_lock_free, "a signal handler takes no locks");

// The host's handler of bus errors; of all threads.
struct sigaction host_action;
std::atomic<bool> host_is_known;  // false: `host_action` is about to be recorded

// Sent with kill or raise, not by the processor.
bool is_sent_by_a_program(const siginfo_t *info)
{
    return info->si_code <= 0;
}

bool is_reader()
{
    return reader.thread.load(std::memory_order_relaxed) == ::pthread_self();
}

// True for a bus error that this thread meets while it reads the mapping.
bool is_in_mapping(const siginfo_t *info)
{
    if (is_sent_by_a_program(info) || !is_reader()) return false;
    const auto address = reinterpret_cast<std::uintptr_t>(info->si_addr);
    const auto begin = reinterpret_cast<std::uintptr_t>(reader.begin);
    return address >= begin && address - begin < reader.size;
}

bool is_host_known()
{
    return host_is_known.load(std::memory_order_acquire);
}

// True for a SIGBUS sent by a program that must be deferred until the guard ends.
bool must_be_deferred(const siginfo_t *info)
{
    return is_sent_by_a_program(info) && is_reader() &&
           (!is_host_known() || ::sigismember(&reader.host_mask, SIGBUS) == 1);
}

// Does what the host has set for bus errors.
void leave_to_host(int signal, siginfo_t *info, void *context)
{
    while (!is_host_known()) ::poll(nullptr, 0, 1);  // another thread is recording it
    const struct sigaction host = host_action;
    const bool sent_by_a_program = is_sent_by_a_program(info);
    if ((static_cast<unsigned>(host.sa_flags) & SA_RESETHAND) != 0) {
        host_action.sa_handler = SIG_DFL;
        host_action.sa_flags = 0;
    }
    // uncounted: the processor's own error cannot be ignored, so the process ends as by default
    if (host.sa_handler == SIG_IGN && sent_by_a_program) return;
    // uncounted: the process ends
    if (host.sa_handler == SIG_DFL || host.sa_handler == SIG_IGN) {
        ::sigaction(signal, &host, nullptr);
        // uncounted: the process ends
        if (sent_by_a_program) ::raise(signal);  // the processor's own error comes again by itself
    } else if ((host.sa_flags & SA_SIGINFO) != 0) {
        host.sa_sigaction(signal, info, context);
    } else {
        host.sa_handler(signal);
    }
}

void on_bus_error(int signal, siginfo_t *info, void *context)
{
    if (!is_in_mapping(info)) {
        if (must_be_deferred(info))
            reader.must_raise = 1;
        else
            leave_to_host(signal, info, context);
        return;
    }
    // A host that locks its memory has a limit on it: the zero pages count in addition.
    ::munlock(reader.begin, reader.size);
    const void *const zeros = ::mmap(reader.begin, reader.size, PROT_READ,
                                     MAP_PRIVATE | MAP_ANONYMOUS | MAP_FIXED, -1, 0);
    reader.was_cut = 1;
    // unreachable: a mapping that replaces another one finds room
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
        ::sigemptyset(&reader.host_mask);
        reader.must_raise = 0;
        host_is_known.store(false, std::memory_order_release);
        struct sigaction found;
        ::sigaction(SIGBUS, &ours, &found);
        // Ours is still installed where a handler of the host jumped out of an earlier use.
        if (!is_ours(found)) host_action = found;
        host_is_known.store(true, std::memory_order_release);

        sigset_t bus_errors;  // a bus error that is blocked ends the process
        ::sigemptyset(&bus_errors);
        ::sigaddset(&bus_errors, SIGBUS);
        ::pthread_sigmask(SIG_UNBLOCK, &bus_errors, &reader.host_mask);
    }
    ~bus_error_guard()
    {
        const sigset_t mask = reader.host_mask;
        if (::sigismember(&mask, SIGBUS) != 0) ::pthread_sigmask(SIG_SETMASK, &mask, nullptr);
        if (reader.must_raise != 0) ::raise(SIGBUS);
        struct sigaction last;
        ::sigaction(SIGBUS, &host_action, &last);
        // A handler that another thread has installed meanwhile stays.
        if (!is_ours(last)) ::sigaction(SIGBUS, &last, nullptr);
    }
    bus_error_guard(const bus_error_guard &) = delete;
    bus_error_guard &operator=(const bus_error_guard &) = delete;
};

}  // namespace

bool img_use_guarded(std::uint8_t *mapping, std::size_t size, std::int32_t offset,
                     img_io_use_fn use, void *arg)
{
    reader.begin = mapping;
    reader.size = size;
    reader.was_cut = 0;
    reader.thread.store(::pthread_self(), std::memory_order_relaxed);
    {
        const bus_error_guard guard;
        use(arg, mapping + offset);
    }
    reader.thread.store(0, std::memory_order_relaxed);
    return reader.was_cut == 0;
}
