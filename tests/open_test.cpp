#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/settings.h"
#include "base/type_hooks.h"
#include "base/types.h"
#include "chain/chain.h"
#include "imgfile/img.h"
#include "io/io_method.h"
#include "std/std.h"
#include "support/fault_memory.h"
#include "support/file_test.h"

#include <sys/stat.h>

namespace {

using Open = FileTest;

TEST(Library, StartsWithTheFirstOpen)
{
    if (img_io_method_count != 0) GTEST_SKIP() << "the library is in use: not the first test";
    EXPECT_EQ(img_query_image_type(0) + img_closefile(0) + img_mgr_cleanup(), IMG_NO_TYPE);
    EXPECT_EQ(img_io_method_count, 0);
    memory_arm(1);
    EXPECT_EQ(opening("no such file"), NO_FREE_HANDLE);
    memory_arm(0);
    for (int round = 0; round < 2; ++round) {
        EXPECT_EQ(opening("no such file"), REFUSED_QUIETLY);
        EXPECT_EQ(img_io_method_count, 1);
        EXPECT_EQ(img_find_io_method(""), 0);
        EXPECT_EQ(img_io_method_table[0].get_value(), 0.0);
        for (std::size_t slot = 0; slot <= 44; ++slot)
            EXPECT_EQ(img_type_table[slot].enabled, slot == 0 || slot == 8 ? 1 : 0) << slot;
    }
    EXPECT_EQ(std::string(img_type_table[0].name) + img_type_table[0].extension, "VITec.img");
    EXPECT_EQ(std::string(img_type_table[8].name) + img_type_table[8].extension, "Helava.d");
}

TEST_F(Open, FailsAsWithoutAFreeHandleAfterTheCleanUp)
{
    const img_handle handle = creating(m_name, IMG_TYPE_HELAVA, {4}).result;
    EXPECT_EQ(img_mgr_cleanup() + img_mgr_cleanup(), 0);
    EXPECT_EQ(opening(m_name), NO_FREE_HANDLE);
    EXPECT_EQ(creating(m_name, IMG_TYPE_VITEC, {}), NO_FREE_HANDLE);
    const std::uint8_t sample = 9;
    EXPECT_EQ(img_dump_buffer(handle, 1, 0, 1, 1, 0, &sample, 1, nullptr), 0);
    EXPECT_EQ(img_closefile(handle), 0);
    EXPECT_EQ(read_file(m_file)[1], 9);
}

TEST_F(Open, RefusesWhatNoTypeAcceptsWithErrno22)
{
    write_file(m_file, vitec_file({}));
    write_file(m_folder / "other", bytes(1000, 'x'));
    ASSERT_EQ(::mkfifo((m_folder / "pipe").c_str(), 0600), 0);
    for (const char *name : {"other", "pipe", "missing", ".", "scene@nosuch"})
        EXPECT_EQ(opening(m_folder / name), REFUSED_QUIETLY) << name;
    for (const std::int32_t flags : {1, 3, 4, 0x10, 0x400, -1})
        EXPECT_EQ(opening(m_file, flags), REFUSED_QUIETLY) << flags;
    EXPECT_EQ(opening(""), REFUSED_QUIETLY);
    EXPECT_EQ(outcome_of([] { return img_openfile(nullptr, 0); }), REFUSED_QUIETLY);
    fault_arm(io_call::close, 1, fault::fails, true);  // clean-up that changes errno
    EXPECT_EQ(opening(m_folder / "other@fault"), REFUSED_QUIETLY);
    EXPECT_TRUE(fault_fired());
}

TEST_F(Open, OffersAFileToTheEnabledTypesInSlotOrder)
{
    for (const auto &[version, type] : {std::array{7, 0}, {8, 8}}) {
        bytes file = vitec_file({}, 244, {.version = version});
        const bytes trailer = helava_file({1, 3}, 0);
        file.insert(file.end(), trailer.begin(), trailer.end());
        write_file(m_file, file);
        const img_handle handle = opening(m_name).result;
        EXPECT_EQ(img_query_image_type(handle), type);
        img_closefile(handle);
    }
    fault_arm(io_call::open, 0);
    img_type_table[TEST_TYPE].enabled = 0;
    EXPECT_EQ(opening(m_folder / "missing@fault"), REFUSED_QUIETLY);
    EXPECT_EQ(calls_of(io_call::open), 2);
    EXPECT_EQ(creating(m_file, TEST_TYPE, {}).text, "Unsupported image file type!!\n");
}

TEST_F(Open, TypesMayBringTheirOwnTablesAndOfferLess)
{
    img_closefile(create_test_file(m_name, {}));
    static const img_image_fn read_header = img_type_hooks_table[TEST_TYPE].read_header;
    img_type_hooks_table[TEST_TYPE].read_header = [](img_desc *desc) {
        const std::int32_t result = read_header(desc);
        desc->lut_size = 3;
        return result;
    };
    const img_handle image = opening(m_name).result;
    EXPECT_EQ(img_find_image(image)->lut_size, 3);
    img_closefile(image);
    img_type_table[TEST_TYPE].open = img_type_table[TEST_TYPE].create = nullptr;
    EXPECT_EQ(opening(m_name), REFUSED_QUIETLY);
    EXPECT_EQ(creating(m_name, TEST_TYPE, {}).text, could_not_create(m_name));
    EXPECT_EQ(img_type_table[TEST_TYPE].type_op(), -1);
}

TEST_F(Open, CreateSaysWhatItRefuses)
{
    const std::string no_name = "No image file name specified!!\n";
    EXPECT_EQ(creating("", IMG_NO_TYPE, {}).text, no_name);
    EXPECT_EQ(outcome_of([] { return img_createfile(nullptr, 1, 1, 1, 0, 0, 0, 1); }).text,
              no_name);
    for (const std::int32_t type : {1, 43, 44, 45, -1, INT32_MIN, INT32_MAX})
        EXPECT_EQ(creating(m_file, type, {}).text, "Unwritable image type specified as output!!\n");
    EXPECT_FALSE(std::filesystem::exists(m_file));
    for (const std::string &name : {m_folder / "no/folder", m_folder / "", m_file + "@nosuch"})
        EXPECT_EQ(creating(name, IMG_TYPE_HELAVA, {}).text, could_not_create(name));
}

TEST_F(Open, GivesImagesOfOneByteIdentityTablesAndThoseOfTwoTheStretch)
{
    const std::array<std::int32_t, 6> plain{8, 256, 0, 0, 8, 1},
        stretched{12, 0, IMG_CHAIN_LUT_FCN, IMG_CHAIN_REMAP_FCN, 8, 0};
    for (const std::int32_t nbytes : {1, 2, 1})  // one handle: nothing is left to its next image
        for (const bool create : {true, false}) {
            const outcome seen = create ? creating(m_name, 0, {1, 1, 1, nbytes}) : opening(m_name);
            const img_desc &desc = *img_find_image(seen.result);
            const img_chain &chain = img_chain_of(seen.result);
            EXPECT_EQ((std::array{desc.nbits, desc.lut_size, chain.links[0].kind,
                                  chain.links[9].kind, chain.out_bits, 0 + chain.identity}),
                      nbytes == 1 ? plain : stretched);
            for (std::size_t i = 0; i < 3 * 256 && nbytes == 1; ++i)
                EXPECT_EQ(desc.lut[i / 256][i % 256], i % 256);
            img_closefile(seen.result);
        }
    img_mapdown_slot = IMG_CHAIN_LINKS;  // a stretch that cannot be installed
    const std::string text =
        "img_set_auto_16to8bit_mapdown: Error installing auto mapdown in image chain\n"
        "DO_16_TO_8: Error in img_set_auto_16to8bit_mapdown()\n";
    for (const bool create : {true, false}) {
        const outcome seen = create ? creating(m_name, 0, {1, 1, 1, 2}) : opening(m_name);
        EXPECT_EQ(std::to_string(seen.result) + seen.text, "-1" + text);
    }
    img_mapdown_slot = 9;
}

}  // namespace
