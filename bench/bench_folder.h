// A folder for the files of a benchmark.
#ifndef BENCH_FOLDER_H
#define BENCH_FOLDER_H

#include <cstdlib>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <string_view>
#include <system_error>

// A folder that is removed with its content.
class bench_folder {
public:
    explicit bench_folder(const std::filesystem::path &parent)
    {
        std::string name = parent / "imgfile_bench_XXXXXX";
        if (::mkdtemp(name.data()) == nullptr)
            throw std::runtime_error("no folder in " + parent.string());
        m_path = name;
    }
    ~bench_folder()
    {
        std::error_code ignored;
        std::filesystem::remove_all(m_path, ignored);
    }
    bench_folder(const bench_folder &) = delete;
    bench_folder &operator=(const bench_folder &) = delete;
    const std::filesystem::path &path() const { return m_path; }

private:
    std::filesystem::path m_path;
};

// Takes the argument --dir=FOLDER. Returns false for any other one.
inline bool take_folder(const std::string &argument, std::filesystem::path *folder)
{
    constexpr std::string_view key = "--dir=";
    if (!argument.starts_with(key)) return false;
    *folder = argument.substr(key.size());
    return true;
}

#endif
