// Tests of chain_apply.cpp: when a chain is applied, and what ends a load.
#include "support/chain_fixture.h"

#include <cstring>

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
    expect_unprepared();
    prepare();
    img_chain_release(image);  // as after a failed read
    expect_unprepared();
    prepare();
    add_lut(4, 12, 12, false);  // this is not the chain that was prepared
    expect_unprepared();
}

TEST_F(Chain, EndsTheLoadAtALinkThatFailsOrDoesNotFit)
{
    const auto expect = [this](const std::string &expected) {
        EXPECT_EQ(refusal([this] { return load(); }), expected);
        EXPECT_EQ(chain.work_buffer, nullptr);
    };
    const auto remap = [&](std::int32_t bits, img_chain_process_fn process,
                           img_chain_input_def_fn define, const std::string &expected) {
        img_chain_add_remap_link(image, 3, bits, nullptr, process, define);
        expect(expected);
    };
    const std::string preparing = "img_chain_prepare_operations: ";
    const std::string applying = "img_apply_img_chain: Error in IMG_CHAIN_";
    for (const std::int32_t bits_in : {12, 11}) {  // or would write the entries of 12 bits
        add_creating(bits_in == 12 ? fail_to_create : img_chain_create_16to8_lut, bits_in);
        expect(applying + "LUT_FCN\n");
        img_chain_remove_link(image, 0);
    }
    add_lut(2, 12, 10, true);  // into a fresh buffer
    add_lut(9, 10, 8, true);
    remap(10, fail_to_process, nullptr, applying + "REMAP_FCN\n");
    remap(8, shift_down, nullptr, preparing + "Inconsistent output bits in image chain!\n");
    remap(0, shift_down, fail_to_define, preparing + "get_input_definition() failed!!\n");
    img_chain_remove_link(image, 3);
    EXPECT_EQ(load(), 0);
    def.nbits = 9;
    EXPECT_EQ(printed_by([this] { EXPECT_EQ(prepare(), nullptr); }),
              preparing + " output bits of image chain dont match output buffer!\n");
}

TEST_F(Chain, StaysInBoundsForAnyDefinition)
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
    EXPECT_EQ(img_chain_prepare_operations(59, buffer.data(), &def, &work_def), nullptr);
}
