// The image chain: its structure, where its links work, and what it makes of the data, held
// against the same links applied to one sample after the other.
#include "chain/chain.h"
#include "support/random.h"
#include "support/refusal.h"
#include "support/test_image.h"

#include <cstring>
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
    std::uint16_t sample = 0;
    std::memcpy(&sample, buffer + byte_of(def, i), static_cast<std::size_t>(def.nbytes));
    return sample;
}
void put(std::uint8_t *buffer, const img_buffer_def &def, std::int32_t i, std::uint32_t sample)
{
    std::memcpy(buffer + byte_of(def, i), &sample, static_cast<std::size_t>(def.nbytes));
}

const img_chain_create_fn fail_to_create = [](auto...) { return 1; };
const img_chain_input_def_fn fail_to_define = [](auto...) { return -1; };
const img_chain_process_fn fail_to_process = [](auto...) { return 1; };
const img_chain_process_fn shift_down = [](void *, auto *in, auto *in_def, auto *out, auto *out_def,
                                           auto...) {
    for (std::int32_t i = 0; i < 15; ++i) put(out, *out_def, i, get(in, *in_def, i) >> 4U);
    return 0;
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
    std::int32_t load() { return img_load_buffer(image, 0, 0, 3, 5, 0, buffer.data(), 7, nullptr); }
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

TEST_F(Chain, RemovingTheCreatingLinkRemovesItsTarget)
{
    EXPECT_EQ(add_creating(img_chain_create_16to8_lut), 0);
    EXPECT_EQ(of_links(&img_chain_link::kind), (codes{1, 0, 0, 0, 0, 0, 0, 0, 0, 3}));
    EXPECT_EQ(std::pair(+chain.identity, img_chain_out_nbytes(image)), std::pair(0, 1));
    for (int round = 0; round < 2; ++round) {  // the second time the slot is empty already
        EXPECT_EQ(img_chain_remove_link(image, 0), 0);
        expect_no_links();
    }
    add_creating(img_chain_create_16to8_lut);  // without its target it has nothing to fill
    EXPECT_EQ(img_chain_remove_link(image, 9), 0);
    EXPECT_EQ(load(), 0);
}

TEST_F(Chain, DeliversTheBitsOfTheLastLinkThatStatesThem)
{
    const codes steps[] = {{3, 8, 8}, {7, 0, 8}, {5, 10, 10}, {1, 9, 10}};
    add_lut(8, 1, 1, false);
    for (const auto &step : steps) {
        img_chain_add_remap_link(image, step[0], step[1], nullptr, shift_down, nullptr);
        EXPECT_EQ(img_chain_out_bits(image), step[2]);
    }
    img_chain_remove_link(image, 5);
    EXPECT_EQ(img_chain_out_bits(image), 8);
}

TEST_F(Chain, ResettingFreesWhatTheLinksOwn)  // and nothing twice: the leak checker counts
{
    add_creating(img_chain_create_16to8_lut);
    add_lut(4, 4, 4, false);
    add_lut(5, 4, 4, true);
    img_chain_init(image);
    expect_no_links();
}

TEST_F(Chain, RefusesWhatIsNoLink)
{
    std::uint16_t table[2] = {};
    const auto expect = [&](const std::string &text, img_handle handle, std::int32_t link,
                            std::int32_t bits_in = 1, std::int32_t bits_out = 1,
                            std::int32_t target = 9) {
        EXPECT_EQ(refusal(img_chain_add_lut_create_link, handle, link, nullptr, fail_to_create,
                          target, bits_in, bits_out, 0, nullptr, 0),
                  text);
        if (target != 9) return;
        EXPECT_EQ(refusal(img_chain_add_lut_link, handle, link, bits_in, bits_out, 1, table, 0),
                  text);
        if (bits_in != 1 || bits_out != 1) return;
        EXPECT_EQ(refusal(img_chain_add_remap_link, handle, link, 8, nullptr, shift_down, nullptr),
                  text);
        EXPECT_EQ(refusal(img_chain_remove_link, handle, link), text);
    };
    for (const std::int32_t no_link : {-1, 10, INT32_MIN, INT32_MAX}) expect("", image, no_link);
    for (const std::int32_t no_target : {-1, 4, 3, 10, INT32_MAX})
        expect("", image, 4, 1, 1, no_target);
    for (const std::int32_t no_width : {0, 31, 256, INT32_MIN, INT32_MAX}) {
        expect("", image, 0, no_width, 1);
        expect("", image, 0, 1, no_width);
    }
    for (const img_handle no_image : {-1, 60, 59})
        expect(std::string("img_validate_img_handle: img_handle ") +
                   (no_image == 59 ? "not open\n" : "is out of range\n"),
               no_image, 0);
    EXPECT_EQ(add_creating(nullptr), -1);
    EXPECT_EQ(img_chain_add_lut_link(image, 0, 1, 1, 0, nullptr, 0), -1);
    EXPECT_EQ(img_chain_add_remap_link(image, 0, 8, nullptr, nullptr, nullptr), -1);
    expect_no_links();
}

TEST_F(Chain, LinksThatChangeTheDefinitionGetBuffers)
{
    enum { ALLOC, FINAL, PLACE, KEEP = 4, FREE };
    const auto expect = [this](const codes &placements, const codes &releases) {
        EXPECT_NE(prepare(), buffer.data());
        EXPECT_EQ(of_links(&img_chain_link::placement), placements);
        EXPECT_EQ(of_links(&img_chain_link::release_input), releases);
    };
    add_creating(img_chain_create_16to8_lut);
    expect({PLACE, PLACE, PLACE, PLACE, PLACE, PLACE, PLACE, PLACE, PLACE, FINAL},
           {KEEP, KEEP, KEEP, KEEP, KEEP, KEEP, KEEP, KEEP, KEEP, FREE});
    EXPECT_EQ((codes{work_def.stride, work_def.nbytes, work_def.nbits, work_def.fill}),
              (codes{5, 2, 12, 9}));
    EXPECT_EQ(chain.links[0].out_def.stride, 5);  // packed, as slot 9 reads it
    img_chain_init(image);
    add_lut(1, 12, 12, false);
    add_lut(2, 12, 10, true);  // changes 12 bits to 10
    add_lut(4, 10, 10, true);
    add_lut(5, 10, 9, true);  // changes
    add_lut(7, 9, 8, true);   // changes
    expect({PLACE, PLACE, ALLOC, PLACE, PLACE, ALLOC, PLACE, FINAL, FINAL, FINAL},
           {KEEP, KEEP, FREE, KEEP, KEEP, FREE, KEEP, FREE, KEEP, KEEP});
}

TEST_F(Chain, PreparationSaysWhatDoesNotFit)
{
    const auto text = [this] { return printed_by([this] { EXPECT_EQ(prepare(), nullptr); }); };
    const std::string where = "img_chain_prepare_operations: ";
    add_lut(9, 10, 9, true);
    EXPECT_EQ(text(), where + " output bits of image chain dont match output buffer!\n");
    def.nbits = 9;
    def.nbytes = 2;
    img_chain_add_remap_link(image, 5, 8, nullptr, shift_down, nullptr);
    EXPECT_EQ(text(), where + "Inconsistent output bits in image chain!\n");
    img_chain_add_remap_link(image, 5, 0, nullptr, shift_down, fail_to_define);
    EXPECT_EQ(text(), where + "get_input_definition() failed!!\n");
    EXPECT_EQ(chain.prepared, 0);
}

TEST_F(Chain, IsAppliedOncePerPreparation)
{
    EXPECT_EQ(prepare(), buffer.data());  // no links: straight into the caller's buffer
    EXPECT_EQ(img_apply_img_chain(image), 0);
    EXPECT_EQ(buffer, bytes(64, 0xEE));
    add_creating(img_chain_create_16to8_lut);
    EXPECT_EQ(refusal(img_apply_img_chain, image), "");
    EXPECT_NE(prepare(), nullptr);
    std::memset(prepare(), 0, 30);  // the buffer of the first preparation is freed
    EXPECT_EQ(img_apply_img_chain(image), 0);
    EXPECT_EQ(chain.prepared, 0);
    EXPECT_EQ(refusal(img_apply_img_chain, image), "");
    EXPECT_NE(prepare(), nullptr);
    img_chain_release(image);  // as after a failed read
    EXPECT_EQ(refusal(img_apply_img_chain, image), "");
    EXPECT_NE(prepare(), nullptr);
    add_lut(4, 12, 12, false);  // this is not the chain that was prepared
    EXPECT_EQ(refusal(img_apply_img_chain, image), "");
}

TEST_F(Chain, AFailingLinkEndsTheLoad)
{
    const auto refused = [this] {
        const std::string text = refusal([this] { return load(); });
        EXPECT_EQ(chain.work_buffer, nullptr);
        return text;
    };
    const std::string where = "img_apply_img_chain: ";
    add_creating(fail_to_create);
    EXPECT_EQ(refused(), where + "Error in IMG_CHAIN_LUT_FCN\n");
    img_chain_remove_link(image, 0);
    add_creating(img_chain_create_16to8_lut, 11);  // would write the entries of 12 bits
    EXPECT_EQ(refused(), where + "Error in IMG_CHAIN_LUT_FCN\n");
    img_chain_remove_link(image, 0);
    add_lut(2, 12, 10, true);  // into a fresh buffer
    add_lut(9, 10, 8, true);
    img_chain_add_remap_link(image, 3, 10, nullptr, fail_to_process, nullptr);
    EXPECT_EQ(refused(), where + "Error in IMG_CHAIN_REMAP_FCN\n");
    chain.links[3].kind = 7;
    EXPECT_EQ(refused(), where + "Invalid Image Chain Process type\n");
    img_chain_remove_link(image, 3);
    EXPECT_EQ(load(), 0);
}

TEST_F(Chain, ALinkMayAskForMoreOfTheImage)  // here for a line more, to give each the one below
{
    samples pixels{0, 0, 0, 0, 0, 1, 1, 1, 1, 1, 2, 2, 2, 2, 2};
    img_dump_buffer(image, 0, 0, 3, 5, 0, pixels.data(), 5, nullptr);
    const img_chain_input_def_fn one_line_more = [](void *, auto *out_def, auto *in_def) {
        *in_def = *out_def;
        ++in_def->nlines;
        return 1;
    };
    const img_chain_process_fn take_line_below = [](void *, auto *in, auto *in_def, auto *out,
                                                    auto *out_def, auto...) {
        for (std::int32_t i = 0; i < 15; ++i) put(out, *out_def, i, get(in, *in_def, i + 5));
        return 0;
    };
    img_chain_add_remap_link(image, 4, 12, nullptr, take_line_below, one_line_more);
    const std::uint8_t fill = 9;
    EXPECT_EQ(img_load_buffer(image, 0, 0, 3, 5, 0, pixels.data(), 5, &fill), 0);
    EXPECT_EQ(pixels, (samples{1, 1, 1, 1, 1, 2, 2, 2, 2, 2, 9, 9, 9, 9, 9}));
}

TEST_F(Chain, ALinkWithoutDefinitionGetsWhatTheImageHas)
{
    const samples pixels(15, 0x5A0);
    img_dump_buffer(image, 0, 0, 3, 5, 0, pixels.data(), 5, nullptr);
    img_chain_add_remap_link(image, 9, 8, nullptr, shift_down, nullptr);
    // Computing a table on the way leaves the data where it is.
    img_chain_add_lut_create_link(image, 2, nullptr, img_chain_create_16to8_lut, 3, 12, 8, 0,
                                  nullptr, 0);
    EXPECT_EQ(load(), 0);
    for (std::int32_t i = 0; i < 15; ++i) EXPECT_EQ(get(buffer.data(), def, i), 0x5A);
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
    // The entry for a value of data of `bits`, in what becomes of the data.
    std::uint32_t remap(std::uint32_t value, int bits) const
    {
        value = rescaled(std::min(value, (1U << bits) - 1), bits, bits_in);
        return table[value] & (bits_out > 8 ? 0xFFFF : 0xFF);
    }
    static std::uint32_t rescaled(std::uint32_t value, int from, int to)
    {
        return (to >= from ? value << (to - from) : value >> (from - to)) & 0xFFFF;
    }
};

// A value of data of `bits` on its way through LUT links that follow each other.
std::uint32_t through(const std::vector<const random_lut *> &luts, std::uint32_t value, int bits)
{
    int width = bits;
    value = std::min(value, (1U << bits) - 1);
    for (const auto *lut : luts) {
        const std::size_t index = random_lut::rescaled(value, width, lut->bits_in);
        value = lut->table[std::min(index, lut->table.size() - 1)];
        width = lut->bits_out;
    }
    return random_lut::rescaled(value, width, bits) & (bits > 8 ? 0xFFFF : 0xFF);
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

        const img_handle image = create_test_memory({nlines, nsamps, 1, nbytes});
        img_find_image(image)->nbits = bits;
        img_chain_init(image);
        first.add_to(image, 0, false);
        second.add_to(image, 1, false);
        img_chain_add_lut_create_link(image, 2, &computed, compute, 3, 12, computed.bits_out, 0,
                                      nullptr, 0);
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
            value = through({&first, &second}, value, bits);
            computed_from.push_back(static_cast<std::uint16_t>(value));
            value = narrowing.remap(through({&computed}, value, bits), bits);
            value = last.remap(through({&third}, value, narrowing.bits_out), narrowing.bits_out);
            put(expected.data(), out, i, through({&pending}, value, last.bits_out));
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
