// Memory that cannot be had.
#ifndef IMG_TEST_FAULT_MEMORY_H
#define IMG_TEST_FAULT_MEMORY_H

#include <cstddef>

// What becomes of the library's requests for memory.
struct memory_plan {
    int requests_left = 0;         // the last of them is denied; 0: none is
    bool denies_the_rest = false;  // and every later one
    bool denied = false;           // a request was
    std::size_t requested = 0;     // bytes
};
inline memory_plan shortage;

// Denies the library's `nth` request for memory from now on, and every later one if `lasting`.
// Counting starts anew; nth 0: none is denied.
inline void memory_arm(int nth, bool lasting = false)
{
    shortage = {nth, lasting};
}

#endif
