// Running the tasks under Google Benchmark, and the table of what they took.
#ifndef BENCH_MEASURE_H
#define BENCH_MEASURE_H

#include "task.h"

#include <map>

// Microseconds for a window, by names such as "T1/imgfile".
using medians = std::map<std::string, double>;

// Lets every candidate carry out its task once. Returns false after a line for each whose result
// differs from that of the task's first candidate written by hand.
bool agree(const std::vector<task> &tasks);

// Lets the candidates of each task take turns, so many rounds, and prints a row per task: the
// medians, and the ratio of the library's to the better limit beside the one to reach.
medians measure(const std::vector<task> &tasks, int rounds);
// Runs and prints what was registered with Google Benchmark already.
medians measure_registered();

// Throws when the file cannot be written.
void write_json(const std::string &path, const medians &times);

#endif
