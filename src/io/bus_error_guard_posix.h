// Guarding the reads of a mapped file against bus errors.
//
// A page of a mapping cannot be read once another program has truncated the file before it, or when
// the disk fails: the processor then raises a bus error, SIGBUS, in the thread that reads. Without
// a guard the process ends.
#ifndef IMG_BUS_ERROR_GUARD_POSIX_H
#define IMG_BUS_ERROR_GUARD_POSIX_H

#include "io/io_method.h"

#include <cstddef>
#include <cstdint>

// Calls `use(arg, mapping + offset)` while bus errors of this thread in the `size` bytes of
// `mapping` are caught. Returns true when there was none. False: the whole mapping then holds zero
// bytes, what `use` did must be discarded, and the mapping must be dropped.
//
// All other bus errors reach the host's handler, as do all of other threads. The host's handler and
// signal mask are restored before the function returns. One thread at a time.
bool img_use_guarded(std::uint8_t *mapping, std::size_t size, std::int32_t offset,
                     img_io_use_fn use, void *arg);

#endif
