// Access methods by which the library works on a file that the tool has open already. The library
// opens a file once for each type that it tries; these methods give it the same descriptor each
// time, so that the file is looked up by its name once.
#ifndef TOOL_OPEN_FILE_METHOD_H
#define TOOL_OPEN_FILE_METHOD_H

#include "io/io_method.h"

// Lends bytes from a buffer of its own: pages of a mapping would count as memory of the tool.
const img_io_method &plain_method();
// Lends pages of a mapping: for files with tiles so large that they are not read whole for a part.
const img_io_method &mapped_method();

// While an object lives, the methods open `fd`, whatever name they are asked for. Closing leaves
// `fd` open. One object at a time.
class offered_descriptor {
public:
    explicit offered_descriptor(int fd);
    ~offered_descriptor();
    offered_descriptor(const offered_descriptor &) = delete;
    offered_descriptor &operator=(const offered_descriptor &) = delete;
};

#endif
