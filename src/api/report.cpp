#include "api/report.h"

#include <cstdarg>
#include <cstdio>

std::int32_t img_fail(const char *format, ...)
{
    std::va_list arguments;
    va_start(arguments, format);
    std::vfprintf(stderr, format, arguments);
    va_end(arguments);
    return -1;
}

std::int32_t img_fail_errno(const char *prefix)
{
    std::perror(prefix);
    return -1;
}
