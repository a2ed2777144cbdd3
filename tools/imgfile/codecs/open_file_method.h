// Access methods for a file that the tool has already opened. The library opens a file once for
// each type that it tries; these methods return the same descriptor each time, so that all facts
// come from one file even when its name is given to another one.
#ifndef TOOL_OPEN_FILE_METHOD_H
#define TOOL_OPEN_FILE_METHOD_H

#include "io/io_method.h"

// Lends bytes from a buffer of its own: pages of a mapping would count as memory of the tool.
const img_io_method &plain_method();
// Lends pages of a mapping: for tiles that are too large to be read whole for a small window.
const img_io_method &mapped_method();

// While an object lives, both methods return `fd` for any name. Their close leaves `fd` open. Only
// one object may exist at a time.
class offered_descriptor {
public:
    explicit offered_descriptor(int fd);
    ~offered_descriptor();
    offered_descriptor(const offered_descriptor &) = delete;
    offered_descriptor &operator=(const offered_descriptor &) = delete;
};

#endif
