// Files of the operating system.
#ifndef TOOL_DESCRIPTOR_H
#define TOOL_DESCRIPTOR_H

#include "failure.h"

#include <cerrno>
#include <utility>

#include <fcntl.h>
#include <unistd.h>

// Closes the file when it goes out of scope.
class descriptor {
public:
    explicit descriptor(int fd) : m_fd(fd) {}
    ~descriptor()
    {
        if (m_fd != -1) ::close(m_fd);
    }
    descriptor(const descriptor &) = delete;
    descriptor &operator=(const descriptor &) = delete;
    operator int() const { return m_fd; }
    int release() { return std::exchange(m_fd, -1); }

private:
    int m_fd;
};

inline std::string path_of_descriptor(int fd)
{
    return text("/proc/self/fd/", fd);
}

// Opens for reading what `fd` has open, with a position of its own. `name` is the one in failures.
inline int open_again(int fd, const std::string &name)
{
    const int again = ::open(path_of_descriptor(fd).c_str(), O_RDONLY | O_CLOEXEC);
    if (again == -1) throw failure(name, "cannot be read: " + system_text(errno));
    return again;
}

#endif
