// imgfile_bench: how long the library takes for twelve everyday tasks, beside candidates written by
// hand for the same task and beside other libraries. The tasks are defined below, in make_tasks.
//
// imgfile_bench [--small] [--dir=FOLDER] [--json=FILE] [--list | --scaling | --threads | TASK...]
//   TASK      T1 to T12; without a name, all
//   --list    prints the tasks
//   --small   tiny images and two rounds, to check that everything works and all candidates agree
//   --dir     folder for the images: 1 GB, and half as much for other libraries. They are removed
//   at
//             the end. Default: the folder for temporary files
//   --json    also writes the medians to a file
//   --scaling how the library's times grow with images, windows, tiles and bands
//   --threads how many windows threads read, beside as many processes
// Options of Google Benchmark are accepted, too. Exit status: 1 if candidates read or write
// different bytes, or if anything fails; 2 for an unknown argument. Read task.h first, then
// measure.h.
#include "bench_folder.h"
#include "measure.h"

#include "base/count.h"

#include <algorithm>
#include <benchmark/benchmark.h>
#include <cstdio>
#include <cstdlib>
#include <stdexcept>

namespace {

// Windows are placed at random, strips cover a whole image. Images have 8192 x 8192 samples of one
// byte, or of two where it says so, and tiles 256 x 256. Two-byte samples arrive as bytes,
// stretched.
std::vector<task> make_tasks(const image_set &images)
{
    const auto anywhere = [&](std::size_t count, std::int32_t nlines, std::int32_t nsamps) {
        return windows_anywhere(images, count, nlines, nsamps);
    };
    const std::int32_t side = images.side, tile = images.tile, strip = STRIP_LINES;
    const auto area = [](std::int32_t nlines, std::int32_t nsamps) {
        return img_count(nlines) * img_count(nsamps);
    };
    const std::size_t run_size = 32 * area(tile, tile);
    const std::size_t facts = 5 * sizeof(std::int32_t);  // lines, samples, tile sizes, bands
    return {
        {"T1", "untiled, 512 x 512", 1.4, anywhere(300, 512, 512), area(512, 512), {}},
        {"T2", "untiled, 64 x 64", 1.7, anywhere(6000, 64, 64), area(64, 64), {}},
        {"T3", "untiled, 64 lines", 1.15, anywhere(200, 64, side), area(64, side), {}},
        {"T4", "tiled, 512 x 512", 1.2, anywhere(300, 512, 512), area(512, 512), {}},
        {"T5", "tiled, 64 x 64", 1.6, anywhere(6000, 64, 64), area(64, 64), {}},
        {"T6", "tiled two-byte, 512 x 512", 1.2, anywhere(80, 512, 512), area(512, 512), {}},
        {"T7", "untiled two-byte, 512 x 512", 1.3, anywhere(80, 512, 512), area(512, 512), {}},
        {"T8", "write untiled, 512 lines", 1.2, strips(images, strip), area(strip, side), {}},
        {"T9", "write tiled, 256 lines", 1.25, strips(images, tile), area(tile, side), {}},
        {"T10", "write tiled, 200 x 200", 1.3, anywhere(300, 200, 200), area(200, 200), {}},
        {"T11", "whole tiles, runs of 32", 1.1, tile_runs(images, 60, 32), run_size, {}},
        {"T12", "open, query, close", 1.6, std::vector<request>(1000), facts, {}},
    };
}

struct options {
    bool list = false, small = false, scaling = false, threads = false;
    std::filesystem::path folder = std::filesystem::temp_directory_path();
    std::string json = {};
    std::vector<std::string> tasks = {};
};

// Returns false for an unknown argument.
bool take_argument(const std::string &argument, options &asked)
{
    if (argument == "--list")
        asked.list = true;
    else if (argument == "--small")
        asked.small = true;
    else if (argument == "--scaling")
        asked.scaling = true;
    else if (argument == "--threads")
        asked.threads = true;
    else if (argument.starts_with("--json="))
        asked.json = argument.substr(7);
    else if (argument.starts_with("T"))
        asked.tasks.push_back(argument);
    else
        return take_folder(argument, &asked.folder);
    return true;
}

std::vector<task> tasks_with_candidates(const image_set &images)
{
    make_files(images);
    std::vector<task> tasks = make_tasks(images);
    add_imgfile(images, tasks);
    add_limits(images, tasks);
#ifdef HAVE_LIBTIFF
    add_libtiff(images, tasks);
#endif
#ifdef HAVE_GDAL
    add_gdal(images, tasks);
#endif
    return tasks;
}

int run(const options &asked)
{
    if (asked.list) {
        for (const task &each : make_tasks({.folder = {}, .side = FULL_SIDE, .tile = FULL_TILE}))
            std::printf("%-4s%s\n", each.name.c_str(), each.title.c_str());
        return 0;
    }
    const bench_folder folder(asked.folder);
    const image_set images{folder.path(), asked.small ? SMALL_SIDE : FULL_SIDE,
                           asked.small ? SMALL_TILE : FULL_TILE};
    if (asked.threads) {
        make_files(images);
        measure_threads(images, make_tasks(images), asked.small);
        return 0;
    }
    medians times;
    if (asked.scaling) {
        register_scaling(images, asked.small);
        times = measure_registered();
    } else {
        std::vector<task> tasks = tasks_with_candidates(images);
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
    // All candidates take turns, so that changes of the machine's speed meet each of them.
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
                         "[--dir=FOLDER] [--json=FILE] [--list | --scaling | --threads | "
                         "TASK...]\n",
                         argument.c_str());
            return 2;
        }
        return run(asked);
    } catch (const std::exception &error) {
        std::fprintf(stderr, "imgfile_bench: %s\n", error.what());
        return 1;
    }
}
