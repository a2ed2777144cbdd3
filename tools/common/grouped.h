// Numbers as people read them.
#ifndef TOOLS_GROUPED_H
#define TOOLS_GROUPED_H

#include <cstdint>
#include <string>

// 1234567 as "1,234,567".
std::string grouped(std::int64_t number);

#endif
