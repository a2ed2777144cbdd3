// A chain on a small image in memory, and links for it.
#ifndef IMG_TEST_CHAIN_FIXTURE_H
#define IMG_TEST_CHAIN_FIXTURE_H

#include "base/image_table.h"
#include "chain/chain.h"
#include "chain/chain_apply.h"
#include "chain/chain_links.h"
#include "chain/chain_prepare.h"
#include "chain/stretch.h"
#include "support/refusal.h"
#include "support/sample.h"
#include "support/test_image.h"
#include "support/transfer.h"

#include <cerrno>
#include <utility>

using samples = std::vector<std::uint16_t>;
using codes = std::vector<std::int32_t>;

// Sample `i` of a window, counted line by line.
inline std::ptrdiff_t byte_of(const img_buffer_def &def, std::int32_t i)
{
    return (i / def.nsamps * def.stride + i % def.nsamps) * def.nbytes;
}
inline std::uint16_t get(const std::uint8_t *buffer, const img_buffer_def &def, std::int32_t i)
{
    return get_sample(buffer + byte_of(def, i), def.nbytes);
}
inline void put(std::uint8_t *buffer, const img_buffer_def &def, std::int32_t i,
                std::uint32_t sample)
{
    put_sample(buffer + byte_of(def, i), def.nbytes, static_cast<std::uint16_t>(sample));
}

inline const img_chain_create_fn fail_to_create = [](auto...) { return 1; };
inline const img_chain_input_def_fn fail_to_define = [](auto...) { return -1; };
inline const img_chain_process_fn fail_to_process = [](auto...) { return 1; };
// Gives each sample the high bits of the last one that stands below it.
inline const img_chain_process_fn shift_down = [](void *, auto *in, auto *in_def, auto *out,
                                                  auto *out_def, auto...) {
    const std::int32_t below = (in_def->nlines - out_def->nlines) * in_def->nsamps;
    for (std::int32_t i = 0; i < 15; ++i)
        put(out, *out_def, i,
            static_cast<std::uint32_t>(get(in, *in_def, i + below)) >>
                (in_def->nbits - out_def->nbits));
    return 0;
};

inline const img_chain_process_fn do_nothing = [](auto...) { return 0; };
// Asks for the definition at `arg`.
inline const img_chain_input_def_fn ask = [](void *arg, auto *, auto *in_def) {
    *in_def = *static_cast<img_buffer_def *>(arg);
    return 1;
};

class Chain : public testing::Test {
protected:
    ~Chain() override { img_closefile(image); }
    // Adds a link with a table of its own, all 0.
    void add_lut(std::int32_t link, std::int32_t bits_in, std::int32_t bits_out, bool remap)
    {
        auto *const table = new std::uint16_t[std::size_t{1} << bits_in]{};
        img_chain_add_lut_link(image, link, bits_in, bits_out, remap, table, 1);
    }
    std::int32_t add_creating(img_chain_create_fn create_fn, std::int32_t bits_in = 12)
    {
        return img_chain_add_lut_create_link(image, 0, nullptr, create_fn, 9, bits_in, 8, 1,
                                             nullptr, 0);
    }
    std::uint8_t *prepare()
    {
        return img_chain_prepare_operations(image, buffer.data(), &def, &work_def);
    }
    std::int32_t load()
    {
        const std::uint8_t fill = 9;
        return ::load(image, {.nlines = 3, .nsamps = 5, .stride = 7}, buffer.data(), &fill);
    }
    void expect_no_links() const
    {
        for (const auto &link : chain.links) EXPECT_EQ(link.kind, IMG_CHAIN_EMPTY);
        EXPECT_EQ(std::pair(+chain.identity, img_chain_out_bits(image)), std::pair(1, 12));
    }

    const img_handle image = create_test_memory({.nlines = 3, .nsamps = 5, .nbytes = 2});
    img_chain &chain = img_chain_of(image);
    bytes buffer = bytes(64, UNTOUCHED);
    img_buffer_def def{3, 5, 0, 0, 7, 1, 8, 9}, work_def{};
};

#endif
