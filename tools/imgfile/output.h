// Files that are there whole or not at all.
#ifndef TOOL_OUTPUT_H
#define TOOL_OUTPUT_H

#include <cstdint>
#include <string>

// A file that is to become `name` once it is complete. Until then it has no name where the file
// system can do that, else a temporary one beside the target, which is removed when the work fails
// or is interrupted. "-" is standard output.
class output_file {
public:
    // Throws `failure`: the target exists and must not be overwritten, is one of the files that
    // are read (`input`, "" for none), is not a regular file, or its folder takes no files.
    output_file(const std::string &name, bool overwrite, const std::string &input);
    ~output_file();
    output_file(const output_file &) = delete;
    output_file &operator=(const output_file &) = delete;

    const std::string &name() const { return m_name; }
    bool is_standard_output() const { return m_name == "-"; }
    int fd() const { return m_fd; }
    // By which name others can open the file.
    std::string path() const;

    // Reserves the room for `length` bytes, all of which are to be written.
    void reserve(std::int64_t length);
    // Write all of the bytes: after those before, or, not to standard output, at a place.
    void write(const void *bytes, std::size_t count);
    void write_at(std::int64_t offset, const void *bytes, std::size_t count);
    // Checks the length (-1: not known), gets the bytes to the disk, and gives the file its name.
    void commit(std::int64_t length);

private:
    void open_without_name(const std::string &folder);
    void open_beside();
    template <typename Write>
    void write_all(const void *bytes, std::size_t count, Write write);
    [[noreturn]] void fail(int error) const;

    std::string m_name, m_target;  // the latter without symbolic links
    std::string m_temporary;       // "": the file has no name
    bool m_overwrite;
    unsigned m_mode = 0;
    int m_fd = -1;
};

#endif
