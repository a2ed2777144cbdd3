// Runs tasks under Google Benchmark, and prints a table of their times.
#ifndef BENCH_MEASURE_H
#define BENCH_MEASURE_H

#include "task.h"

#include <map>

// Microseconds per request, by names like "T1/imgfile".
using medians = std::map<std::string, double>;

// Lets every candidate carry out its task once. Prints a line for each candidate whose result
// differs from that of the task's first limit. Returns true if no result differs.
bool agree(const std::vector<task> &tasks);

// Lets the candidates of each task take turns for `rounds` rounds. Prints a row per task: the
// medians, the ratio of the library's median to that of the better limit, and the goal for that
// ratio.
medians measure(const std::vector<task> &tasks, int rounds);
// Runs all measurements registered with Google Benchmark and prints their medians.
medians measure_registered();

// Throws when the file cannot be written.
void write_json(const std::string &path, const medians &times);

#endif
