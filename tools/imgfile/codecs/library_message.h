// The library's messages, which the tool reports in words of its own.
#ifndef TOOL_LIBRARY_MESSAGE_H
#define TOOL_LIBRARY_MESSAGE_H

#include <string>

// The last system error that the library reported.
class library_message {
public:
    static void collect();  // from now on, the library prints nothing
    static void forget();
    // Returns the system's text for the last error since forget(); `otherwise` if there was none.
    static std::string reason(const std::string &otherwise);
};

#endif
