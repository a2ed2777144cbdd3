// Files that are complete or do not exist.
#ifndef TOOL_OUTPUT_FILE_H
#define TOOL_OUTPUT_FILE_H

#include "input_file.h"

#include <cstdint>
#include <optional>
#include <string>

// A file that becomes `name` once it is complete. Until then it has no name, or, where the file
// system requires one, a temporary name beside the target, which is removed when the work fails or
// is interrupted. "-" is standard output.
class output_file {
public:
    // Throws `failure` when the target exists and `overwrite` is not set, is the file `input`, is
    // not a regular file, or its folder accepts no files.
    output_file(const std::string &name, bool overwrite,
                std::optional<file_identity> input = std::nullopt);
    ~output_file();
    output_file(const output_file &) = delete;
    output_file &operator=(const output_file &) = delete;

    const std::string &name() const { return m_name; }
    bool is_standard_output() const { return m_name == "-"; }
    int fd() const { return m_fd; }
    // A name under which the file can be opened.
    std::string path() const;

    // Reserves room for `length` bytes, all of which must be written later.
    void reserve(std::int64_t length);
    // Write all bytes: after those written before, or at an offset (not to standard output).
    void write(const void *bytes, std::size_t count);
    void write_at(std::int64_t offset, const void *bytes, std::size_t count);
    // Checks the length (-1: unknown), flushes the bytes to the disk, and gives the file its name.
    void commit(std::int64_t length);

private:
    void open_without_name(const std::string &folder);
    void open_beside();
    template <typename Write>
    void write_all(const void *bytes, std::size_t count, Write write);
    [[noreturn]] void fail(int error) const;

    std::string m_name, m_target;  // the target without symbolic links
    std::string m_temporary;       // empty: the file has no name
    bool m_overwrite;
    unsigned m_mode = 0;
    int m_fd = -1;
};

#endif
