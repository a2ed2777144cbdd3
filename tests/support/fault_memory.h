// Memory that cannot be had.
#ifndef IMG_TEST_FAULT_MEMORY_H
#define IMG_TEST_FAULT_MEMORY_H

#include <cstddef>

// Denies the library's `nth` request for memory from now on, and every later one if `lasting`.
// Counting starts anew; nth 0: none is denied.
void memory_arm(int nth, bool lasting = false);
// True when a request was denied since memory_arm.
bool memory_denied();
// Bytes that the library requested since memory_arm.
std::size_t memory_requested();

#endif
