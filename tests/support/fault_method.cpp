#include "support/fault_method.h"

#include "io/io_method.h"
#include "io/platform.h"

#include <cerrno>
#include <utility>

namespace {

struct {
    io_call call{};
    int nth = 0;
    fault what{};
    bool lasting = false;
    bool fired = false;
    std::map<io_call, int> calls;
    std::vector<bad_call> bad_calls;
} plan;
int descriptors = 0;

bool goes_wrong(io_call call)
{
    const int number = ++plan.calls[call];
    if (call != plan.call || plan.nth == 0 || number < plan.nth ||
        (number > plan.nth && !plan.lasting))
        return false;
    plan.fired = true;
    plan.bad_calls.push_back({call});
    errno = EIO;
    return true;
}

std::uint32_t shortened(std::uint32_t count)
{
    if (plan.what == fault::moves_half) return count / 2;
    return plan.what == fault::moves_one && count > 1 ? 1 : 0;
}

bool is_at_end(std::int32_t fd)
{
    const std::int32_t at = img_platform_seek(fd, 0, IMG_SEEK_CURRENT);
    const std::int32_t end = img_platform_seek(fd, 0, IMG_SEEK_END);
    img_platform_seek(fd, at, IMG_SEEK_START);
    return at >= end;
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

// True for a call whose answer is beyond reason; `answer` is that.
bool goes_mad(io_call call, std::int32_t *answer)
{
    const bool mad = plan.what == fault::answers_min || plan.what == fault::answers_max;
    *answer = plan.what == fault::answers_min ? INT32_MIN : INT32_MAX;
    return mad && goes_wrong(call);
}

std::int32_t fault_read(std::int32_t fd, void *buffer, std::uint32_t count)
{
    std::int32_t answer;
    if (goes_mad(io_call::read, &answer)) return answer;
    const auto asked = static_cast<std::int32_t>(count);
    const bool wrong = goes_wrong(io_call::read);
    const bool fails = wrong && plan.what == fault::fails;
    const std::int32_t got =
        fails ? -1 : img_platform_read(fd, buffer, wrong ? shortened(count) : count);
    if (wrong) plan.bad_calls.pop_back();
    if (got != asked)
        plan.bad_calls.push_back({io_call::read, asked, got, fails || !is_at_end(fd)});
    return got;
}

std::int32_t fault_write(std::int32_t fd, const void *buffer, std::uint32_t count)
{
    if (!goes_wrong(io_call::write)) return img_platform_write(fd, buffer, count);
    bad_call &bad = plan.bad_calls.back();
    bad.asked = static_cast<std::int32_t>(count);
    bad.grows = count == 1 && *static_cast<const std::uint8_t *>(buffer) == 0;
    if (plan.what != fault::fails) bad.got = img_platform_write(fd, buffer, shortened(count));
    return bad.got;
}

std::int32_t fault_seek(std::int32_t fd, std::int32_t offset, std::int32_t whence)
{
    std::int32_t answer;
    if (goes_mad(io_call::seek, &answer)) return answer;
    if (!goes_wrong(io_call::seek)) return img_platform_seek(fd, offset, whence);
    bad_call &bad = plan.bad_calls.back();
    bad.asked = whence;
    if (plan.what != fault::fails) bad.got = img_platform_seek(fd, offset + 1, whence);
    return bad.got;
}

std::int32_t fault_unlink(const char *filename)
{
    return goes_wrong(io_call::unlink) ? -1 : img_platform_unlink(filename);
}

std::int32_t refuse(std::int32_t, std::int32_t, std::int32_t count, img_io_use_fn use, void *arg)
{
    ++refused_loans();
    if (count > 0)
        use(arg, std::vector<std::uint8_t>(static_cast<std::size_t>(count), 0xEE).data());
    return -1;
}

}  // namespace

void fault_register()
{
    img_register_io_method("fault", nullptr, fault_open, fault_close, fault_read, fault_write,
                           fault_seek, fault_unlink, nullptr);
    img_register_io_method("refusing", nullptr, img_platform_open, img_platform_close,
                           img_platform_read, img_platform_write, img_platform_seek,
                           img_platform_unlink, nullptr);
    img_allow_merging("refusing");
    img_offer_lending("refusing", refuse);
}

int &refused_loans()
{
    static int count = 0;
    return count;
}

void fault_arm(io_call call, int nth, fault what, bool lasting)
{
    fault_register();
    plan = {call, nth, what, lasting, false, {}, {}};
}

bool fault_fired()
{
    return plan.fired;
}

std::vector<bad_call> take_bad_calls()
{
    return std::exchange(plan.bad_calls, {});
}

int calls_of(io_call call)
{
    return plan.calls[call];
}

int open_descriptors()
{
    return descriptors;
}
