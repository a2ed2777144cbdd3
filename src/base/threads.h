// Threads that wait, and what the library must know of threads and processes that it did not start.
#ifndef IMG_THREADS_H
#define IMG_THREADS_H

#include <atomic>
#include <cstdint>

// Waits until `value` is no longer `old`; may return earlier. Keeps errno.
void img_wait_for_change(const std::atomic<std::int32_t> &value, std::int32_t old);
// Wakes the threads that wait for a change of `value`. Keeps errno.
void img_wake_waiting(const std::atomic<std::int32_t> &value);

// Puts off a cancellation of this thread (pthread_cancel), which would leave locks behind. Returns
// what img_allow_cancellation needs to put it back.
int img_defer_cancellation();
void img_allow_cancellation(int state);

// Calls `before` in a thread that forks, then `in_parent` and `in_child` in the two processes.
// Holds until the library is unloaded.
void img_watch_forks(void (*before)(), void (*in_parent)(), void (*in_child)());

// Has `at_end` called with the object of each thread that ends after img_set_thread_object gave it
// one. Does nothing when that is so already. Where the process has no room for it, no object can be
// set.
void img_watch_thread_ends(void (*at_end)(void *object));
bool img_set_thread_object(void *object);
// No thread's end is reported any more.
void img_ignore_thread_ends();

#endif
