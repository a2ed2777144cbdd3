#include "support/fault_system.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <ctime>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <unistd.h>

namespace {

template <typename Transfer>
ssize_t interruptible(std::size_t count, Transfer transfer)
{
    static bool interrupted = false;
    if (!host.interrupts) return transfer(count);
    interrupted = !interrupted;
    if (!interrupted) return transfer(std::min<std::size_t>(count, 3));
    errno = EINTR;
    return -1;
}

}  // namespace

// The linker puts these in place of the system's calls, and calls those __real_.
extern "C" {

int __real_open(const char *name, int flags, ...);
ssize_t __real_pread(int fd, void *buffer, std::size_t count, off_t position);
ssize_t __real_pwrite(int fd, const void *buffer, std::size_t count, off_t position);
int __real_fstat(int fd, struct stat *status);
int __real_fstatfs(int fd, struct statfs *status);
int __real_clock_gettime(clockid_t clock, std::timespec *now);
std::time_t __real_time(std::time_t *now);
int __real_sigaction(int signal, const struct sigaction *action, struct sigaction *found);
std::tm *__real_localtime_r(const std::time_t *time, std::tm *local);

int __wrap_open(const char *name, int flags, mode_t mode)
{
    if (host.leases_files == 2 || (host.leases_files == 1 && (flags & O_NONBLOCK) != 0)) {
        errno = EWOULDBLOCK;
        return -1;
    }
    const auto open = [=](auto) { return __real_open(name, flags, mode); };
    return static_cast<int>(interruptible(0, open));
}

ssize_t __wrap_pread(int fd, void *buffer, std::size_t count, off_t position)
{
    ++ordinary_reads;
    return interruptible(
        count, [=](std::size_t part) { return __real_pread(fd, buffer, part, position); });
}

ssize_t __wrap_pwrite(int fd, const void *buffer, std::size_t count, off_t position)
{
    const auto write = [=](std::size_t part) { return __real_pwrite(fd, buffer, part, position); };
    if (host.writes_left > 0 && --host.writes_left == 0)
        ::_exit(write(host.half_done ? count / 2 : count) == -1 ? -1 : host.last_words);
    if (host.disk_size == -1) return interruptible(count, write);
    return limited(RLIMIT_FSIZE, host.disk_size, [=] { return write(count); });
}

static std::timespec to_timespec(long nanoseconds)
{
    return {nanoseconds / 1'000'000'000, nanoseconds % 1'000'000'000};
}

int __wrap_fstat(int fd, struct stat *status)
{
    const int result = host.has_no_status ? -1 : __real_fstat(fd, status);
    if (host.block_devices) {
        status->st_mode = S_IFBLK;
        status->st_size = 0;
    }
    if (host.holes) status->st_blocks = 0;
    if (host.stamp != 0) status->st_ctim = to_timespec(host.stamp);
    return result;
}

int __wrap_fstatfs(int fd, struct statfs *status)
{
    const int result = __real_fstatfs(fd, status);
    status->f_type = static_cast<decltype(status->f_type)>(host.file_system);
    return result;
}

int __wrap_clock_gettime(clockid_t clock, std::timespec *now)
{
    const int result = __real_clock_gettime(clock, now);
    now->tv_sec += host.seconds_later;
    if (host.now != 0) *now = to_timespec(host.now);
    return result;
}

std::time_t __wrap_time(std::time_t *now)
{
    return host.has_no_time ? -1 : __real_time(now);
}

int __wrap_sigaction(int signal, const struct sigaction *action, struct sigaction *found)
{
    const int result = __real_sigaction(signal, action, found);
    if (action != nullptr && host.after_sigaction) std::exchange(host.after_sigaction, nullptr)();
    return result;
}

std::tm *__wrap_localtime_r(const std::time_t *time, std::tm *local)
{
    return host.has_no_local_time ? nullptr : __real_localtime_r(time, local);
}
}
