// Failures of the tool: one line each, which names the file and says what is wrong.
#ifndef TOOL_FAILURE_H
#define TOOL_FAILURE_H

#include <sstream>
#include <stdexcept>
#include <string>

// A name as part of a line: control characters become "?".
std::string in_one_line(std::string name);

// The system's text for an error number.
std::string system_text(int error);

// The work on a file failed. what() is one line: "FILE: what is wrong".
class failure : public std::runtime_error {
public:
    failure(const std::string &file, const std::string &reason);
};

// The command line makes no sense.
class wrong_usage : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// Prints a failure to standard error, after all that was printed before it.
void print_failure(const std::string &line);

// Joins numbers and texts: text("line ", 7).
template <typename... Parts>
std::string text(const Parts &...parts)
{
    std::ostringstream out;
    (out << ... << parts);
    return out.str();
}

#endif
