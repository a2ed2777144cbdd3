// An operating system on which much goes wrong.
#ifndef IMG_TEST_FAULT_SYSTEM_H
#define IMG_TEST_FAULT_SYSTEM_H

#include <csignal>
#include <functional>
#include <sys/resource.h>

// What the library's calls of the system meet with; the default is nothing.
struct fault_host {
    int leases_files = 0;     // 1: who does not wait cannot open one; 2: nobody can
    bool interrupts = false;  // every other call, and the others move three bytes at most
    bool has_no_status = false, has_no_time = false, has_no_local_time = false;
    bool block_devices = false;  // all files are said to be such
    int file_system = 0xEF53;  // what all files are said to be on: one with a disk, of this machine
    bool holes = false;        // all files are said to have some
    int disk_size = -1;        // bytes that a file may have; -1: as many as it wants
    int writes_left = 0;       // the process ends at the last of them; 0: it does not
    bool half_done = false;    // that one moves half of what it should
    int last_words = 0;        // what the process returns then
    int seconds_later = 1;     // than it is: what others wrote a moment ago counts as old
    std::function<void()> after_sigaction = nullptr;  // called once
    long stamp = 0, now = 0;  // of all files, and of the clock, in nanoseconds; 0: as it is
};
inline fault_host host;

inline thread_local int ordinary_reads = 0;  // of the library, in this thread

// Returns what `action` does with a resource of the process limited.
template <typename Action>
auto limited(decltype(RLIMIT_FSIZE) resource, int value, Action action)
{
    std::signal(SIGXFSZ, SIG_IGN);
    rlimit saved{};
    ::getrlimit(resource, &saved);
    const rlimit lowered{static_cast<rlim_t>(value), saved.rlim_max};
    ::setrlimit(resource, &lowered);
    const auto result = action();
    ::setrlimit(resource, &saved);
    return result;
}

#endif
