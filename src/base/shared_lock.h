// Locks: one for data that many threads read at once, and one for short sections.
//
// Fork and unloading are safe because no lock is held between two calls of the library (see
// api/calls.h).
#ifndef IMG_SHARED_LOCK_H
#define IMG_SHARED_LOCK_H

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>

// Annotations that clang checks with -Wthread-safety; other compilers ignore them.
#if defined(__clang__)
#define IMG_THREAD_SAFETY(attribute) __attribute__((attribute))
#else
#define IMG_THREAD_SAFETY(attribute)
#endif
#define IMG_CAPABILITY(name) IMG_THREAD_SAFETY(capability(name))
#define IMG_SCOPED_CAPABILITY IMG_THREAD_SAFETY(scoped_lockable)
#define IMG_GUARDED_BY(lock) IMG_THREAD_SAFETY(guarded_by(lock))
#define IMG_ACQUIRE(...) IMG_THREAD_SAFETY(acquire_capability(__VA_ARGS__))
#define IMG_RELEASE(...) IMG_THREAD_SAFETY(release_capability(__VA_ARGS__))
#define IMG_TRY_ACQUIRE(...) IMG_THREAD_SAFETY(try_acquire_capability(__VA_ARGS__))
#define IMG_ACQUIRE_SHARED(...) IMG_THREAD_SAFETY(acquire_shared_capability(__VA_ARGS__))
#define IMG_RELEASE_SHARED(...) IMG_THREAD_SAFETY(release_shared_capability(__VA_ARGS__))
#define IMG_UNCHECKED_LOCKS IMG_THREAD_SAFETY(no_thread_safety_analysis)

// A mutex that never throws; keeps errno.
class IMG_CAPABILITY("mutex") img_mutex {
public:
    void lock() IMG_ACQUIRE();
    void unlock() IMG_RELEASE();

private:
    std::atomic<std::int32_t> m_holders = 0;  // 0: free; 1: held; 2: held, and others may wait
};

// Holds a mutex while it lives.
class IMG_SCOPED_CAPABILITY img_mutex_lock {
public:
    explicit img_mutex_lock(img_mutex &mutex) IMG_ACQUIRE(mutex) : m_mutex(mutex) { mutex.lock(); }
    ~img_mutex_lock() IMG_RELEASE() { m_mutex.unlock(); }
    img_mutex_lock(const img_mutex_lock &) = delete;
    img_mutex_lock &operator=(const img_mutex_lock &) = delete;

private:
    img_mutex &m_mutex;
};

// Shared by readers or held by one writer. A reader counts itself in a counter of its own thread,
// in a cache line of its own: readers write nothing that other readers touch. A writer stops new
// readers and waits for all counters. Writers, and readers that a writer has stopped, take turns in
// the order in which they came, so that nobody waits forever. Not recursive; keeps errno.
class IMG_CAPABILITY("shared lock") img_shared_lock {
public:
    // Returns the index of the counter in which the reader is counted, for unlock_shared.
    std::uint32_t lock_shared() IMG_ACQUIRE_SHARED();
    void unlock_shared(std::uint32_t index) IMG_RELEASE_SHARED();
    void lock() IMG_ACQUIRE();
    void unlock() IMG_RELEASE();
    // Takes the lock if nobody has it. Returns true then.
    bool try_lock() IMG_TRY_ACQUIRE(true);
    // In the child of a fork by the thread that holds the lock alone: frees it from that thread,
    // and from those that waited for it, which do not exist here.
    void reset_in_child() IMG_RELEASE();

private:
    static constexpr std::size_t CACHE_LINE = 64;
    static constexpr std::size_t COUNTERS = 64;  // threads beyond share a counter

    struct alignas(CACHE_LINE) counter {
        std::atomic<std::int32_t> readers;
    };

    void take_turn();
    void pass_turn();

    // Written when a writer comes, and when a counter is used for the first time.
    alignas(CACHE_LINE) std::atomic<std::int32_t> m_has_writer;
    std::atomic<std::uint64_t> m_used_counters;                       // one bit each
    alignas(CACHE_LINE) std::atomic<std::int32_t> m_next, m_serving;  // turns: given out; on
    std::array<counter, COUNTERS> m_counters;
};

#endif
