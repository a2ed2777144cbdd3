// Tests of chain_lut.cpp, and of the chain as a whole: tables of random widths, held against the
// same links applied to one sample after the other.
#include "support/chain_fixture.h"
#include "support/random.h"

namespace {

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
        bytes expected(img_count(nlines * stride * out.nbytes) + 8, UNTOUCHED);
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
        ASSERT_EQ(load(image, {0, 0, 0, nlines, nsamps, stride}, buffer.data()), 0);
        ASSERT_EQ(computed.seen, computed_from) << round;
        ASSERT_EQ(buffer, expected) << round;
        img_chain_init(image);
        img_closefile(image);
    }
}

}  // namespace
