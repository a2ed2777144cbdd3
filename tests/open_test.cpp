// Tests of open.cpp: opening and creating images, what is refused, and what an image begins with.
#include "api/open.h"
#include "base/settings.h"
#include "base/type_hooks.h"
#include "base/types.h"
#include "chain/chain.h"
#include "io/io_method.h"
#include "std/std.h"
#include "support/file_test.h"

using Open = FileTest;
using Create = FileTest;

TEST_F(Open, RefusesFilesOfNoTypeWithErrno22)
{
    write_file(m_file, vitec_file({}));
    write_file(m_folder / "other", bytes(1000, 'x'));
    for (const char *name : {"other", "scene@nosuch"})
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
    // Byte orders that a type which refuses the file has found are forgotten.
    for (const auto &[version, type] : {std::array{7, 0}, {8, 8}})
        for (const int orders : {0, 1, 2, 3}) {
            const bool little_header = orders % 2 != 0, little_trailer = orders / 2 != 0;
            bytes file =
                vitec_file({}, VITEC_HEADER, {.version = version, .little_endian = little_header});
            const bytes trailer = helava_file({.nsamps = 3}, 0, little_trailer);
            file.insert(file.end(), trailer.begin(), trailer.end());
            write_file(m_file, file);
            const img_handle handle = opening(m_name).result;
            EXPECT_EQ(img_query_image_type(handle), type);
            EXPECT_EQ(img_find_image(handle)->swap != 0,
                      (type == 0 ? little_header : little_trailer) != IS_LITTLE_ENDIAN);
            img_closefile(handle);
        }
    static std::vector<std::int32_t> asked;
    const img_io_open_fn open = [](const char *, std::int32_t oflags, std::int32_t) {
        asked.push_back(oflags);
        return -1;
    };
    img_register_io_method("flags", nullptr, open, nullptr, nullptr, nullptr, nullptr, nullptr,
                           nullptr);
    opening("scene@flags", IMG_OPEN_READ_ONLY);
    creating("scene@flags", IMG_TYPE_HELAVA, {});
    const setting enabled(img_type_table[IMG_TYPE_VITEC].enabled, 0);
    EXPECT_EQ(opening("scene@flags"), REFUSED_QUIETLY);
    EXPECT_EQ(creating(m_file, IMG_TYPE_VITEC, {}).text, "Unsupported image file type!!\n");
    EXPECT_EQ(asked, (std::vector{0x8000, 0x8000, 0x8000, 0x8302, 0x8002, 0x8002}));
}

TEST_F(Open, TypesMayHaveTablesAndOfferNeitherOpenNorCreate)
{
    img_closefile(creating(m_name, IMG_TYPE_VITEC, {}).result);
    static const img_image_fn read_header = img_type_hooks_table[IMG_TYPE_VITEC].read_header;
    const setting hook(img_type_hooks_table[IMG_TYPE_VITEC].read_header, [](img_desc *desc) {
        const std::int32_t result = read_header(desc);
        desc->lut_size = 3;
        return result;
    });
    const img_handle image = opening(m_name).result;
    EXPECT_EQ(img_find_image(image)->lut_size, 3);
    img_closefile(image);
    const setting open(img_type_table[IMG_TYPE_VITEC].open, nullptr);
    const setting create(img_type_table[IMG_TYPE_VITEC].create, nullptr);
    EXPECT_EQ(opening(m_name), REFUSED_QUIETLY);
    EXPECT_EQ(creating(m_name, IMG_TYPE_VITEC, {}).text, could_not_create(m_name));
}

TEST_F(Open, TakesPlainNamesAsTheyAre)
{
    const std::string name = m_folder / "@a@b.img";
    const img_io_method *const method = img_lookup_io_method("fault");
    img_closefile(img_create_plain_file(name.c_str(), method, 2, 3, 1, 0, 0, 0, 1));
    EXPECT_EQ(calls_of(io_call::open), 1);
    const img_handle opened = img_open_plain_file(name.c_str(), nullptr, IMG_OPEN_READ_ONLY);
    ASSERT_NE(opened, -1);
    EXPECT_EQ(img_find_image(opened)->filename.get(), name);
    img_closefile(opened);
    EXPECT_EQ(img_open_plain_file(nullptr, nullptr, IMG_OPEN_READ_ONLY), -1);
    memory_arm(2);  // the record, then the name
    EXPECT_EQ(refusal(img_open_plain_file, name.c_str(), method, 0), "Out of memory!!!\n");
}

TEST_F(Create, ReportsWhatItRefuses)
{
    const std::string no_name = "No image file name specified!!\n";
    EXPECT_EQ(creating("", IMG_NO_TYPE, {}).text, no_name);
    EXPECT_EQ(outcome_of([] { return img_createfile(nullptr, 1, 1, 1, 0, 0, 0, 1); }).text,
              no_name);
    for (const std::string &name : {m_folder / "no/folder", m_folder / "", m_file + "@nosuch"})
        EXPECT_EQ(creating(name, IMG_TYPE_HELAVA, {}).text, could_not_create(name));
    fault_arm(io_call::seek, 2);  // after the trailer
    EXPECT_EQ(creating(m_name, IMG_TYPE_HELAVA, {}).text, could_not_create(m_name));
    std::filesystem::remove(m_file);
    const setting no_handles(img_handle_pool, nullptr);  // types are checked before one is taken
    for (const std::int32_t type : {1, 43, 44, 45, -1, INT32_MIN, INT32_MAX})
        EXPECT_EQ(creating(m_file, type, {}).text, "Unwritable image type specified as output!!\n");
    EXPECT_FALSE(std::filesystem::exists(m_file));
}

TEST_F(Open, GivesImagesOfOneByteIdentityTablesAndThoseOfTwoTheStretch)
{
    const std::array<std::int32_t, 6> plain{8, 256, 0, 0, 8, 1},
        stretched{12, 0, IMG_CHAIN_LUT_FCN, IMG_CHAIN_REMAP_FCN, 8, 0};
    for (const std::int32_t nbytes : {1, 2, 1})  // one handle: nothing is left to its next image
        for (const bool create : {true, false}) {
            const outcome seen = create ? creating(m_name, 0, {.nbytes = nbytes}) : opening(m_name);
            const img_desc &desc = *img_find_image(seen.result);
            const img_chain &chain = img_chain_of(seen.result);
            EXPECT_EQ((std::array{desc.nbits, desc.lut_size, chain.links[0].kind,
                                  chain.links[9].kind, chain.out_bits, 0 + chain.identity}),
                      nbytes == 1 ? plain : stretched);
            for (std::size_t i = 0; i < 3 * 256 && nbytes == 1; ++i)
                EXPECT_EQ(desc.lut[i / 256][i % 256], i % 256);
            img_closefile(seen.result);
        }
}

TEST_F(Open, RawImagesShowStoredSamplesAndNeedNoHandle)
{
    const img_io_method *const fault = img_lookup_io_method("fault");
    std::vector<img_raw_image> images;
    const std::uint16_t sample = 0x1234;
    for (int i = 0; i < IMG_MAX_HANDLES + 5; ++i) {
        const std::string name = m_folder / ("@" + std::to_string(i));
        images.push_back(img_create_raw(name.c_str(), i == 0 ? fault : nullptr, 3, 5, 1,
                                        IMG_TYPE_VITEC, 0, 0, 2));
        ASSERT_TRUE(images.back());
        EXPECT_EQ(img_write_raw(images.back().get(), 2, 4, 1, 1, 0,
                                reinterpret_cast<const std::uint8_t *>(&sample), 1),
                  0);
    }
    images.clear();
    const std::string name = m_folder / "@7";
    images.push_back(img_open_raw(name.c_str(), nullptr, IMG_OPEN_READ_ONLY));
    std::array<std::uint16_t, 2> stored{};
    EXPECT_EQ(img_read_raw(images[0].get(), 2, 3, 1, 2, 0,
                           reinterpret_cast<std::uint8_t *>(stored.data()), 2),
              0);
    EXPECT_EQ(stored, (std::array<std::uint16_t, 2>{0, sample}));
    stored = {};
    const auto read_run = [&](std::int64_t samples_before, std::int32_t nsamps) {
        return img_read_raw_run(images[0].get(), VITEC_HEADER + samples_before * 2, nsamps,
                                reinterpret_cast<std::uint8_t *>(stored.data()));
    };
    EXPECT_EQ(read_run(13, 2), 0);
    EXPECT_EQ(stored, (std::array<std::uint16_t, 2>{0, sample}));
    EXPECT_EQ(read_run(14, 2), -1);
    std::uint8_t byte = 1;
    images.push_back(img_create_raw(m_file.c_str(), nullptr, 2, 2, 1, IMG_TYPE_HELAVA, 0, 0, 1));
    EXPECT_EQ(img_write_raw(images[1].get(), 1, 1, 1, 1, 0, &byte, 1), 0);
    byte = 9;
    EXPECT_EQ(img_read_raw_run(images[1].get(), 3, 1, &byte), 0);
    EXPECT_EQ(byte, 1);

    const auto fails = [](const img_raw_image &image, int error) {
        EXPECT_TRUE(!image && errno == error) << errno;
    };
    fails(img_open_raw((m_folder / "").c_str(), nullptr, IMG_OPEN_READ_ONLY), EINVAL);
    fails(img_create_raw(m_file.c_str(), nullptr, 3, 5, 1, IMG_TYPE_HELAVA, 0, 0, 2), EINVAL);
    fails(img_create_raw(m_file.c_str(), nullptr, 3, 5, 1, IMG_NO_TYPE, 0, 0, 1), EINVAL);
    fails(img_create_raw((m_folder / "no/scene").c_str(), nullptr, 3, 5, 1, 0, 0, 0, 1), ENOENT);
    const auto all_taken = [](const char *, std::int32_t, std::int32_t) {
        errno = EMFILE;
        return -1;
    };
    img_register_io_method("all_taken", nullptr, all_taken, nullptr, nullptr, nullptr, nullptr,
                           nullptr, nullptr);
    fails(img_open_raw("x", img_lookup_io_method("all_taken"), IMG_OPEN_READ_ONLY), EMFILE);
    for (const int nth : {1, 2}) {
        memory_arm(nth);
        fails(img_open_raw(name.c_str(), nullptr, IMG_OPEN_READ_ONLY), ENOMEM);
        memory_arm(nth);
        fails(img_create_raw(name.c_str(), nullptr, 3, 5, 1, 0, 0, 0, 1), ENOMEM);
    }
}
