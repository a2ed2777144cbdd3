// Calls the exported functions in any order, on several files, with open handles and with others.
// Compares every result with a model of the handles and the files.
#include "checked_image.h"

#include "base/image_table.h"
#include "imgfile/img.h"

namespace {

class call_sequence {
public:
    explicit call_sequence(fuzz_input &in) : m_in(in)
    {
        for (img_handle handle = IMG_MAX_HANDLES; handle-- > 0;) m_free.push_back(handle);
    }

    void call()
    {
        static constexpr std::array<std::int32_t, 8> oflags{0, 0, 2, 2, 1, 3, 0x102, 0x202};
        static constexpr std::array<const char *, 8> names{"a@memory",  "a@memory", "b@memory",
                                                           "b@memory",  "c@memory", "c@memory",
                                                           "d@nowhere", ""};
        const std::int32_t choice = m_in.below(16);
        const img_handle next = m_free.empty() ? -1 : m_free.back();
        const std::string name = names[static_cast<std::size_t>(m_in.below(8))];
        if (choice < 2)
            took(checked_open(name, oflags[static_cast<std::size_t>(m_in.below(8))], next));
        else if (choice < 4)
            took(checked_create(m_in, name, next));
        else if (choice == 4)
            close(some_image());
        else if (choice == 5)
            query(some_image().handle);
        else if (choice == 6 && m_in.byte() == 255)
            clean_up();
        else
            checked_transfer(m_in, some_image());
    }

private:
    void took(const open_image &image)
    {
        if (image.handle == -1) return;
        m_free.pop_back();
        m_open[image.handle] = image;
    }
    open_image some_image()
    {
        const std::int32_t choice = m_in.byte();
        if (!m_open.empty() && choice < 240)
            return std::next(m_open.begin(), choice % std::ssize(m_open))->second;
        const img_handle handle = m_in.number();
        return m_open.contains(handle) ? m_open[handle] : open_image{.handle = handle};
    }
    void close(const open_image &image)
    {
        if (m_open.erase(image.handle) == 0)
            return require(img_closefile(image.handle) == 0, "closing twice is harmless");
        checked_close(image);
        if (img_handle_pool != nullptr) m_free.push_back(image.handle);
    }
    void query(img_handle handle) const
    {
        const bool open = m_open.contains(handle);
        require((img_query_dimension(handle, nullptr, nullptr) == 0) == open &&
                    (img_query_tile_size(handle, nullptr, nullptr) == 0) == open &&
                    (img_query_image_type(handle) != IMG_NO_TYPE) == open &&
                    (img_query_num_bands(handle) != -1) == open,
                "queries tell open handles from others");
    }
    void clean_up()
    {
        require(img_mgr_cleanup() == 0, "cleaning up succeeds");
        m_free.clear();
    }

    fuzz_input &m_in;
    std::vector<img_handle> m_free;  // the next handle to be given out comes last
    std::map<img_handle, open_image> m_open;
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size)
{
    const fuzz_run run;
    fuzz_input in({data, size});
    for (call_sequence calls(in); !in.ended();) calls.call();
    return 0;
}
