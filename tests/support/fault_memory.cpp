#include "support/fault_memory.h"

#include <cerrno>
#include <new>

namespace {

int requests_left = 0;
bool denies_the_rest = false;
bool denied = false;
std::size_t requested = 0;

bool denies(std::size_t size)
{
    requested += size;
    if (requests_left == 0 || --requests_left != 0) return false;
    if (denies_the_rest) requests_left = 1;
    denied = true;
    errno = ENOMEM;
    return true;
}

}  // namespace

void memory_arm(int nth, bool lasting)
{
    requests_left = nth;
    denies_the_rest = lasting;
    denied = false;
    requested = 0;
}

bool memory_denied()
{
    return denied;
}

std::size_t memory_requested()
{
    return requested;
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
