// What is measured: tasks, and the candidates that carry them out.
#ifndef BENCH_TASK_H
#define BENCH_TASK_H

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <vector>

// A window of an image, or with `nsamps` 0 a run of `nlines` tiles from tile `line` on.
struct window {
    std::int32_t line, samp, nlines, nsamps;
};

// The images of a run: squares of `side` samples, those in tiles with tiles of `tile` samples.
struct scene {
    std::filesystem::path folder;
    std::int32_t side, tile;

    std::string path(const std::string &name) const { return folder / name; }
    static constexpr std::int32_t strip_lines = 512;
    static constexpr std::size_t data_offset = 244;  // of all its files
};

// One way to carry out a task. `move` handles one window: what it reads goes to the buffer, what
// it writes comes from there.
struct candidate {
    std::string name;
    bool is_limit = false;  // written by hand for this task alone
    std::function<void(const window &, std::uint8_t *buffer)> move;
    std::function<void()> begin = {}, end = {};  // around all windows, and not timed
    std::string written = {};                    // the file that it writes; empty: it reads
    std::size_t skipped = scene::data_offset;    // bytes of that file before its samples,
    std::size_t samples = SIZE_MAX;              // and how many of these there are at most
};

struct task {
    std::string name, title;
    double to_reach;  // of the ratio to the better limit
    std::vector<window> windows;
    std::size_t buffer_size;  // what a window takes
    std::vector<candidate> candidates;
};

// Waits until files were written long enough ago for any candidate to trust what it keeps of them.
void let_files_rest();
// Makes the files of a scene. Its folder must exist.
void make_files(const scene &at);
// The samples of a line, 8 or 12 bits deep; what all files of a scene hold.
std::vector<std::uint8_t> line_of_bytes(const scene &at, std::int32_t line);
std::vector<std::uint16_t> line_of_words(const scene &at, std::int32_t line);

// The twelve tasks, without candidates.
std::vector<task> make_tasks(const scene &at);
// Each adds its candidates to the tasks that it can carry out.
void add_imgfile(const scene &at, std::vector<task> &tasks);
void add_limits(const scene &at, std::vector<task> &tasks);
void add_libtiff(const scene &at, std::vector<task> &tasks);
void add_gdal(const scene &at, std::vector<task> &tasks);

// Registers the measurements of how costs grow, with `small` just one of them.
void register_scaling(const scene &at, bool small);

#endif
