// Printing messages, or handing them to a sink. Read report.h first.
#include "base/report.h"

#include <array>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <utility>

constinit thread_local img_message_fn img_message_sink = nullptr;

namespace {

constinit thread_local int last_error_kept = 0;

void keep_error(const char * /*text*/, int error)
{
    if (error != 0) last_error_kept = error;
}

}  // namespace

img_message_keeper::img_message_keeper() : m_outer{std::exchange(img_message_sink, keep_error)}
{
    last_error_kept = 0;
}

img_message_keeper::~img_message_keeper()
{
    img_message_sink = m_outer;
}

int img_message_keeper::last_error()
{
    return last_error_kept;
}

std::int32_t img_fail(const char *format, ...)
{
    std::va_list arguments;
    va_start(arguments, format);
    if (img_message_sink != nullptr) {
        std::array<char, 512> text;
        std::vsnprintf(text.data(), text.size(), format, arguments);
        text[std::strcspn(text.data(), "\n")] = '\0';
        img_message_sink(text.data(), 0);
    } else {
        std::vfprintf(stderr, format, arguments);
    }
    va_end(arguments);
    return -1;
}

std::int32_t img_fail_errno(const char *prefix)
{
    if (img_message_sink != nullptr) {
        img_message_sink(prefix, errno);
        return -1;
    }
    ::flockfile(stderr);  // perror may print through another stream
    std::perror(prefix);
    ::funlockfile(stderr);
    return -1;
}
