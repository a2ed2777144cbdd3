// Waiting (the futex of Linux), forks and the ends of threads (POSIX). Read threads.h first.
#include "base/threads.h"

#include <cerrno>
#include <climits>

#include <linux/futex.h>
#include <pthread.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace {

pthread_key_t key;
std::atomic<bool> has_key = false;

static_assert(sizeof(std::atomic<std::int32_t>) == sizeof(std::int32_t) &&
              std::atomic<std::int32_t>::is_always_lock_free);

void futex(const std::atomic<std::int32_t> &value, int operation, std::int32_t argument)
{
    const int error = errno;
    ::syscall(SYS_futex, &value, operation, argument, nullptr, nullptr, 0);
    errno = error;
}

}  // namespace

void img_wait_for_change(const std::atomic<std::int32_t> &value, std::int32_t old)
{
    // Most waits end sooner than a call of the system.
    for (int i = 0; i < 100; ++i)
        if (value.load() != old) return;
    futex(value, FUTEX_WAIT_PRIVATE, old);
}

void img_wake_waiting(const std::atomic<std::int32_t> &value)
{
    futex(value, FUTEX_WAKE_PRIVATE, INT_MAX);
}

int img_defer_cancellation()
{
    int state = PTHREAD_CANCEL_ENABLE;
    ::pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &state);
    return state;
}

void img_allow_cancellation(int state)
{
    ::pthread_setcancelstate(state, nullptr);
}

void img_watch_forks(void (*before)(), void (*in_parent)(), void (*in_child)())
{
    ::pthread_atfork(before, in_parent, in_child);
}

void img_watch_thread_ends(void (*at_end)(void *object))
{
    // unreachable: no key; the process has some left
    has_key = has_key || ::pthread_key_create(&key, at_end) == 0;
}

bool img_set_thread_object(void *object)
{
    // unreachable: a failure; the key is valid
    return has_key && ::pthread_setspecific(key, object) == 0;
}

void img_ignore_thread_ends()
{
    // uncounted: nothing is counted any more
    if (has_key.exchange(false)) ::pthread_key_delete(key);
}
