// The image chain: its structure, where its links work, and what it makes of the data, held
// against the same links applied to one sample after the other.
#include "base/image_table.h"
#include "chain/chain.h"
#include "chain/chain_apply.h"
#include "chain/chain_links.h"
#include "chain/chain_lut.h"
#include "chain/chain_prepare.h"
#include "chain/stretch.h"
#include "imgfile/img.h"
#include "support/random.h"
#include "support/refusal.h"
#include "support/sample.h"
#include "support/test_image.h"

#include <cerrno>
#include <cstring>
#include <numeric>
#include <utility>

namespace {

using samples = std::vector<std::uint16_t>;
using codes = std::vector<std::int32_t>;

// Sample `i` of a window, counted line by line.
std::ptrdiff_t byte_of(const img_buffer_def &def, std::int32_t i)
{
    return (i / def.nsamps * def.stride + i % def.nsamps) * def.nbytes;
}
std::uint16_t get(const std::uint8_t *buffer, const img_buffer_def &def, std::int32_t i)
{
    return get_sample(buffer + byte_of(def, i), def.nbytes);
}
void put(std::uint8_t *buffer, const img_buffer_def &def, std::int32_t i, std::uint32_t sample)
{
    put_sample(buffer + byte_of(def, i), def.nbytes, static_cast<std::uint16_t>(sample));
}

const img_chain_create_fn fail_to_create = [](auto...) { return 1; };
const img_chain_input_def_fn fail_to_define = [](auto...) { return -1; };
const img_chain_process_fn fail_to_process = [](auto...) { return 1; };
// Gives each sample the high bits of the last one that stands below it.
const img_chain_process_fn shift_down = [](void *, auto *in, auto *in_def, auto *out, auto *out_def,
                                           auto...) {
    const std::int32_t below = (in_def->nlines - out_def->nlines) * in_def->nsamps;
    for (std::int32_t i = 0; i < 15; ++i)
        put(out, *out_def, i,
            static_cast<std::uint32_t>(get(in, *in_def, i + below)) >>
                (in_def->nbits - out_def->nbits));
    return 0;
};

const img_chain_process_fn do_nothing = [](auto...) { return 0; };
// Asks for the definition at `arg`.
const img_chain_input_def_fn ask = [](void *arg, auto *, auto *in_def) {
    *in_def = *static_cast<img_buffer_def *>(arg);
    return 1;
};

class Chain : public testing::Test {
protected:
    ~Chain() override
    {
        img_chain_init(image);
        img_closefile(image);
    }
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
        return img_load_buffer(image, 0, 0, 3, 5, 0, buffer.data(), 7, &fill);
    }
    codes of_links(std::int32_t img_chain_link::*field) const
    {
        codes values;
        for (const auto &link : chain.links) values.push_back(link.*field);
        return values;
    }
    void expect_no_links() const
    {
        EXPECT_EQ(of_links(&img_chain_link::kind), codes(10, IMG_CHAIN_EMPTY));
        EXPECT_EQ(std::pair(+chain.identity, img_chain_out_bits(image)), std::pair(1, 12));
    }

    const img_handle image = create_test_memory({.nlines = 3, .nsamps = 5, .nbytes = 2});
    img_chain &chain = img_chain_of(image);
    bytes buffer = bytes(64, 0xEE);
    img_buffer_def def{3, 5, 0, 0, 7, 1, 8, 9}, work_def{};
};

TEST_F(Chain, WhatLinksOwnGoesWithThem)  // and nothing twice: the leak checker counts
{
    for (const bool by_reset : {false, true}) {
        EXPECT_EQ(add_creating(img_chain_create_16to8_lut), 0);
        EXPECT_EQ(of_links(&img_chain_link::kind), (codes{1, 0, 0, 0, 0, 0, 0, 0, 0, 3}));
        EXPECT_EQ(std::pair(+chain.identity, img_chain_out_nbytes(image)), std::pair(0, 1));
        add_lut(4, 4, 4, false);
        add_lut(5, 4, 4, true);
        if (by_reset) img_chain_init(image);
        for (const std::int32_t link : {4, 0, 5, 0})  // slot 9 goes with slot 0
            EXPECT_EQ(by_reset ? 0 : img_chain_remove_link(image, link), 0);
        expect_no_links();
    }
    add_creating(img_chain_create_16to8_lut);  // without its target it has nothing to fill
    EXPECT_EQ(img_chain_remove_link(image, 9), 0);
    EXPECT_EQ(load(), 0);
    samples own(1 << 12);
    img_chain_add_lut_create_link(image, 0, nullptr, img_chain_create_16to8_lut, 9, 12, 8, 1,
                                  own.data(), 0);
    EXPECT_EQ(load(), 0);
    EXPECT_NE(own.back(), 0);
    add_lut(4, 4, 4, true);
    img_closefile(image);
    EXPECT_EQ(of_links(&img_chain_link::kind), codes(10, IMG_CHAIN_EMPTY));
}

TEST_F(Chain, RefusesWhatIsNoLink)
{
    std::uint16_t table[2] = {};
    const auto results = [&](img_handle handle, std::int32_t link, std::int32_t target = 5,
                             std::int32_t bits_in = 1, std::int32_t bits_out = 1) {
        return codes{img_chain_remove_link(handle, link),
                     img_chain_add_remap_link(handle, link, 8, nullptr, shift_down, nullptr),
                     img_chain_add_lut_link(handle, link, bits_in, bits_out, 1, table, 0),
                     img_chain_add_lut_create_link(handle, link, nullptr, fail_to_create, target,
                                                   bits_in, bits_out, 0, nullptr, 0)};
    };
    const codes none(4, -1), no_table{0, 0, -1, -1}, no_target{0, 0, 0, -1};
    for (const std::int32_t link : {INT32_MIN, -1, 10, INT32_MAX})
        EXPECT_EQ(results(image, link), none);
    for (const std::int32_t target : {INT32_MIN, -1, 3, 4, 10, INT32_MAX})
        EXPECT_EQ(results(image, 4, target), no_target) << target;
    for (const std::int32_t bits : {INT32_MIN, 0, 31, 256, INT32_MAX}) {
        EXPECT_EQ(results(image, 4, 5, bits, 1), no_table);
        EXPECT_EQ(results(image, 4, 5, 1, bits), no_table);
    }
    for (const img_handle handle : {-1, 60, 59})
        EXPECT_NE(printed_by([&] { EXPECT_EQ(results(handle, 4), none); }), "");
    img_chain_remove_link(image, 4);
    EXPECT_EQ(add_creating(nullptr), -1);
    EXPECT_EQ(img_chain_add_lut_link(image, 0, 1, 1, 0, nullptr, 0), -1);
    EXPECT_EQ(img_chain_add_remap_link(image, 0, 8, nullptr, nullptr, nullptr), -1);
    expect_no_links();
}

TEST_F(Chain, IsAppliedOncePerPreparation)
{
    const auto expect_unprepared = [this] { EXPECT_EQ(refusal(img_apply_img_chain, image), ""); };
    EXPECT_EQ(prepare(), buffer.data());  // no links: straight into the caller's buffer
    EXPECT_EQ(img_apply_img_chain(image), 0);
    EXPECT_EQ(buffer, bytes(64, 0xEE));
    add_creating(img_chain_create_16to8_lut);
    expect_unprepared();
    EXPECT_NE(prepare(), nullptr);
    std::memset(prepare(), 0, 30);  // the buffer of the first preparation is freed
    EXPECT_EQ(img_apply_img_chain(image), 0);
    EXPECT_EQ(chain.prepared, 0);
    expect_unprepared();
    EXPECT_NE(prepare(), nullptr);
    img_chain_release(image);  // as after a failed read
    expect_unprepared();
    EXPECT_NE(prepare(), nullptr);
    add_lut(4, 12, 12, false);  // this is not the chain that was prepared
    expect_unprepared();
}

TEST_F(Chain, LinksThatChangeTheDefinitionGetBuffers)
{
    enum { ALLOC, FINAL, PLACE, KEEP = 4, FREE };
    const std::array<std::int32_t, 3> luts[] = {
        {1, 12, 12}, {2, 12, 10}, {4, 10, 10}, {5, 10, 9}, {7, 9, 8}};
    for (const auto &[link, bits_in, bits_out] : luts) add_lut(link, bits_in, bits_out, link > 1);
    EXPECT_NE(prepare(), buffer.data());
    EXPECT_EQ(of_links(&img_chain_link::placement),
              (codes{PLACE, PLACE, ALLOC, PLACE, PLACE, ALLOC, PLACE, FINAL, FINAL, FINAL}));
    EXPECT_EQ(of_links(&img_chain_link::release_input),
              (codes{KEEP, KEEP, FREE, KEEP, KEEP, FREE, KEEP, FREE, KEEP, KEEP}));
}

TEST_F(Chain, ALinkThatFailsOrDoesNotFitEndsTheLoad)
{
    const auto refused = [this] {
        const std::string text = refusal([this] { return load(); });
        EXPECT_EQ(chain.work_buffer, nullptr);
        return text;
    };
    const auto remap = [this](std::int32_t bits, img_chain_process_fn process,
                              img_chain_input_def_fn define) {
        img_chain_add_remap_link(image, 3, bits, nullptr, process, define);
    };
    const std::string preparing = "img_chain_prepare_operations: ";
    const std::string applying = "img_apply_img_chain: ";
    for (const std::int32_t bits_in : {12, 11}) {  // or would write the entries of 12 bits
        add_creating(bits_in == 12 ? fail_to_create : img_chain_create_16to8_lut, bits_in);
        EXPECT_EQ(refused(), applying + "Error in IMG_CHAIN_LUT_FCN\n");
        img_chain_remove_link(image, 0);
    }
    add_lut(2, 12, 10, true);  // into a fresh buffer
    add_lut(9, 10, 8, true);
    remap(10, fail_to_process, nullptr);
    EXPECT_EQ(refused(), applying + "Error in IMG_CHAIN_REMAP_FCN\n");
    chain.links[3].kind = 7;
    EXPECT_EQ(refused(), applying + "Invalid Image Chain Process type\n");
    remap(8, shift_down, nullptr);
    EXPECT_EQ(refused(), preparing + "Inconsistent output bits in image chain!\n");
    remap(0, shift_down, fail_to_define);
    EXPECT_EQ(refused(), preparing + "get_input_definition() failed!!\n");
    EXPECT_EQ(chain.prepared, 0);
    img_chain_remove_link(image, 3);
    EXPECT_EQ(load(), 0);
    def.nbits = 9;
    EXPECT_EQ(printed_by([this] { EXPECT_EQ(prepare(), nullptr); }),
              preparing + " output bits of image chain dont match output buffer!\n");
}

TEST_F(Chain, ALinkGetsWhatItAsksForOrWhatTheImageHas)
{
    samples pixels(15);
    std::iota(pixels.begin(), pixels.end(), std::uint16_t{1000});
    img_dump_buffer(image, 0, 0, 3, 5, 0, pixels.data(), 5, nullptr);
    pixels.resize(20, 9);  // the fill
    for (auto [lines_more, stride, bits] : {std::array{1, 7, 0}, {0, 5, 12}, {0, 0, 8}}) {
        img_buffer_def asked{3 + lines_more, 5, 0, 0, stride, 2, 12, 9};
        img_chain_add_remap_link(image, 4, bits, &asked, shift_down, stride == 0 ? nullptr : ask);
        // Computing a table on the way leaves the data where it is.
        img_chain_add_lut_create_link(image, 2, nullptr, img_chain_create_16to8_lut, 3, 12, 8, 0,
                                      nullptr, 0);
        EXPECT_EQ(load(), 0);
        if (bits == 0) bits = 12;  // unstated: as the image has them
        def.nbytes = img_chain_nbytes(bits);
        for (std::int32_t i = 0; i < 15; ++i)
            EXPECT_EQ(get(buffer.data(), def, i),
                      pixels[static_cast<std::size_t>(i + 5 * lines_more)] >> (12 - bits));
        img_chain_init(image);
    }
}

TEST_F(Chain, NoDefinitionMakesItLeaveItsTablesAndBuffers)
{
    img_buffer_def wide{3, 6, 0, 0, 7, 2, 12, 9}, negative{3, 5, 0, 0, 5, 2, -1, 9};
    img_buffer_def as_stored{3, 5, 0, 0, 5, 2, 12, 9};
    img_chain_add_remap_link(image, 2, 0, &as_stored, do_nothing, ask);
    add_lut(3, 12, 12, false);
    img_chain_add_remap_link(image, 5, 8, &negative, do_nothing, ask);
    EXPECT_EQ(refusal([this] { return load(); }), "");  // no table can be brought to that width
    img_chain_add_lut_create_link(image, 4, nullptr, fail_to_create, 9, 12, 8, 0, nullptr, 0);
    EXPECT_EQ(refusal([this] { return load(); }), "");
    img_chain_init(image);

    add_lut(3, 12, 12, false);
    img_chain_add_remap_link(image, 5, 31, nullptr, do_nothing, nullptr);
    def.nbits = 31;
    EXPECT_NE(prepare(), nullptr);
    EXPECT_EQ(refusal(img_apply_img_chain, image),
              perror_line("img_apply_img_chain:malloc LUT", ENOMEM));
    img_chain_remove_link(image, 3);
    img_chain_remove_link(image, 5);
    img_chain_add_remap_link(image, 5, 12, &wide, do_nothing, ask);
    def.nbits = 12;
    def.nbytes = 2;
    EXPECT_NE(prepare(), buffer.data());
    add_lut(4, 12, 12, false);
    EXPECT_NE(prepare(), buffer.data());
    work_def.nbits = 20;  // which nobody has said
    EXPECT_EQ(refusal(img_apply_img_chain, image), "");

    samples table(1 << 12);
    img_chain_lut record{12, 10, 1 << 12, table.data(), 0};
    EXPECT_EQ(img_chain_lut_input_definition(&record, &def, &work_def), -1);
    for (const std::int32_t nbits : {-1, 31}) {
        wide.nbits = nbits;
        EXPECT_EQ(img_chain_lut_remap(&record, nullptr, &wide, nullptr, &def, 0, nullptr), -1);
    }
    for (const auto &[nlines, stride, nbytes] : {std::array{-1, 1, 1}, {1, -1, 1}, {1, 1, -1}})
        EXPECT_EQ(img_chain_new_buffer(nlines, stride, nbytes), nullptr);
    EXPECT_EQ(img_chain_prepare_operations(59, buffer.data(), &def, &work_def), nullptr);
}

// --- Tables of random widths, one sample after the other ---

struct random_lut {
    int bits_in, bits_out;
    samples table = {}, seen = {};  // `seen`: the data from which it was computed

    random_lut(random_numbers *random, int in, int out) : bits_in(in), bits_out(out)
    {
        for (std::uint32_t i = 0; i < 1U << in; ++i)
            table.push_back(static_cast<std::uint16_t>(random->below(1U << out)));
    }
    void add_to(img_handle image, std::int32_t link, bool remap)
    {
        img_chain_add_lut_link(image, link, bits_in, bits_out, remap, table.data(), 0);
    }
};

// What becomes of a value of data of `from` bits in data of `to`, by way of LUTs that follow each
// other.
std::uint32_t through(const std::vector<const random_lut *> &luts, std::uint32_t value, int from,
                      int to)
{
    const auto rescale = [&value, &from](int width) {
        value = (width >= from ? value << (width - from) : value >> (from - width)) & 0xFFFF;
        from = width;
    };
    value = std::min(value, (1U << from) - 1);
    for (const auto *lut : luts) {
        rescale(lut->bits_in);
        value = lut->table[std::min<std::size_t>(value, lut->table.size() - 1)];
        from = lut->bits_out;
    }
    rescale(to);
    return value & (to > 8 ? 0xFFFF : 0xFF);
}

const img_chain_create_fn compute = [](void *arg, auto *in, auto *def, auto *table) {
    auto &lut = *static_cast<random_lut *>(arg);
    std::copy(lut.table.begin(), lut.table.end(), table);
    for (std::int32_t i = 0; i < def->nlines * def->nsamps; ++i)
        lut.seen.push_back(get(in, *def, i));
    return 0;
};

TEST(RandomChain, DoesToTheDataWhatItsLinksDoToEachSample)
{
    random_numbers random(3);
    for (int round = 0; round < 500; ++round) {
        const std::int32_t nlines = random.within(1, 4), nsamps = random.within(1, 6);
        const std::int32_t nbytes = random.within(1, 2), stride = nsamps + random.within(0, 3);
        const int bits = nbytes == 1 ? 8 : random.within(9, 12);
        const auto any = [&] { return random.within(1, 13); };
        random_lut first(&random, any(), any()), second(&random, any(), any());
        random_lut computed(&random, 12, any()), third(&random, any(), any());
        const int wide = nbytes == 1 ? random.within(6, 8) : random.within(9, 14);
        random_lut narrowing(&random, wide, wide - random.within(1, 5));
        random_lut last(&random, narrowing.bits_out, any()), pending(&random, any(), any());
        random_lut in_place(&random, wide, wide);

        const img_handle image = create_test_memory({nlines, nsamps, 1, nbytes});
        img_find_image(image)->nbits = bits;
        img_chain_init(image);
        first.add_to(image, 0, false);
        second.add_to(image, 1, false);
        img_chain_add_lut_create_link(image, 2, &computed, compute, 3, 12, computed.bits_out, 0,
                                      nullptr, 0);
        in_place.add_to(image, 4, true);
        narrowing.add_to(image, 5, true);
        third.add_to(image, 6, false);
        last.add_to(image, 8, true);
        pending.add_to(image, 9, false);

        const img_buffer_def in{nlines, nsamps, 0, 0, nsamps, nbytes, bits, 0};
        const img_buffer_def out{nlines, nsamps, 0, 0, stride, img_chain_out_nbytes(image), 0, 0};
        bytes expected(static_cast<std::size_t>(nlines * stride * out.nbytes) + 8, 0xEE);
        bytes buffer = expected;
        samples computed_from;
        for (std::int32_t i = 0; i < nlines * nsamps; ++i) {
            std::uint32_t value = random.below(nbytes == 1 ? 256 : 1U << random.within(9, 16));
            put(img_find_image(image)->mem_image.get(), in, i, value);
            value = through({&first, &second}, value, bits, bits);
            computed_from.push_back(static_cast<std::uint16_t>(value));
            value = through({&computed}, value, bits, bits);
            value = through({&in_place}, value, bits, wide);
            value = through({&narrowing}, value, wide, narrowing.bits_out);
            value = through({&third}, value, narrowing.bits_out, narrowing.bits_out);
            value = through({&last}, value, last.bits_in, last.bits_out);
            put(expected.data(), out, i, through({&pending}, value, last.bits_out, last.bits_out));
        }
        ASSERT_EQ(img_load_buffer(image, 0, 0, nlines, nsamps, 0, buffer.data(), stride, nullptr),
                  0);
        ASSERT_EQ(computed.seen, computed_from) << round;
        ASSERT_EQ(buffer, expected) << round;
        img_chain_init(image);
        img_closefile(image);
    }
}

}  // namespace
