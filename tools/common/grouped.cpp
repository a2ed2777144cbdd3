// Grouping the digits of a number. Assumes that it is not negative. Read grouped.h first.
#include "common/grouped.h"

#include <cstddef>

std::string grouped(std::int64_t number)
{
    std::string digits = std::to_string(number);
    for (auto position = static_cast<std::ptrdiff_t>(digits.size()) - 3; position > 0;
         position -= 3)
        digits.insert(static_cast<std::size_t>(position), 1, ',');
    return digits;
}
