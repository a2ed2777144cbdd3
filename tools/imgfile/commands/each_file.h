// Commands that work on a list of files.
#ifndef TOOL_EACH_FILE_H
#define TOOL_EACH_FILE_H

#include <functional>
#include <string>
#include <vector>

// Calls `work(name)` for each file; `work` returns false to report a finding. A failure is printed,
// and the next file follows. Returns the exit status: 0, or 1 after a finding or a failure.
int for_each_file(const std::vector<std::string> &names,
                  const std::function<bool(const std::string &name)> &work);

#endif
