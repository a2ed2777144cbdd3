// The local time of a POSIX system. Read local_time.h first.
#include "io/local_time.h"

#include "base/shared_lock.h"

#include <ctime>

namespace {

img_mutex time_zone;

}  // namespace

std::array<std::uint8_t, 6> img_local_time()
{
    const img_mutex_lock lock(time_zone);
    const std::time_t now = std::time(nullptr);
    std::tm local;
    ::tzset();  // localtime_r need not notice that the host has changed its time zone
    if (now == -1 || ::localtime_r(&now, &local) == nullptr) return {};
    return {static_cast<std::uint8_t>(local.tm_year), static_cast<std::uint8_t>(local.tm_mon),
            static_cast<std::uint8_t>(local.tm_mday), static_cast<std::uint8_t>(local.tm_hour),
            static_cast<std::uint8_t>(local.tm_min),  static_cast<std::uint8_t>(local.tm_sec)};
}
