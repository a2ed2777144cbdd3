#include "chain/chain.h"
#include "io/io_method.h"
#include "std/std.h"
#include "support/fault_memory.h"
#include "support/file_test.h"

#include <sys/stat.h>

namespace {

using Open = FileTest;

TEST(Library, StartsWithTheFirstOpen)
{
    if (img_handle_pool != nullptr) GTEST_SKIP() << "the library is in use: not the first test";
    EXPECT_EQ(img_query_image_type(0) + img_closefile(0) + img_mgr_cleanup(), IMG_NO_TYPE);
    EXPECT_EQ(img_io_method_count, 0);
    for (int round = 0; round < 2; ++round) {
        EXPECT_EQ(opening("no such file"), REFUSED_QUIETLY);
        EXPECT_EQ(img_io_method_count, 1);
        EXPECT_EQ(img_find_io_method(""), 0);
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
            const img_chain_lut_fcn_part &source = chain.links[0].lut_fcn;
            EXPECT_TRUE(nbytes == 1 || (source.create_fn == img_chain_create_16to8_lut &&
                                        source.target == 9 && source.bits_in == 12));
            img_closefile(seen.result);
        }
    img_mapdown_slot = IMG_CHAIN_LINKS;  // a stretch that cannot be installed
    const std::string text =
        "img_set_auto_16to8bit_mapdown: Error installing auto mapdown in image chain\n"
        "DO_16_TO_8: Error in img_set_auto_16to8bit_mapdown()\n";
    EXPECT_EQ(creating(m_name, IMG_TYPE_VITEC, {1, 1, 1, 2}).text, text);
    EXPECT_EQ(opening(m_name).text, text);
    img_mapdown_slot = 9;
}

TEST_F(Open, TakesImagesWithinTheDriversLimitsAlone)
{
    constexpr std::int32_t max = INT32_MAX, min = INT32_MIN, k32 = 1 << 15, k64 = 1 << 16;
    constexpr std::int32_t room = max - 244;  // bytes that samples can take behind a header
    constexpr std::int32_t over = room + 1, half = room / 2 + 1, part = room / 4;
    // Lines, samples, bands, bytes per sample, tile width and height.
    const test_geometry refused[] = {
        {-1, 1, 1, 1, 0, 0},    {1, -1, 1, 1, 0, 0},   {1, 1, -1, 1, 0, 0},
        {min, 0, 1, 1, 0, 0},   {1, 1, 1, 0, 0, 0},    {1, over, 1, 1, 0, 0},
        {max, max, 0, 1, 0, 0}, {1, half, 1, 2, 0, 0}, {1, half, 2, 1, 0, 0},
        {max, 1, 1, 1, 8, 8},   {1, max, 0, 1, 8, 0},  {1, 1, 2, 1, k32, k32}};
    const test_geometry in_files[] = {{1, 1, 1, 3, 0, 0},       {1, 1, 1, min, 0, 0},
                                      {1, 1, min, 1, 0, 0},     {1, 1, 1, 1, -8, -8},
                                      {1, 1, 1, 1, 0, -8},      {1, 1, 1, 1, -8, 0},
                                      {min, min, 1, 1, -1, -1}, {1, 1, 1, 1, k64, k64},
                                      {0, 0, 0, 1, max, max},   {max, max, 0, 1, 1, 1}};
    const test_geometry taken[] = {
        {0, 1, 1, 1, 0, 0},    {1, 0, 1, 1, 0, 0},   {1, 1, 0, 1, 0, 0},     {1, room, 1, 1, 0, 0},
        {part, 1, 2, 2, 0, 0}, {max, 0, 1, 1, 0, 0}, {1, 1, 1, 1, k32, k32}, {3, 5, k64, 1, 0, 0}};
    const auto expect_untouched = [this](const test_geometry &image, bool fits) {
        const bytes file = vitec_file(image, 300);
        write_file(m_file, file);
        const outcome seen = opening(m_name, fits ? IMG_OPEN_READ_ONLY : IMG_OPEN_READ_WRITE);
        EXPECT_TRUE(fits ? seen.result == 0 : seen == REFUSED_QUIETLY)
            << testing::PrintToString(bytes(&file[148], &file[176]));  // the geometry
        img_closefile(seen.result);
        EXPECT_EQ(read_file(m_file), file);
    };
    for (const test_geometry &image : refused) {
        expect_untouched(image, false);
        EXPECT_EQ(creating(m_name, IMG_TYPE_VITEC, image).text, could_not_create(m_name));
    }
    for (const test_geometry &image : in_files) expect_untouched(image, false);
    for (const test_geometry &image : taken) expect_untouched(image, true);
    for (const std::uintmax_t length : {std::uintmax_t{max}, std::uintmax_t{max} + 1}) {
        std::filesystem::resize_file(m_file, length);
        const outcome seen = opening(m_name);
        EXPECT_EQ(seen.result, length == max ? 0 : -1);
        img_closefile(seen.result);
    }
}

TEST_F(Open, RefusesHeadersThatAreCutShortAnywhere)
{
    const bytes header = vitec_file({3, 5}), trailer = helava_file({3, 5}, 0);
    for (std::ptrdiff_t length = 0; length < 180; ++length) {  // the last field ends there
        write_file(m_file, bytes(header.begin(), header.begin() + length));
        EXPECT_EQ(opening(m_name), REFUSED_QUIETLY) << length;
        write_file(m_file, bytes(trailer.end() - length % 16, trailer.end()));
        EXPECT_EQ(opening(m_name), REFUSED_QUIETLY) << length % 16;
    }
}

TEST_F(Open, NoticesWhatGoesWrongAndLeavesNothingBehind)
{
    using enum io_call;
    using enum fault;
    const struct {
        std::int32_t type;
        io_call call;
        fault what;
        int harmless;  // calls of a type that is asked before, and would not take the file anyway
    } cases[] = {{0, open, fails, 0},       {0, seek, fails, 0},     {0, read, fails, 0},
                 {0, read, moves_half, 0},  {0, write, fails, 0},    {0, write, moves_none, 0},
                 {0, write, moves_half, 0}, {8, open, fails, 1},     {8, seek, fails, 2},
                 {8, read, fails, 1},       {8, read, moves_one, 1}, {8, write, fails, 0},
                 {8, write, moves_half, 0}, {8, seek, stands_off, 2}};
    img_type_table[TEST_TYPE].enabled = 0;
    for (const auto &[type, call, what, harmless] : cases)
        for (const bool create : {true, false}) {
            bool fired = true;
            for (int nth = 1; fired; ++nth) {
                const bytes before = read_file(m_file);
                fault_arm(call, nth, what);
                const outcome seen = create ? creating(m_name, type, {9, 5}) : opening(m_name);
                fired = fault_fired();
                const bool succeeds = !fired || (!create && nth <= harmless);
                fault_arm(call, 0);
                img_closefile(seen.result);
                EXPECT_EQ(open_descriptors(), 0);
                EXPECT_TRUE(create || read_file(m_file) == before);
                if (seen.result != -1) {
                    EXPECT_TRUE(succeeds || what == stands_off) << create << nth;
                    EXPECT_EQ(read_file(m_file).size(), type == 0 ? 244 + 45 : 45 + 16) << nth;
                } else {
                    EXPECT_FALSE(succeeds) << create << nth;
                    EXPECT_EQ(seen.text, create ? could_not_create(m_name) : "") << nth;
                    EXPECT_TRUE(create || seen.error == 22);
                }
            }
        }
}

TEST_F(Open, WantOfMemoryFailsTheCallAlone)
{
    for (const bool create : {true, false})
        for (int nth = 1; nth == 1 || memory_denied(); ++nth) {
            memory_arm(nth);
            const outcome seen = create ? creating(m_name, 0, {}) : opening(m_name);
            EXPECT_EQ(seen.result, memory_denied() ? -1 : 0) << create << nth;
            EXPECT_TRUE(seen.text.empty() != memory_denied() || seen == REFUSED_QUIETLY) << nth;
            img_closefile(seen.result);
            EXPECT_EQ(img_handle_pool->next + open_descriptors(), 0);
        }
    memory_arm(0);
}

}  // namespace
