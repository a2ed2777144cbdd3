// Guarding the reads of mapped files against bus errors.
//
// A page of a mapping cannot be read once another program has truncated the file before it, or when
// the disk fails: the processor then raises a bus error, SIGBUS, in the thread that reads. Without
// a guard the process ends.
//
// The library's handler is installed while mappings are guarded, in front of the host's. It takes
// the bus errors of the processor inside these mappings; all others reach the host's handler.
#ifndef IMG_BUS_ERROR_GUARD_POSIX_H
#define IMG_BUS_ERROR_GUARD_POSIX_H

#include "io/io_method.h"

#include <atomic>
#include <cstddef>
#include <cstdint>

// A mapping that is read by any number of threads.
struct img_guarded_mapping {
    std::uint8_t *begin = nullptr;
    std::size_t size = 0;
    // Bus errors met: at each, all of the mapping was replaced by zero bytes.
    std::atomic<std::uint32_t> cuts = 0;
    img_guarded_mapping *next = nullptr;  // in the list of guarded mappings
};

// Start and end the guard of a mapping, which lies at one place meanwhile.
void img_guard_mapping(img_guarded_mapping *mapping);
void img_unguard_mapping(img_guarded_mapping *mapping);

// Maps the file open on `fd` again in the place of a mapping that was cut, while others may be
// reading it. Sets `*cuts` to the count at which it is whole. Returns false on failure.
bool img_map_again(img_guarded_mapping *mapping, int fd, std::uint32_t *cuts);

// Calls `use(arg, bytes)`, which reads `bytes` inside of `mapping`, on any number of threads at the
// same time. Returns true when no thread met a bus error in the mapping since it had `cuts` of
// them. False: what `use` did must be discarded, or it was not called, because handlers were
// installed too often in front of the library's. The thread's signal mask is as before.
bool img_use_guarded(const img_guarded_mapping &mapping, std::uint32_t cuts,
                     const std::uint8_t *bytes, img_io_use_fn use, void *arg);

// For the child of a fork.
void img_bus_errors_after_fork();
// Takes the library's handler out, whatever is mapped.
void img_leave_bus_errors();

#endif
