// Descriptors of the operating system's files.
#ifndef TOOL_FILE_DESCRIPTOR_H
#define TOOL_FILE_DESCRIPTOR_H

#include <string>
#include <utility>

// Closes its file when it goes out of scope.
class file_descriptor {
public:
    explicit file_descriptor(int fd) : m_fd(fd) {}
    file_descriptor(file_descriptor &&other) noexcept : m_fd(other.release()) {}
    file_descriptor(const file_descriptor &) = delete;
    file_descriptor &operator=(const file_descriptor &) = delete;
    file_descriptor &operator=(file_descriptor &&) = delete;
    ~file_descriptor();

    operator int() const { return m_fd; }
    int release() { return std::exchange(m_fd, -1); }

private:
    int m_fd;  // -1: none
};

// A name under which an open file can be opened once more.
std::string path_of_descriptor(int fd);

// Opens for reading the file that `fd` has open, with a position of its own. Throws `failure`,
// which gives the file the name `name`.
int open_again(int fd, const std::string &name);

#endif
