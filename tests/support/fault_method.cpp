#include "support/fault_method.h"

#include "io/io_default.h"
#include "io/io_method.h"
#include "io/platform.h"

#include <cerrno>

namespace {

struct {
    io_call call{};
    int nth = 0;
    fault what{};
    bool lasting = false, fired = false;
    std::map<io_call, int> calls;
} plan;

// Returns the record of a call that is to go wrong, with the answer of one that does nothing; null
// for any other call.
bad_call *goes_wrong(io_call call, std::int32_t asked = 0)
{
    const int number = ++plan.calls[call];
    if (call != plan.call || plan.nth == 0 || number < plan.nth ||
        (number > plan.nth && !plan.lasting))
        return nullptr;
    plan.fired = true;
    errno = EIO;
    bad_calls.push_back({call, asked});
    if (plan.what == fault::answers_min) bad_calls.back().got = INT32_MIN;
    if (plan.what == fault::answers_max) bad_calls.back().got = INT32_MAX;
    return &bad_calls.back();
}

bool does_nothing()
{
    return plan.what >= fault::fails;
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
    if (goes_wrong(io_call::open) != nullptr) return -1;
    const std::int32_t fd = img_platform_open(filename, oflags, mode);
    if (fd != -1) ++open_descriptors;
    return fd;
}

std::int32_t fault_close(std::int32_t fd)
{
    --open_descriptors;
    const std::int32_t result = img_platform_close(fd);  // as the system does: closed all the same
    return goes_wrong(io_call::close) != nullptr ? -1 : result;
}

std::int32_t fault_read(std::int32_t fd, void *buffer, std::uint32_t count)
{
    const auto asked = static_cast<std::int32_t>(count);
    const bool wrong = goes_wrong(io_call::read, asked) != nullptr;
    if (wrong && does_nothing()) return bad_calls.back().got;
    if (wrong) bad_calls.pop_back();
    const std::int32_t got = img_platform_read(fd, buffer, wrong ? shortened(count) : count);
    if (got != asked) bad_calls.push_back({io_call::read, asked, got, !is_at_end(fd)});
    return got;
}

std::int32_t fault_write(std::int32_t fd, const void *buffer, std::uint32_t count)
{
    bad_call *const bad = goes_wrong(io_call::write, static_cast<std::int32_t>(count));
    if (bad == nullptr) return img_platform_write(fd, buffer, count);
    bad->grows = count == 1 && *static_cast<const std::uint8_t *>(buffer) == 0;
    if (!does_nothing()) bad->got = img_platform_write(fd, buffer, shortened(count));
    return bad->got;
}

std::int32_t fault_seek(std::int32_t fd, std::int32_t offset, std::int32_t whence)
{
    bad_call *const bad = goes_wrong(io_call::seek, whence);
    if (bad == nullptr) return img_platform_seek(fd, offset, whence);
    if (!does_nothing()) bad->got = img_platform_seek(fd, offset + 1, whence);
    return bad->got;
}

std::int32_t fault_unlink(const char *filename)
{
    return goes_wrong(io_call::unlink) != nullptr ? -1 : img_platform_unlink(filename);
}

std::int32_t refuse(std::int32_t, std::int32_t, std::int32_t count, std::int32_t, img_io_use_fn use,
                    void *arg)
{
    ++refused_loans();
    if (count > 0)
        use(arg, std::vector<std::uint8_t>(static_cast<std::size_t>(count), 0xEE).data());
    return -1;
}

}  // namespace

int &refused_loans()
{
    static int count = 0;
    return count;
}

void fault_arm(io_call call, int nth, fault what, bool lasting)
{
    img_register_io_method("fault", nullptr, fault_open, fault_close, fault_read, fault_write,
                           fault_seek, fault_unlink, nullptr);
    img_register_default_io_method("refusing");
    img_offer_lending("refusing", refuse);
    plan = {call, nth, what, lasting, false, {}};
    bad_calls.clear();
}

bool fault_fired()
{
    return plan.fired;
}

int calls_of(io_call call)
{
    return plan.calls[call];
}
