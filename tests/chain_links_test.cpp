// Tests of chain_links.cpp and chain.cpp: adding and removing links.
#include "support/chain_fixture.h"

TEST_F(Chain, FreesWhatItsLinksOwn)  // and nothing twice: the leak checker counts
{
    for (const bool by_reset : {false, true}) {
        EXPECT_EQ(add_creating(img_chain_create_16to8_lut), 0);
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
    add_lut(4, 4, 4, true);  // and goes with the image
}

TEST_F(Chain, RefusesLinksThatCannotWork)
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

TEST_F(Chain, HasNoBuffersOfNegativeSize)
{
    EXPECT_EQ(img_chain_new_buffer(-1, 1, 1), nullptr);
    EXPECT_EQ(img_chain_new_buffer(1, -1, 1), nullptr);
    EXPECT_EQ(img_chain_new_buffer(1, 1, -1), nullptr);
}
