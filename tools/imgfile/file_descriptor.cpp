// Closing and reopening descriptors. Assumes that /proc is mounted. Read file_descriptor.h first.
#include "file_descriptor.h"

#include "failure.h"

#include <cerrno>

#include <fcntl.h>
#include <unistd.h>

file_descriptor::~file_descriptor()
{
    if (m_fd != -1) ::close(m_fd);
}

std::string path_of_descriptor(int fd)
{
    return text("/proc/self/fd/", fd);
}

int open_again(int fd, const std::string &name)
{
    const int again = ::open(path_of_descriptor(fd).c_str(), O_RDONLY | O_CLOEXEC);
    if (again == -1) throw failure(name, "cannot be read: " + system_text(errno));
    return again;
}
