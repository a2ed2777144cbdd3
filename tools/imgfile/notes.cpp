// Printing notes. Read notes.h first.
#include "notes.h"

#include "failure.h"

#include <cstdio>

void note(const std::string &file, const std::string &remark)
{
    if (!quiet)
        std::fprintf(stderr, "imgfile: %s: note: %s\n", in_one_line(file).c_str(), remark.c_str());
}
