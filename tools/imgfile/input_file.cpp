// Opening the file that a command reads, and copying standard input to a file that can be read more
// than once. Read input_file.h first.
#include "input_file.h"

#include "failure.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

constexpr const char *STANDARD_INPUT = "standard input";

// Opens a file that has no name, in a folder that may hold large ones.
int open_temporary()
{
    const char *const chosen = std::getenv("TMPDIR");
    std::string path = std::string(chosen != nullptr ? chosen : "/var/tmp") + "/imgfile_XXXXXX";
    const int fd = ::mkostemp(path.data(), O_CLOEXEC);
    if (fd == -1) throw failure(path, system_text(errno));
    ::unlink(path.c_str());
    return fd;
}

// Copies standard input to a temporary file.
int spool_standard_input()
{
    file_descriptor file(open_temporary());
    const auto fail = [](const char *problem) {
        throw failure(STANDARD_INPUT, problem + system_text(errno));
    };
    std::array<char, 65536> bytes;
    for (;;) {
        const ssize_t got = ::read(STDIN_FILENO, bytes.data(), bytes.size());
        if (got == 0) return file.release();
        if (got == -1 && errno != EINTR) fail("cannot be read: ");
        for (ssize_t done = 0; done < got;) {
            const ssize_t written =
                ::write(file, bytes.data() + done, static_cast<std::size_t>(got - done));
            if (written == -1 && errno != EINTR) fail("cannot be copied to a temporary file: ");
            done += std::max<ssize_t>(written, 0);
        }
    }
}

int open_to_read(const std::string &name)
{
    if (name == "-") {
        static const int spool = spool_standard_input();
        return open_again(spool, STANDARD_INPUT);
    }
    return ::open(name.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
}

}  // namespace

input_file::input_file(const std::string &name)
    : m_name(name == "-" ? STANDARD_INPUT : name), m_is_standard_input(name == "-"),
      m_file(open_to_read(name))
{
    struct stat status;
    if (m_file == -1 || ::fstat(m_file, &status) == -1) throw failure(m_name, system_text(errno));
    if (!S_ISREG(status.st_mode) && !S_ISBLK(status.st_mode))
        throw failure(m_name, S_ISDIR(status.st_mode) ? "is a folder" : "is not a regular file");
    m_identity = {status.st_dev, status.st_ino};
    if (S_ISREG(status.st_mode) && !m_is_standard_input) m_length = status.st_size;
}

std::string input_file::bytes(std::int64_t offset, std::size_t count) const
{
    std::string bytes(count, '\0');
    const ssize_t got = ::pread(m_file, bytes.data(), count, std::max<std::int64_t>(offset, 0));
    bytes.resize(static_cast<std::size_t>(std::max<ssize_t>(got, 0)));
    return bytes;
}

std::string input_file::last_bytes(std::size_t count) const
{
    const std::int64_t end = ::lseek(m_file, 0, SEEK_END);
    ::lseek(m_file, 0, SEEK_SET);
    return bytes(end - static_cast<std::int64_t>(count), count);
}
