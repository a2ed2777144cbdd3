// The file that a command reads. It is opened once; everything that the command says about it comes
// from this one descriptor, even when the file is replaced in the meantime.
#ifndef TOOL_INPUT_FILE_H
#define TOOL_INPUT_FILE_H

#include "file_descriptor.h"

#include <cstdint>
#include <string>

#include <sys/types.h>

// What distinguishes a file from all others.
struct file_identity {
    dev_t device;
    ino_t inode;
    bool operator==(const file_identity &) const = default;
};

class input_file {
public:
    // Opens the file; "-" is standard input, which is first copied to a temporary file. Throws
    // `failure` when it cannot be opened or is neither a regular file nor a block device.
    explicit input_file(const std::string &name);

    const std::string &name() const { return m_name; }  // "standard input" for "-"
    bool is_standard_input() const { return m_is_standard_input; }
    file_identity identity() const { return m_identity; }
    // In bytes, when the file was opened; -1 for standard input and block devices.
    std::int64_t length() const { return m_length; }

    int fd() const { return m_file; }
    int release() { return m_file.release(); }  // the caller closes it
    // Returns bytes of the file; fewer than asked when it ends, or cannot be read.
    std::string bytes(std::int64_t offset, std::size_t count) const;
    // Returns the last bytes of the file.
    std::string last_bytes(std::size_t count) const;

private:
    std::string m_name;
    bool m_is_standard_input;
    file_descriptor m_file;
    file_identity m_identity{};
    std::int64_t m_length = -1;
};

#endif
