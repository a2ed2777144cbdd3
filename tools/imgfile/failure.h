// What goes wrong, in the words of the people whose files these are.
#ifndef TOOL_FAILURE_H
#define TOOL_FAILURE_H

#include <algorithm>
#include <cstring>
#include <sstream>
#include <stdexcept>
#include <string>

// A name as it can be part of a line.
inline std::string in_one_line(std::string name)
{
    std::ranges::replace_if(
        name, [](unsigned char c) { return c < ' ' || c == 0x7f; }, '?');
    return name;
}

// The work on a file failed. what() is one line, "FILE: what is wrong with it".
class failure : public std::runtime_error {
public:
    failure(const std::string &file, const std::string &what)
        : std::runtime_error(in_one_line(file + ": " + what))
    {
    }
};

// The command line asks for something that cannot be meant.
class wrong_usage : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// Joins numbers and texts: text("line ", 7).
template <typename... Parts>
std::string text(const Parts &...parts)
{
    std::ostringstream out;
    (out << ... << parts);
    return out.str();
}

inline std::string system_text(int error)
{
    return std::strerror(error);
}

#endif
