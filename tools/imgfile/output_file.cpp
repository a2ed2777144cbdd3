// Files without a name until they are complete, and temporary names where that is not possible.
// Read output_file.h first.
#include "output_file.h"

#include "failure.h"
#include "file_descriptor.h"

#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <filesystem>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// The temporary name of the output, for the signal handler; empty: none.
std::array<char, 4096> file_to_remove{};

void remove_and_end(int signal)
{
    if (file_to_remove[0] != '\0') ::unlink(file_to_remove.data());
    std::signal(signal, SIG_DFL);
    ::raise(signal);
}

void remove_when_ended(const std::string &path)
{
    file_to_remove[path.copy(file_to_remove.data(), file_to_remove.size() - 1)] = '\0';
    for (const int signal : {SIGHUP, SIGINT, SIGTERM, SIGXCPU})
        if (std::signal(signal, remove_and_end) == SIG_IGN) std::signal(signal, SIG_IGN);
}

std::string folder_of(const std::string &path)
{
    const std::string folder = std::filesystem::path(path).parent_path();
    return folder.empty() ? "." : folder;
}

// An unused name for a file beside `target`.
std::string name_beside(const std::string &target)
{
    const std::filesystem::path path(target);
    return (std::filesystem::path(folder_of(target)) /
            text(".", path.filename().string().substr(0, 200), ".",
                 std::chrono::system_clock::now().time_since_epoch().count(), ".part"))
        .string();
}

}  // namespace

output_file::output_file(const std::string &name, bool overwrite,
                         std::optional<file_identity> input)
    : m_name(name), m_target(name), m_overwrite(overwrite)
{
    if (is_standard_output()) {
        m_fd = STDOUT_FILENO;
        return;
    }
    struct stat target;
    const bool exists = ::stat(name.c_str(), &target) == 0;
    if (exists) {
        if (input == file_identity{target.st_dev, target.st_ino})
            throw failure(name, "is the input file");
        if (!S_ISREG(target.st_mode)) throw failure(name, "exists and is not a regular file");
        if (!overwrite) throw failure(name, "exists; --overwrite replaces it");
        std::error_code error;
        m_target = std::filesystem::canonical(name, error);
        if (error) fail(error.value());
    } else if (::lstat(name.c_str(), &target) == 0) {
        throw failure(name, "is a dangling symbolic link");
    }
    const mode_t mask = ::umask(0);
    ::umask(mask);
    m_mode = exists ? target.st_mode & 07777U : 0666U & ~mask;
    open_without_name(folder_of(m_target));
    if (m_fd == -1) open_beside();
    ::fchmod(m_fd, m_mode);
}

// A file without a name disappears with the program, however that ends.
void output_file::open_without_name(const std::string &folder)
{
    m_fd = ::open(folder.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600);
    if (m_fd == -1) return;
    if (::access(path_of_descriptor(m_fd).c_str(), R_OK | W_OK) == 0) return;
    ::close(m_fd);
    m_fd = -1;
}

void output_file::open_beside()
{
    m_temporary = name_beside(m_target);
    remove_when_ended(m_temporary);
    m_fd = ::open(m_temporary.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
    if (m_fd == -1) {
        m_temporary.clear();
        fail(errno);
    }
}

output_file::~output_file()
{
    if (is_standard_output()) return;
    if (!m_temporary.empty()) ::unlink(m_temporary.c_str());
    file_to_remove[0] = '\0';
    ::close(m_fd);
}

std::string output_file::path() const
{
    return m_temporary.empty() ? path_of_descriptor(m_fd) : m_temporary;
}

void output_file::fail(int error) const
{
    throw failure(is_standard_output() ? "standard output" : m_name,
                  "cannot be written: " + system_text(error));
}

void output_file::reserve(std::int64_t length)
{
    if (length == 0) return;
    int result;
    do {
        result = ::fallocate(m_fd, 0, 0, length);
    } while (result == -1 && errno == EINTR);
    if (result == 0) return;
    if (errno != EOPNOTSUPP && errno != ENOSYS) fail(errno);
    if (::ftruncate(m_fd, length) == -1) fail(errno);
}

template <typename Write>
void output_file::write_all(const void *bytes, std::size_t count, Write write)
{
    for (std::size_t done = 0; done < count;) {
        const ssize_t written = write(static_cast<const char *>(bytes) + done, count - done, done);
        if (written == -1 && errno == EINTR) continue;
        if (written == -1) fail(errno);
        done += static_cast<std::size_t>(written);
    }
}

void output_file::write(const void *bytes, std::size_t count)
{
    write_all(bytes, count, [this](const char *next, std::size_t left, std::size_t /*done*/) {
        return ::write(m_fd, next, left);
    });
}

void output_file::write_at(std::int64_t offset, const void *bytes, std::size_t count)
{
    write_all(bytes, count, [=, this](const char *next, std::size_t left, std::size_t done) {
        return ::pwrite(m_fd, next, left, offset + static_cast<std::int64_t>(done));
    });
}

void output_file::commit(std::int64_t length)
{
    if (is_standard_output()) return;
    struct stat status;
    if (::fstat(m_fd, &status) == -1) fail(errno);
    if (length != -1 && status.st_size != length)
        throw failure(m_name, text("has ", status.st_size, " bytes instead of ", length));
    if (::fsync(m_fd) == -1) fail(errno);

    if (m_temporary.empty()) {
        const std::string complete = m_overwrite ? name_beside(m_target) : m_target;
        if (m_overwrite) remove_when_ended(complete);
        if (::linkat(AT_FDCWD, path_of_descriptor(m_fd).c_str(), AT_FDCWD, complete.c_str(),
                     AT_SYMLINK_FOLLOW) == -1)
            fail(errno);
        if (m_overwrite) m_temporary = complete;
    }
    // Without --overwrite, a file created in the meantime is not replaced.
    if (!m_temporary.empty() &&
        ::renameat2(AT_FDCWD, m_temporary.c_str(), AT_FDCWD, m_target.c_str(),
                    m_overwrite ? 0 : RENAME_NOREPLACE) == -1)
        fail(errno);
    m_temporary.clear();
    file_to_remove[0] = '\0';

    const int folder = ::open(folder_of(m_target).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (folder != -1) {
        ::fsync(folder);
        ::close(folder);
    }
}
