// How an operation of the library fails: one line on the standard error stream, then -1.
#ifndef IMG_REPORT_H
#define IMG_REPORT_H

#include <cstdint>

// Takes a message of the library: the text without its line feed, and the errno value that belongs
// to it, 0 if none does.
using img_message_fn = void (*)(const char *text, int error);
// Where the messages of this thread's calls go; null: the standard error stream, where lines of
// several threads never mix.
extern constinit thread_local img_message_fn img_message_sink;

// While it lives, messages of this thread's calls are kept instead of printed.
class img_message_keeper {
public:
    img_message_keeper();  // forgets earlier errors
    ~img_message_keeper();
    img_message_keeper(const img_message_keeper &) = delete;
    img_message_keeper &operator=(const img_message_keeper &) = delete;

    // Returns the last errno value of a message that this thread's keepers took since the newest
    // was made; 0 if none had one.
    static int last_error();

private:
    img_message_fn m_outer;
};

// Prints the formatted text, which ends in a line feed, and returns -1.
[[gnu::format(printf, 1, 2)]] std::int32_t img_fail(const char *format, ...);

// Prints `prefix`, a colon, a blank and the system's description of errno; returns -1.
std::int32_t img_fail_errno(const char *prefix);

#endif
