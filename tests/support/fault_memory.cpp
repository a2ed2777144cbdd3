#include "support/fault_memory.h"

#include <cerrno>
#include <mutex>
#include <new>

static bool denies(std::size_t size)
{
    static std::mutex mutex;
    const std::lock_guard lock(mutex);
    shortage.requested += size;
    if (shortage.requests_left == 0 || --shortage.requests_left != 0) return false;
    shortage.requests_left = shortage.denies_the_rest ? 1 : 0;
    shortage.denied = true;
    errno = ENOMEM;
    return true;
}

// The linker puts these in place of the non-throwing operators new and new[], the latter also with
// an alignment, which the library alone uses, and calls the originals __real_.
extern "C" {

void *__real__ZnwmRKSt9nothrow_t(std::size_t size, const std::nothrow_t &tag) noexcept;
void *__real__ZnamRKSt9nothrow_t(std::size_t size, const std::nothrow_t &tag) noexcept;

void *__real__ZnamSt11align_val_tRKSt9nothrow_t(std::size_t size, std::align_val_t alignment,
                                                const std::nothrow_t &tag) noexcept;

void *__wrap__ZnwmRKSt9nothrow_t(std::size_t size, const std::nothrow_t &tag) noexcept
{
    return denies(size) ? nullptr : __real__ZnwmRKSt9nothrow_t(size, tag);
}

void *__wrap__ZnamRKSt9nothrow_t(std::size_t size, const std::nothrow_t &tag) noexcept
{
    return denies(size) ? nullptr : __real__ZnamRKSt9nothrow_t(size, tag);
}

void *__wrap__ZnamSt11align_val_tRKSt9nothrow_t(std::size_t size, std::align_val_t alignment,
                                                const std::nothrow_t &tag) noexcept
{
    return denies(size) ? nullptr : __real__ZnamSt11align_val_tRKSt9nothrow_t(size, alignment, tag);
}
}
