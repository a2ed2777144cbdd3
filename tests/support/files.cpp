#include "support/files.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>

#include <unistd.h>

scratch_folder::scratch_folder()
{
    std::string pattern = (std::filesystem::temp_directory_path() / "imgfile-XXXXXX").string();
    if (::mkdtemp(pattern.data()) == nullptr) std::abort();
    m_path = pattern;
}

bytes read_file(const std::string &path)
{
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), {}};
}

void write_file(const std::string &path, const bytes &content)
{
    std::ofstream out(path, std::ios::binary);
    std::copy(content.begin(), content.end(), std::ostreambuf_iterator<char>(out));
}

stderr_capture::stderr_capture() : m_stderr(::dup(STDERR_FILENO)), m_file(std::tmpfile())
{
    std::fflush(stderr);
    ::dup2(::fileno(m_file), STDERR_FILENO);
}

stderr_capture::~stderr_capture()
{
    ::dup2(m_stderr, STDERR_FILENO);
    ::close(m_stderr);
    std::fclose(m_file);
}

std::string stderr_capture::text()
{
    const int fd = ::fileno(m_file);
    std::string text(static_cast<std::size_t>(::lseek(fd, 0, SEEK_END)), '\0');
    if (::pread(fd, text.data(), text.size(), 0) == -1) std::abort();
    return text;
}

std::string perror_line(const std::string &prefix, int error)
{
    return prefix + ": " + std::strerror(error) + "\n";
}
