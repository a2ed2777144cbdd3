#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/settings.h"
#include "base/type_hooks.h"
#include "base/types.h"
#include "imgfile/img.h"
#include "std/std.h"
#include "std/std_bytes.h"
#include "std/std_setup.h"
#include "std/std_tiles.h"
#include "std/std_virtual_tiles.h"

#include "support/file_test.h"
#include "support/refusal.h"

#include <fstream>

namespace {

class StdFile : public FileTest {
protected:
    // Creates an image of the test type, which takes any layout; null: refused.
    img_desc *create(const test_geometry &image) const
    {
        return img_find_image(create_test_file(m_name, image));
    }
};
constexpr std::int32_t HEADER = TEST_HEADER_LENGTH;

TEST_F(StdFile, RefusesLayoutsThatCannotHoldTheImage)
{
    const test_geometry cases[] = {{1, 1, 4, 1, 8, 8, 4},
                                   {1, 1, 1, 1, 8, 0, 2},
                                   {1, 1, 1, 1, 0, 0, 3},
                                   {1, 1, 1, 1, 0, 8, 4},
                                   {1, 1, 3, 1, 1 << 15, 1 << 15, 4},
                                   {0, 0, 1, 1, INT32_MAX, INT32_MAX, 2},
                                   {1 << 16, 1 << 16, 1, 1, 0, 0, 0}};
    for (const test_geometry &image : cases) {
        printed_by([&] { EXPECT_EQ(create(image), nullptr); });
        EXPECT_EQ(create_test_memory(image), -1);
        EXPECT_EQ(opening(m_name), REFUSED_QUIETLY);
        EXPECT_EQ(read_file(m_file).size(), HEADER);
    }
    EXPECT_EQ(create_test_memory({1, 1, 3, 1, 1 << 14, 1 << 15, 4}), -1);  // three times as large
    for (const auto &[nbytes, nbits] : {std::array{1, 0}, {1, 9}, {2, 8}, {2, 17}}) {
        img_desc *const desc = create({.nbytes = nbytes});
        desc->nbits = nbits;
        EXPECT_EQ(img_std_setup(desc), -1);
        img_closefile(desc->handle);
    }
    // Of a type that stores no whole tiles, the last one may reach too far.
    img_type_hooks &hooks = img_type_hooks_table[IMG_TYPE_HELAVA];
    const auto saved = std::exchange(hooks.padded_nsamps_fn, nullptr);
    for (const std::int32_t tile : {1 << 19, 1 << 20}) {
        const outcome seen =
            creating(m_name, IMG_TYPE_HELAVA, {1, INT32_MAX - (1 << 19) - 16, 1, 1, tile, 1});
        EXPECT_EQ(seen.result, tile == 1 << 19 ? 0 : -1);
        img_closefile(seen.result);
    }
    hooks.padded_nsamps_fn = saved;
}

TEST_F(StdFile, GivesVirtualTilesToUntiledImagesIfTilesAreCached)
{
    // Megabytes, default tile width and height, whether the type reads tiles in its own way.
    constexpr std::array<std::int32_t, 4> cases[] = {
        {1, 128, 64, 0}, {0, 128, 64, 0}, {1, 0, 64, 0}, {1, 128, 0, 0}, {1, 128, 64, 1}};
    img_closefile(create({70, 300, 2, 2})->handle);
    for (const auto &each : cases) {
        img_cache_mb = each[0];
        img_default_tile_nsamps = each[1];
        img_default_tile_nlines = each[2];
        if (each[3] != 0) img_type_table[TEST_TYPE].read_tiles = img_std_read_virtual_tiles;
        const img_desc &desc = *img_find_image(opening(m_name).result);
        const img_std_file &file = *desc.std_file;
        EXPECT_EQ((std::array{desc.virtual_tiled, desc.layout, desc.tile_nsamps, desc.tile_nlines,
                              file.tiles_across, file.tiles_down, file.tile_size, file.band_size}),
                  &each == cases ? (std::array{1, 3, 128, 64, 3, 2, 16'384, 42'000})
                                 : (std::array{0, 0, 0, 0, 0, 0, 0, 42'000}));
        img_closefile(desc.handle);
    }
    img_cache_mb = 0;
    img_default_tile_nsamps = img_default_tile_nlines = 128;
}

TEST_F(StdFile, ClosesBothDescriptorsAndDeletesBothFiles)
{
    const std::string companion = m_folder / "companion";
    for (const int failing :
         {-2, -1, 0, 1, 2}) {  // of the two removals; below 0: the image is kept
        write_file(companion, {1});
        img_desc *const desc = create({100});
        desc->std_file->hdr_fd = desc->io_method->open(m_file.c_str(), 0, 0);
        desc->std_file->companion_name = img_copy_name(companion);
        fault_arm(failing < 0 ? io_call::close : io_call::unlink, failing < 0 ? 2 : failing);
        std::int32_t result = -1;
        if (failing == -1)
            img_std_fail_close(desc);
        else
            result = failing == -2 ? img_std_close(desc) : img_std_delete(desc);
        EXPECT_EQ(result, failing < 0 || failing == 2 ? -1 : 0);
        EXPECT_EQ(open_descriptors(), 0);
        EXPECT_EQ(std::filesystem::exists(companion), failing == 1 || failing < 0);
        const std::size_t length = failing == -2                   ? HEADER + 100
                                   : failing == -1 || failing == 2 ? HEADER
                                                                   : 0;
        EXPECT_EQ(read_file(m_file).size(), length);
        img_closefile(desc->handle);  // there is nothing left to close
    }
}

TEST_F(StdFile, GrowsByZeroBytesUpToAWriteAndToItsFullSize)
{
    img_desc *const desc = create({1, 100});
    bytes expected = read_file(m_file);
    expected.resize(90);
    expected[HEADER + 3] = '+';
    expected.insert(expected.end(), {'n', 'e', 'w'});
    EXPECT_EQ(img_std_extend(desc, 3), 0);
    EXPECT_EQ(desc->io_method->seek(desc->std_file->data_fd, 0, 1), HEADER + 3);
    std::ofstream(m_file, std::ios::app) << "+";  // grown by someone else meanwhile
    EXPECT_EQ(img_std_write_at(desc, 90, "new", 3), 3);
    EXPECT_EQ((std::array{desc->std_file->veof, desc->std_file->veof_max}),
              (std::array{93, HEADER}));
    EXPECT_EQ(read_file(m_file), expected);
    img_closefile(desc->handle);
    expected.resize(HEADER + 100);
    EXPECT_EQ(read_file(m_file), expected);
    expected.push_back('+');  // what is longer stays so
    write_file(m_file, expected);
    img_closefile(opening(m_name).result);
    EXPECT_EQ(read_file(m_file), expected);
}

TEST_F(StdFile, TransfersThatCannotBeFailWithAReason)
{
    img_desc *const desc = create({});
    std::uint8_t sample = 0;
    for (const std::int64_t offset : {std::int64_t{INT32_MAX} + 1, INT64_MAX}) {
        EXPECT_EQ(img_std_read_at(desc, offset, &sample, 1), -1);
        EXPECT_EQ(std::exchange(errno, 0), EOVERFLOW);
        EXPECT_EQ(img_std_write_at(desc, offset, &sample, 1), -1);
        EXPECT_EQ(std::exchange(errno, 0), EOVERFLOW);
    }
    fault_arm(io_call::seek, 1);
    EXPECT_EQ(img_std_extend(desc, 3), -1);
    EXPECT_EQ(std::exchange(errno, 0), EIO);
    img_io_method silent = *desc->io_method;
    silent.read = [](auto...) { return errno = 0, -1; };
    desc->io_method = &silent;
    const std::int32_t got = img_std_read_at(desc, HEADER, &sample, 1);
    int missed = 0;
    img_std_note_missed(desc, HEADER, got, 1, &missed);
    EXPECT_EQ(missed, EIO);  // a method that gives no reason still fails for one
    desc->std_file->hdr_fd = -1;
    img_std_fail_close(desc);
    img_std_fail_close(desc);  // there is nothing left to close
    img_closefile(desc->handle);
}

TEST_F(StdFile, AnImageInMemoryHasNoFileToExtendOrDelete)
{
    img_desc *const desc = img_find_image(create_test_memory({}));
    EXPECT_EQ(img_std_extend(desc, 5), 0);
    desc->io_method = nullptr;  // a name may ask for one that does not exist
    EXPECT_EQ(img_std_delete(desc), -1);
    img_closefile(desc->handle);
}

TEST_F(StdFile, HeadersMayBeginAnywhereInAVitecFile)  // the first one here in its first block
{
    constexpr std::int32_t magic = 0x005B0720;
    write_file(m_file, vitec_file({2, 3}, 244, {.link = -4, .header_length = magic}));
    const img_desc *const desc = img_find_image(opening(m_name, 0).result);
    ASSERT_NE(desc, nullptr);
    EXPECT_EQ(desc->std_file->data_offset, magic);
    img_closefile(desc->handle);
}

}  // namespace
