// What is measured: tasks, and the candidates that carry them out.
#ifndef BENCH_TASK_H
#define BENCH_TASK_H

#include "image_set.h"

#include "formats/vitec.h"

#include <cstddef>
#include <functional>
#include <memory>
#include <string_view>

// A window of an image; or, with `nsamps` 0, a run of `nlines` tiles from tile `line` on.
struct request {
    std::int32_t line, samp, nlines, nsamps;
};

// One way to carry out a task. `move` handles one request: it reads into the buffer or writes from
// it.
struct candidate {
    std::string name;
    bool is_limit = false;  // written by hand for this one task
    std::function<void(const request &, std::uint8_t *buffer)> move;
    std::function<void()> begin = {}, end = {};   // before and after all requests, not timed
    std::string written = {};                     // the file that it writes; empty: it reads
    std::size_t skipped = IMG_VITEC_DATA_OFFSET;  // bytes of that file before its samples
    std::size_t samples = SIZE_MAX;               // the most samples that the file can hold
};

struct task {
    std::string name, title;
    double goal;  // for the ratio to the better limit
    std::vector<request> requests;
    std::size_t buffer_size;  // bytes of a request
    std::vector<candidate> candidates;
};

inline constexpr std::int32_t STRIP_LINES = 512;  // of T8

// --- Requests; fewer in a small set of images ---

// `count` windows anywhere in an image, the same in every run.
std::vector<request> windows_anywhere(const image_set &images, std::size_t count,
                                      std::int32_t nlines, std::int32_t nsamps);
// Strips of `nlines` lines, from the top of an image to its end.
std::vector<request> strips(const image_set &images, std::int32_t nlines);
// `count` runs of `ntiles` tiles, the same in every run.
std::vector<request> tile_runs(const image_set &images, std::size_t count, std::int32_t ntiles);

// --- Candidates ---

void add_candidate(std::vector<task> &tasks, std::string_view name, candidate added);
// Each adds its candidates to the tasks that it can carry out.
void add_imgfile(const image_set &images, std::vector<task> &tasks);
void add_limits(const image_set &images, std::vector<task> &tasks);
void add_libtiff(const image_set &images, std::vector<task> &tasks);
void add_gdal(const image_set &images, std::vector<task> &tasks);

// Registers the measurements with growing sizes; only the first of them if `small`.
void register_scaling(const image_set &images, bool small);

// Prints how those of the tasks that read windows scale with threads; one short round if `small`.
void measure_threads(const image_set &images, const std::vector<task> &tasks, bool small);

#endif
