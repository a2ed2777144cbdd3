// The access method "fault": ordinary files whose nth call goes wrong; and "refusing", which lends
// nothing.
#ifndef IMG_TEST_FAULT_METHOD_H
#define IMG_TEST_FAULT_METHOD_H

#include <cstdint>
#include <map>
#include <vector>

enum class io_call { open, close, read, write, seek, unlink };

enum class fault {
    moves_none,  // read, write: 0
    moves_one,   // read, write: 1 byte
    moves_half,  // read, write: half of what was asked
    stands_off,  // seek: the file stands, and is said to stand, one byte further
    fails,       // nothing done: -1, errno EIO
    answers_min,
    answers_max,  // read, seek: INT_MIN or INT_MAX, nothing done
};

// A call that failed, fell short or went elsewhere.
struct bad_call {
    io_call call;
    std::int32_t asked = 0;  // bytes of a read or write, whence of a seek
    std::int32_t got = -1;   // what it answered
    bool planned = true;     // false: a read that met the end of the file
    bool grows = false;      // the write of one zero byte
};
inline std::vector<bad_call> bad_calls;  // since fault_arm, which clears it, as may a test

// Lets the `nth` call of that kind from now on go wrong, and every later one if `lasting`.
// Counters start anew. nth 0: nothing goes wrong. The first call registers both methods.
void fault_arm(io_call call, int nth, fault what = fault::fails, bool lasting = false);
// True when a call went wrong since fault_arm.
bool fault_fired();
// Calls since fault_arm.
int calls_of(io_call call);
// Descriptors that were opened and not closed since the process began.
inline int open_descriptors = 0;

// Bytes on loan that the access method "refusing" was asked for; it has the ordinary files, hands
// out wrong bytes, and says afterwards that they cannot be lent.
int &refused_loans();

#endif
