// The local time, for the date in a new header.
#ifndef IMG_LOCAL_TIME_H
#define IMG_LOCAL_TIME_H

#include <array>
#include <cstdint>

// Returns years since 1900 (their low 8 bits), month 0..11, day 1..31, hour, minute and second; all
// 0 when the time is not available.
std::array<std::uint8_t, 6> img_local_time();

#endif
