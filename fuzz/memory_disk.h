// The access method "memory": files in the memory of this process, on a disk that can go wrong; and
// "lending", which lends its bytes, too.
#ifndef IMG_FUZZ_MEMORY_DISK_H
#define IMG_FUZZ_MEMORY_DISK_H

#include "support/files.h"

#include <deque>
#include <map>

inline constexpr std::size_t DISK_FILE_SIZE = 1 << 20;  // no file grows beyond

enum : std::int32_t {  // what goes wrong with a call; where it cannot, the call fails
    DISK_FAILS,
    DISK_STANDS_OFF,  // seek: the file stands, and is said to stand, one byte further
    DISK_MOVES_NONE,  // read, write: 0 bytes are moved, and so on
    DISK_MOVES_ONE,
    DISK_MOVES_HALF,
    DISK_FAULTS,
    DISK_IS_FINE
};

struct memory_disk {
    std::map<std::string, bytes> files;
    std::deque<std::pair<int, std::int32_t>> faults;  // each after so many calls without
    int open_descriptors;
};
inline memory_disk disk;

// Registers both; later calls do nothing.
void memory_disk_register();

#endif
