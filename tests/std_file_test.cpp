#include "std/std.h"

#include "io/io_method.h"
#include "support/file_test.h"

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

TEST_F(StdFile, SetUpDerivesTheOrganisation)
{
    const struct {
        test_geometry image;
        // layout, padded_nsamps and _nlines, band_size, tiles_across and _down, tile_size
        std::array<std::int32_t, 7> expected;
        std::int32_t memory;  // bytes of the image in memory
    } cases[] = {
        {{1000, 1000, 1, 1, 256, 256, 6}, {2, 1024, 1024, 1 << 20, 4, 4, 1 << 16}, 1 << 20},
        {{1000, 1000, 3, 1, 256, 256, 4}, {4, 1024, 1024, 1 << 20, 4, 4, 3 << 16}, 9 << 20},
        {{1000, 1000, 3, 2, 256, 256, 3}, {3, 1024, 1024, 2 << 20, 4, 4, 2 << 16}, 6 << 20},
        {{64, 256, 1, 2, 128, 16, 2}, {2, 256, 64, 32'768, 2, 4, 4096}, 32'768},
        {{65, 257, 2, 1, 128, 16, 2}, {2, 384, 80, 30'720, 3, 5, 2048}, 61'440},
        {{70, 300, 3, 2, 0, 0, 6}, {0, 300, 70, 42'000, 0, 0, 0}, 126'000},
        {{70, 300, 1, 1, 0, 16, 6}, {0, 300, 80, 24'000, 0, 0, 0}, 21'000},
        {{70, 300, 1, 1, 16, 0, 6}, {0, 304, 70, 21'280, 0, 0, 0}, 21'280},
        {{0, 300, 1, 1, 128, 16, 2}, {2, 384, 0, 0, 3, 0, 2048}, 0}};
    for (const auto &[image, expected, memory] : cases) {
        for (const img_handle handle :
             {create_test_file(m_name, image), create_test_memory(image)}) {
            img_desc *const desc = img_find_image(handle);
            ASSERT_NE(desc, nullptr);
            const img_std_file &file = *desc->std_file;
            EXPECT_EQ(
                (std::array{desc->layout, file.padded_nsamps, file.padded_nlines, file.band_size,
                            file.tiles_across, file.tiles_down, file.tile_size}),
                expected);
            const bool in_file = desc->mem_image == nullptr;
            EXPECT_EQ(file.veof, in_file ? HEADER : memory - 1);
            EXPECT_EQ(file.veof_max, file.veof);
            EXPECT_TRUE(!in_file || desc->io_method->seek(file.data_fd, 0, 1) == 0);
            EXPECT_TRUE(in_file ||
                        std::count(&desc->mem_image[0], &desc->mem_image[0] + memory, 0) == memory);
            EXPECT_TRUE(in_file || img_std_extend(desc, 5) == 0);
            img_closefile(handle);
        }
        EXPECT_EQ(read_file(m_file).size(), HEADER + image.nbands * expected[3]);
    }
}

TEST_F(StdFile, RefusesLayoutsThatCannotHoldTheImage)
{
    for (const test_geometry &image :
         std::initializer_list<test_geometry>{{1, 1, 4, 1, 8, 8, 4},
                                              {1, 1, 1, 1, 8, 0, 2},
                                              {1, 1, 1, 1, 0, 0, 3},
                                              {1, 1, 1, 1, 0, 8, 4},
                                              {1, 1, 3, 1, 32768, 32768, 4},
                                              {65536, 65536, 1, 1, 0, 0, 0}}) {
        printed_by([&] { EXPECT_EQ(create(image), nullptr); });
        EXPECT_EQ(create_test_memory(image), -1);
        EXPECT_EQ(opening(m_name), REFUSED_QUIETLY);
        EXPECT_EQ(read_file(m_file).size(), HEADER);
    }
}

TEST_F(StdFile, GivesVirtualTilesToUntiledImagesIfTilesAreCached)
{
    const struct {
        std::int32_t cache_mb, default_nsamps, default_nlines, layout, tile;
        bool own_read_tiles, expected;
    } cases[] = {{1, 128, 64, 0, 0, false, true},  {0, 128, 64, 0, 0, false, false},
                 {1, 0, 64, 0, 0, false, false},   {1, 128, 0, 0, 0, false, false},
                 {1, 128, 64, 1, 0, false, false}, {1, 128, 64, 2, 8, false, false},
                 {1, 128, 64, 0, 0, true, false}};
    for (const auto &[cache_mb, nsamps, nlines, layout, tile, own_read_tiles, expected] : cases) {
        img_closefile(create({70, 300, 2, 2, tile, tile, layout})->handle);
        img_cache_mb = cache_mb;
        img_default_tile_nsamps = nsamps;
        img_default_tile_nlines = nlines;
        if (own_read_tiles) img_type_table[TEST_TYPE].read_tiles = img_std_read_virtual_tiles;
        const img_handle handle = opening(m_name).result;
        const img_desc *const desc = img_find_image(handle);
        ASSERT_NE(desc, nullptr);
        EXPECT_EQ(desc->virtual_tiled, expected ? 1 : 0);
        const img_std_file &file = *desc->std_file;
        const std::array seen{desc->layout,      desc->tile_nsamps, desc->tile_nlines,
                              file.tiles_across, file.tiles_down,   file.tile_size,
                              file.band_size};
        EXPECT_EQ(seen == (std::array{3, 128, 64, 3, 2, 16'384, 42'000}), expected);
        img_closefile(handle);
        img_cache_mb = 0;
        img_default_tile_nsamps = img_default_tile_nlines = 128;
    }
}

TEST_F(StdFile, CloseCompletesWhatIsShortAndLeavesWhatIsLonger)
{
    img_closefile(create({3, 5, 2})->handle);  // 36 + 30 bytes
    const bytes complete = read_file(m_file);
    // The length of a file, how it is opened, and its length afterwards.
    const std::array<std::int32_t, 3> cases[] = {
        {65, 2, 66}, {66, 2, 66}, {75, 2, 75}, {40, 2, 66}, {65, 0, 65}};
    for (const auto &[length, flags, expected] : cases) {
        bytes file = complete;
        file.resize(static_cast<std::size_t>(length), 0x55);
        write_file(m_file, file);
        const img_desc *const desc = img_find_image(opening(m_name, flags).result);
        EXPECT_EQ((std::array{desc->std_file->veof, desc->std_file->veof_max}),
                  (std::array{length, length}));
        img_closefile(desc->handle);
        file.resize(static_cast<std::size_t>(expected));
        EXPECT_EQ(read_file(m_file), file);
    }
}

TEST_F(StdFile, CloseReturnsTheResultOfClosingAndAlwaysEnds)
{
    for (const io_call call : {io_call::close, io_call::seek, io_call::write}) {
        img_desc *const desc = create({3, 5});
        desc->std_file->companion_name = new char[2]{};
        fault_arm(call, 1, fault::fails, true);
        EXPECT_EQ(img_std_close(desc), call == io_call::close ? -1 : 0);
        EXPECT_TRUE(fault_fired());
        EXPECT_EQ(img_std_close(desc), 0);  // there is nothing left to close
        img_closefile(desc->handle);
        EXPECT_EQ(open_descriptors(), 0);
        EXPECT_EQ(read_file(m_file).size(), HEADER + (call == io_call::close ? 15 : 0));
        fault_arm(call, 0);
    }
}

TEST_F(StdFile, ClosesBothDescriptorsAndDeletesBothFiles)
{
    const std::string companion = m_folder / "companion";
    for (const int failing : {-1, 0, 1, 2}) {  // of the two removals; -1: the image is kept
        write_file(companion, {1});
        img_desc *const desc = create({100});
        desc->std_file->hdr_fd = desc->io_method->open(m_file.c_str(), 0, 0);
        desc->std_file->companion_name = new char[companion.size() + 1]{};
        companion.copy(desc->std_file->companion_name, companion.size());
        fault_arm(io_call::unlink, failing);
        const std::int32_t result =
            failing == -1 ? (img_std_fail_close(desc), 0) : img_std_delete(desc);
        EXPECT_EQ(result, failing == 2 ? -1 : 0);
        EXPECT_EQ(open_descriptors(), 0);
        EXPECT_EQ(std::filesystem::exists(companion), failing == 1 || failing == -1);
        EXPECT_EQ(read_file(m_file).size(), failing == 2 || failing == -1 ? HEADER : 0);
        img_closefile(desc->handle);
    }
}

TEST_F(StdFile, GrowsByZeroBytesOnTheWayToAWrite)
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
    EXPECT_EQ(desc->std_file->veof, 93);
    for (const io_call call : {io_call::seek, io_call::write}) {
        fault_arm(call, 1, call == io_call::seek ? fault::fails : fault::moves_none, true);
        EXPECT_EQ(img_std_extend(desc, 3), -1);
        EXPECT_EQ(img_std_seek_to_write(desc, 120), -1);
    }
    fault_arm(io_call::seek, 1, fault::stands_off);
    EXPECT_EQ(img_std_seek_to_write(desc, 50), -1);
    fault_arm(io_call::seek, 2, fault::stands_off);
    EXPECT_EQ(img_std_extend(desc, 3), -1);
    EXPECT_EQ(read_file(m_file), expected);
    img_closefile(desc->handle);
}

}  // namespace
