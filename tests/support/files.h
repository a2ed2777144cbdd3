// Scratch files and the standard error stream, as tests see them.
#ifndef IMG_TEST_FILES_H
#define IMG_TEST_FILES_H

#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <string>
#include <vector>

using bytes = std::vector<std::uint8_t>;

// A folder of its own for one test, removed with all that is in it.
class scratch_folder {
public:
    scratch_folder();
    ~scratch_folder() { std::filesystem::remove_all(m_path); }
    scratch_folder(const scratch_folder &) = delete;
    scratch_folder &operator=(const scratch_folder &) = delete;
    std::string operator/(const std::string &name) const { return m_path / name; }

private:
    std::filesystem::path m_path;
};

bytes read_file(const std::string &path);
void write_file(const std::string &path, const bytes &content);

// What is written to the standard error stream while it lives.
class stderr_capture {
public:
    stderr_capture();
    ~stderr_capture();
    stderr_capture(const stderr_capture &) = delete;
    stderr_capture &operator=(const stderr_capture &) = delete;
    std::string text();

private:
    int m_stderr;
    std::FILE *m_file;
};

// Returns what `action` writes to the standard error stream.
template <typename Action>
std::string printed_by(Action action)
{
    stderr_capture capture;
    action();
    return capture.text();
}

// What the system calls an error number, as perror prints it after `prefix`.
std::string perror_line(const std::string &prefix, int error);

#endif
