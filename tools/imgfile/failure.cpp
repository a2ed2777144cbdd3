// Making and printing the lines in which the tool reports failures. Read failure.h first.
#include "failure.h"

#include <algorithm>
#include <cstdio>
#include <cstring>

std::string in_one_line(std::string name)
{
    std::ranges::replace_if(
        name, [](unsigned char c) { return c < ' ' || c == 0x7f; }, '?');
    return name;
}

std::string system_text(int error)
{
    return std::strerror(error);
}

failure::failure(const std::string &file, const std::string &reason)
    : std::runtime_error(in_one_line(file + ": " + reason))
{
}

void print_failure(const std::string &line)
{
    std::fflush(stdout);
    std::fprintf(stderr, "imgfile: %s\n", line.c_str());
}
