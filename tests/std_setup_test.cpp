// Tests of std_setup.cpp: opening, creating, closing and deleting by the standard driver, and the
// layouts that it supports.
#include "base/settings.h"
#include "base/type_hooks.h"
#include "base/types.h"
#include "formats/header_file.h"
#include "formats/helava.h"
#include "io/io_method.h"
#include "std/std.h"
#include "std/std_setup.h"
#include "std/std_tiles.h"
#include "std/std_virtual_tiles.h"
#include "support/file_test.h"

#include <sys/stat.h>

namespace {

using StdFile = FileTest;
constexpr std::int32_t HEADER = TEST_HEADER_LENGTH;

TEST_F(StdFile, RefusesLayoutsThatCannotHoldTheImage)
{
    constexpr std::int32_t large = 1 << 15, max = INT32_MAX;
    const test_geometry cases[] = {{1, 1, 4, 1, 8, 8, IMG_LAYOUT_TILED_BIP},
                                   {1, 1, 1, 1, 8, 0, IMG_LAYOUT_TILED},
                                   {1, 1, 1, 1, 0, 0, IMG_LAYOUT_BAND_TILED},
                                   {1, 1, 1, 1, 0, 8, IMG_LAYOUT_TILED_BIP},
                                   {1, 1, 3, 1, large, large, IMG_LAYOUT_TILED_BIP},
                                   {0, 0, 1, 1, max, max, IMG_LAYOUT_TILED},
                                   {2 * large, 2 * large}};
    for (const test_geometry &image : cases) {
        EXPECT_EQ(outcome_of([&] { return create_test_file(m_name, image); }).result, -1);
        EXPECT_EQ(create_test_memory(image), -1);
        EXPECT_EQ(opening(m_name), REFUSED_QUIETLY);
        EXPECT_EQ(read_file(m_file).size(), HEADER);
    }
    // In memory the bands count.
    EXPECT_EQ(create_test_memory({1, 1, 3, 1, large / 2, large, IMG_LAYOUT_TILED_BIP}), -1);
    for (const auto &[nbytes, nbits] : {std::array{1, 0}, {1, 9}, {2, 8}, {2, 17}}) {
        img_desc *const desc = img_find_image(create_test_file(m_name, {.nbytes = nbytes}));
        desc->nbits = nbits;
        EXPECT_EQ(img_std_setup(desc), -1);
        img_closefile(desc->handle);
    }
    // Of a type that stores no whole tiles, the last one may reach too far.
    const setting padding(img_type_hooks_table[IMG_TYPE_HELAVA].padded_nsamps_fn, nullptr);
    for (const std::int32_t tile : {1 << 19, 1 << 20}) {
        const outcome seen =
            creating(m_name, IMG_TYPE_HELAVA, {1, INT32_MAX - (1 << 19) - 16, 1, 1, tile, 1});
        EXPECT_EQ(seen.result, tile == 1 << 19 ? 0 : -1);
        img_closefile(seen.result);
    }
}

TEST_F(StdFile, GivesVirtualTilesToUntiledImagesIfTilesAreCached)
{
    // Megabytes, default tile width and height, whether the type reads tiles in its own way.
    constexpr std::array<std::int32_t, 4> cases[] = {
        {1, 128, 64, 0}, {0, 128, 64, 0}, {1, 0, 64, 0}, {1, 128, 0, 0}, {1, 128, 64, 1}};
    img_closefile(
        create_test_file(m_name, {.nlines = 70, .nsamps = 300, .nbands = 2, .nbytes = 2}));
    for (const auto &[megabytes, tile_nsamps, tile_nlines, own] : cases) {
        const setting cache_mb(img_cache_mb, megabytes);
        const setting width(img_default_tile_nsamps, tile_nsamps),
            height(img_default_tile_nlines, tile_nlines);
        const setting reads(img_type_table[TEST_TYPE].read_tiles,
                            own != 0 ? img_std_read_virtual_tiles : img_std_read_tiles);
        const img_desc &desc = *img_find_image(opening(m_name).result);
        const img_std_file &file = *desc.std_file;
        EXPECT_EQ((std::array{desc.virtual_tiled, desc.layout, desc.tile_nsamps, desc.tile_nlines,
                              file.tiles_across, file.tiles_down, file.tile_size, file.band_size}),
                  tile_nsamps * tile_nlines * megabytes != 0 && own == 0
                      ? (std::array{1, 3, 128, 64, 3, 2, 16'384, 42'000})
                      : (std::array{0, 0, 0, 0, 0, 0, 0, 42'000}));
        img_closefile(desc.handle);
    }
}

TEST_F(StdFile, StandsAtItsStartOnceItIsOpenAndIsSharedByItsMode)
{
    ::umask(0);
    img_closefile(creating(m_file, IMG_TYPE_HELAVA, {.nlines = 100}).result);
    EXPECT_EQ(static_cast<unsigned>(std::filesystem::status(m_file).permissions()), 0666U);
    for (const std::int32_t type : {IMG_TYPE_HELAVA, IMG_TYPE_VITEC}) {
        for (const bool created : {true, false}) {
            const img_desc &desc = *img_find_image(
                (created ? creating(m_name, type, {.nlines = 100}) : opening(m_name)).result);
            EXPECT_EQ(desc.io_method->seek(desc.std_file->data_fd, 0, IMG_SEEK_CURRENT), 0);
            img_closefile(desc.handle);
        }
    }
}

TEST_F(StdFile, InMemoryHasThePaddedWidthAndCannotBeDeleted)
{
    img_desc *const desc = img_find_image(
        create_test_memory({.nlines = 4, .nsamps = 5, .nbands = 2, .tile_nsamps = 8}));
    EXPECT_EQ(desc->std_file->veof_max, 4 * 8 * 2 - 1);
    const std::uint8_t last = 9;
    EXPECT_EQ(dump(desc->handle, {.line = 3, .samp = 4}, &last), 0);
    EXPECT_EQ(desc->mem_image[3 * 8 + 4], last);
    desc->io_method = nullptr;  // a name may ask for one that does not exist
    EXPECT_EQ(img_std_delete(desc), -1);
    img_closefile(desc->handle);
}

TEST_F(StdFile, ClosesWhatIsOpenOnceAndOpensNothingTooShort)
{
    img_desc *const desc = img_find_image(create_test_file(m_name, {}));
    desc->std_file->hdr_fd = -1;
    img_std_fail_close(desc);
    img_std_fail_close(desc);
    img_closefile(desc->handle);
    for (std::size_t length = 0; length < 4; ++length) {
        write_file(m_file, bytes(length, 0x48));
        EXPECT_EQ(opening(m_file), REFUSED_QUIETLY);
        const img_io_method *const method = img_lookup_io_method("");
        const std::int32_t fd = method->open(m_file.c_str(), IMG_OPEN_READ_ONLY, 0);
        EXPECT_EQ(img_helava_find_magic({method, fd}), -1);
        method->close(fd);
    }
}

TEST_F(StdFile, ClosesBothDescriptorsAndDeletesBothFiles)
{
    const std::string companion = m_folder / "companion";
    const auto fail_close = [](img_desc *desc) {
        img_std_fail_close(desc);
        return -1;
    };
    const struct {
        img_image_fn operation;
        io_call call;
        int failing;  // the nth call of that kind
        std::int32_t result;
        bool keeps_companion;
        std::size_t length;  // of the file
    } cases[] = {{img_std_close, io_call::close, 2, -1, true, HEADER + 100},
                 {fail_close, io_call::close, 2, -1, true, HEADER},
                 {img_std_delete, io_call::unlink, 0, 0, false, 0},
                 {img_std_delete, io_call::unlink, 1, 0, true, 0},
                 {img_std_delete, io_call::unlink, 2, -1, false, HEADER}};
    for (const auto &each : cases) {
        write_file(companion, {1});
        img_desc *const desc = img_find_image(create_test_file(m_name, {100}));
        desc->std_file->hdr_fd = desc->io_method->open(m_file.c_str(), 0, 0);
        desc->std_file->companion_name = img_copy_name(companion);
        fault_arm(each.call, each.failing);
        EXPECT_EQ(each.operation(desc), each.result);
        EXPECT_EQ(open_descriptors, 0);
        EXPECT_EQ(std::filesystem::exists(companion), each.keeps_companion);
        EXPECT_EQ(read_file(m_file).size(), each.length);
        img_closefile(desc->handle);  // there is nothing left to close
    }
    img_desc *const alone = img_find_image(create_test_file(m_file, {}));
    EXPECT_EQ(img_std_delete(alone), 0);
    EXPECT_FALSE(std::filesystem::exists(m_file));
    img_closefile(alone->handle);
}

}  // namespace
