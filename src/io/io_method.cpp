// The table of access methods and the split of names. Entries are appended and never removed. Read
// io_method.h first.
#include "io/io_method.h"

#include "base/count.h"
#include "base/shared_lock.h"

#include <algorithm>
#include <cerrno>
#include <new>
#include <utility>

std::array<img_io_method, IMG_MAX_IO_METHODS> img_io_method_table{};
std::int32_t img_io_method_count = 0;

namespace {

img_mutex registration_mutex;

// Stands in for an operation that a method does not offer.
template <typename Operation>
struct refusal;
template <typename Result, typename... Arguments>
struct refusal<Result (*)(Arguments...)> {
    static Result operation(Arguments... /*unused*/)
    {
        errno = ENOSYS;
        return static_cast<Result>(-1);
    }
};

template <typename Operation>
Operation given_or_refusal(Operation operation)
{
    return operation != nullptr ? operation : &refusal<Operation>::operation;
}

}  // namespace

std::int32_t img_register_io_method(const char *name, std::int32_t (*init_op)(const char *name),
                                    img_io_open_fn open, img_io_close_fn close, img_io_read_fn read,
                                    img_io_write_fn write, img_io_seek_fn seek,
                                    img_io_unlink_fn unlink, img_io_value_fn get_value)
{
    const img_mutex_lock lock(registration_mutex);
    if (name == nullptr || img_find_io_method(name) != -1 ||
        img_io_method_count == IMG_MAX_IO_METHODS)
        return -1;
    const auto slot = img_count(img_io_method_count);
    img_io_method_table[slot] = {
        .name = name,
        .enabled = init_op == nullptr || init_op(name) == 0 ? 1 : 0,
        .open = given_or_refusal(open),
        .close = given_or_refusal(close),
        .read = given_or_refusal(read),
        .write = given_or_refusal(write),
        .seek = given_or_refusal(seek),
        .unlink = given_or_refusal(unlink),
        .get_value = given_or_refusal(get_value),
        .read_at = nullptr,
        .lend = nullptr,
        .may_merge_transfers = 0,
    };
    // Threads that look for a method see the new entry from here on.
    std::atomic_ref(img_io_method_count).fetch_add(1, std::memory_order_release);
    return 0;
}

std::int32_t img_offer_positional_reads(const char *name, img_io_read_at_fn read_at)
{
    const std::int32_t slot = img_find_io_method(name);
    if (slot == -1) return -1;
    img_io_method_table[img_count(slot)].read_at = read_at;
    return 0;
}

std::int32_t img_offer_lending(const char *name, img_io_lend_fn lend)
{
    const std::int32_t slot = img_find_io_method(name);
    if (slot == -1) return -1;
    img_io_method_table[img_count(slot)].lend = lend;
    return 0;
}

std::int32_t img_allow_merging(const char *name)
{
    const std::int32_t slot = img_find_io_method(name);
    if (slot == -1) return -1;
    img_io_method_table[img_count(slot)].may_merge_transfers = 1;
    return 0;
}

std::int32_t img_find_io_method(const char *name)
{
    const auto *const end = img_io_method_table.begin() +
                            std::atomic_ref(img_io_method_count).load(std::memory_order_acquire);
    const auto *const found =
        std::find_if(img_io_method_table.cbegin(), end, [name](const img_io_method &method) {
            return method.enabled != 0 && std::string_view(method.name) == name;
        });
    return found == end ? -1 : static_cast<std::int32_t>(found - img_io_method_table.cbegin());
}

const img_io_method *img_lookup_io_method(const char *name)
{
    const std::int32_t slot = img_find_io_method(name);
    return slot == -1 ? nullptr : &img_io_method_table[img_count(slot)];
}

std::unique_ptr<char[]> img_copy_name(std::string_view name)
{
    std::unique_ptr<char[]> copy(new (std::nothrow) char[name.size() + 1]);
    if (copy) *std::ranges::copy(name, copy.get()).out = '\0';
    return copy;
}

std::int32_t img_split_name(const char *name, std::unique_ptr<char[]> *filename_out,
                            const img_io_method **io_method_out)
{
    std::string_view filename(name);
    const char *method_name = "";
    if (const auto start = filename.find_first_not_of('@'); start != std::string_view::npos) {
        filename.remove_prefix(start);
        if (const auto end = filename.find('@'); end != std::string_view::npos) {
            method_name = filename.data() + end + 1;
            filename.remove_suffix(filename.size() - end);
        }
    }
    auto copy = img_copy_name(filename);
    if (!copy) return -1;
    *filename_out = std::move(copy);
    *io_method_out = img_lookup_io_method(method_name);
    return 0;
}
