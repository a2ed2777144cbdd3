#include "support/fault_method.h"

#include "io/io_method.h"
#include "io/platform.h"

#include <cerrno>

namespace {

struct {
    io_call call{};
    int nth = 0;
    fault what{};
    bool lasting = false;
    bool fired = false;
    std::map<io_call, int> calls;
} plan;
int descriptors = 0;

bool goes_wrong(io_call call)
{
    const int number = ++plan.calls[call];
    const bool wrong = call == plan.call && plan.nth > 0 &&
                       (number == plan.nth || (plan.lasting && number > plan.nth));
    if (wrong) plan.fired = true;
    if (wrong) errno = EIO;
    return wrong;
}

std::uint32_t shortened(std::uint32_t count)
{
    switch (plan.what) {
    case fault::moves_none:
        return 0;
    case fault::moves_one:
        return count > 1 ? 1 : 0;
    default:
        return count / 2;
    }
}

std::int32_t fault_open(const char *filename, std::int32_t oflags, std::int32_t mode)
{
    if (goes_wrong(io_call::open)) return -1;
    const std::int32_t fd = img_platform_open(filename, oflags, mode);
    if (fd != -1) ++descriptors;
    return fd;
}

std::int32_t fault_close(std::int32_t fd)
{
    --descriptors;
    const std::int32_t result = img_platform_close(fd);  // as the system does: closed all the same
    return goes_wrong(io_call::close) ? -1 : result;
}

std::int32_t fault_read(std::int32_t fd, void *buffer, std::uint32_t count)
{
    if (!goes_wrong(io_call::read)) return img_platform_read(fd, buffer, count);
    return plan.what == fault::fails ? -1 : img_platform_read(fd, buffer, shortened(count));
}

std::int32_t fault_write(std::int32_t fd, const void *buffer, std::uint32_t count)
{
    if (!goes_wrong(io_call::write)) return img_platform_write(fd, buffer, count);
    return plan.what == fault::fails ? -1 : img_platform_write(fd, buffer, shortened(count));
}

std::int32_t fault_seek(std::int32_t fd, std::int32_t offset, std::int32_t whence)
{
    if (!goes_wrong(io_call::seek)) return img_platform_seek(fd, offset, whence);
    return plan.what == fault::fails ? -1 : img_platform_seek(fd, offset + 1, whence);
}

std::int32_t fault_unlink(const char *filename)
{
    return goes_wrong(io_call::unlink) ? -1 : img_platform_unlink(filename);
}

}  // namespace

void fault_register()
{
    img_register_io_method("fault", nullptr, fault_open, fault_close, fault_read, fault_write,
                           fault_seek, fault_unlink, nullptr);
}

void fault_arm(io_call call, int nth, fault what, bool lasting)
{
    fault_register();
    plan = {call, nth, what, lasting, false, {}};
}

bool fault_fired()
{
    return plan.fired;
}

int calls_of(io_call call)
{
    return plan.calls[call];
}

int open_descriptors()
{
    return descriptors;
}
