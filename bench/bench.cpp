// imgfile_bench: what the library takes for everyday tasks, beside what can be had by hand.
//
// imgfile_bench [--small] [--dir=FOLDER] [--json=FILE] [--scaling | TASK...]
//   TASK      T1 to T12; all of them when none is named
//   --small   tiny images and two rounds: does everything work, and do all agree?
//   --dir     where the images are made, 1 GB of them and half as much for peers; they are removed
//             at the end. Without it the folder for temporary files.
//   --json    where the medians are written to, beside the table
//   --scaling how the costs of the library alone grow with images, windows, tiles and bands
// Options of Google Benchmark are taken, too. Exit status 1 when candidates differ in what they
// read or write, or when something fails.
#include "measure.h"

#include <algorithm>
#include <benchmark/benchmark.h>
#include <cstdio>
#include <cstdlib>
#include <stdexcept>

#include <unistd.h>

namespace {

// A folder that is removed with all that is in it.
class scratch_folder {
public:
    explicit scratch_folder(const std::filesystem::path &parent)
    {
        std::string name = parent / "imgfile_bench_XXXXXX";
        if (::mkdtemp(name.data()) == nullptr)
            throw std::runtime_error("no folder in " + parent.string());
        m_path = name;
    }
    ~scratch_folder()
    {
        std::error_code ignored;
        std::filesystem::remove_all(m_path, ignored);
    }
    scratch_folder(const scratch_folder &) = delete;
    scratch_folder &operator=(const scratch_folder &) = delete;
    const std::filesystem::path &path() const { return m_path; }

private:
    std::filesystem::path m_path;
};

struct options {
    bool small = false, scaling = false;
    std::filesystem::path folder = std::filesystem::temp_directory_path();
    std::string json = {};
    std::vector<std::string> tasks = {};
};

// Returns false for an argument that nobody knows.
bool take_argument(const std::string &argument, options &asked)
{
    if (argument == "--small")
        asked.small = true;
    else if (argument == "--scaling")
        asked.scaling = true;
    else if (argument.starts_with("--dir="))
        asked.folder = argument.substr(6);
    else if (argument.starts_with("--json="))
        asked.json = argument.substr(7);
    else if (argument.starts_with("T"))
        asked.tasks.push_back(argument);
    else
        return false;
    return true;
}

std::vector<task> tasks_with_candidates(const scene &at)
{
    make_files(at);
    std::vector<task> tasks = make_tasks(at);
    add_imgfile(at, tasks);
    add_limits(at, tasks);
#ifdef HAVE_LIBTIFF
    add_libtiff(at, tasks);
#endif
#ifdef HAVE_GDAL
    add_gdal(at, tasks);
#endif
    return tasks;
}

int run(const options &asked)
{
    const scratch_folder folder(asked.folder);
    const scene at{folder.path(), asked.small ? 256 : 8192, asked.small ? 32 : 256};
    medians times;
    if (asked.scaling) {
        register_scaling(at, asked.small);
        times = measure_registered();
    } else {
        std::vector<task> tasks = tasks_with_candidates(at);
        let_files_rest();
        std::erase_if(tasks, [&asked](const task &each) {
            return !asked.tasks.empty() && std::ranges::count(asked.tasks, each.name) == 0;
        });
        if (tasks.empty()) throw std::runtime_error("no such task");
        if (!agree(tasks)) return 1;
        times = measure(tasks, asked.small ? 2 : 15);
    }
    if (!asked.json.empty()) write_json(asked.json, times);
    return 0;
}

}  // namespace

int main(int argc, char **argv)
{
    // Rounds of all candidates in turn, so that a machine that changes its speed does so for all.
    std::string interleaved = "--benchmark_enable_random_interleaving=true";
    std::vector<char *> arguments(argv, argv + argc);
    arguments.insert(arguments.begin() + 1, interleaved.data());
    auto count = static_cast<int>(arguments.size());
    benchmark::Initialize(&count, arguments.data());

    try {
        options asked;
        for (int i = 1; i < count; ++i) {
            const std::string argument = arguments[static_cast<std::size_t>(i)];
            if (take_argument(argument, asked)) continue;
            std::fprintf(stderr,
                         "imgfile_bench: unknown argument %s\nusage: imgfile_bench [--small] "
                         "[--dir=FOLDER] [--json=FILE] [--scaling | TASK...]\n",
                         argument.c_str());
            return 2;
        }
        return run(asked);
    } catch (const std::exception &error) {
        std::fprintf(stderr, "imgfile_bench: %s\n", error.what());
        return 1;
    }
}
