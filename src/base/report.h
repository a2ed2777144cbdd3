// One line on the standard error stream, then -1: how every operation of the library fails.
#ifndef IMG_REPORT_H
#define IMG_REPORT_H

#include <cstdint>

// Takes a message of the library: the text without its line feed, and errno as it was, 0 if the
// text has nothing to do with it.
using img_message_fn = void (*)(const char *text, int error);
inline img_message_fn img_message_sink = nullptr;  // null: the standard error stream

// Prints the formatted text, which ends in a line feed, and returns -1.
[[gnu::format(printf, 1, 2)]] std::int32_t img_fail(const char *format, ...);

// Prints `prefix`, a colon, a blank and the system's description of errno; returns -1.
std::int32_t img_fail_errno(const char *prefix);

#endif
