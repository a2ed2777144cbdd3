// Notes: what people should know of a file although the work on it succeeds.
#ifndef TOOL_NOTES_H
#define TOOL_NOTES_H

#include <string>

inline bool quiet = false;  // --quiet: print no progress and no notes

// Prints a note about a file to standard error, unless `quiet` is set.
void note(const std::string &file, const std::string &remark);

#endif
