// Tests of std_memory.cpp, and of regions and tiles of images in memory.
#include "base/types.h"
#include "std/std.h"
#include "std/std_interleaved_lines.h"
#include "std/std_lines.h"
#include "std/std_memory.h"
#include "std/std_offset.h"
#include "std/std_region.h"
#include "std/std_tiles.h"
#include "support/file_test.h"

#include <numeric>
#include <span>

namespace {

class VirtualIo : public FileTest {
protected:
    // Opens a file, and an image in memory that fits it, of bytes 1, 2, 3, ...
    void open(test_geometry image, std::int32_t lines_in_memory)
    {
        img_closefile(create_test_file(m_name, image));
        m_desc = img_find_image(open_test_file(m_name, IMG_OPEN_READ_WRITE));
        image.nlines = lines_in_memory;
        m_memory = img_find_image(create_test_memory(image));
        m_pixels = {m_memory->mem_image.get(), stored_bytes(image)};
        std::iota(m_pixels.begin(), m_pixels.end(), std::uint8_t{1});
        fault_arm(io_call::open, 0);
    }
    void close()
    {
        img_closefile(m_desc->handle);
        img_closefile(m_memory->handle);
    }
    std::int32_t transfer(bool writing, std::int32_t line0 = 8, std::int32_t samp0 = 0)
    {
        return img_type_of(m_desc).io_virtual(writing ? 1 : 0, m_desc, m_memory, line0, samp0);
    }

    img_desc *m_desc = nullptr, *m_memory = nullptr;
    std::span<std::uint8_t> m_pixels;
};

TEST_F(VirtualIo, MovesAllAtOnceOrBandByBand)
{
    for (const std::int32_t layout : {0, 1, 2, 3, 4}) {
        const std::int32_t tile = layout < IMG_LAYOUT_TILED ? 0 : 4;
        const std::int32_t nbands = layout == IMG_LAYOUT_TILED_BIP ? 1 : 3;
        const std::int32_t transfers = layout % 3 == 0 ? 3 : 1;
        const test_geometry image{20, 6, nbands, 2, tile, 2 * tile, layout};
        open(image, 7);
        const std::size_t size = m_pixels.size() / img_count(transfers);
        const bytes pixels(m_pixels.begin(), m_pixels.end());
        bytes file = read_file(m_file);
        for (std::int32_t band = 0; band < transfers; ++band)
            std::copy_n(&pixels[img_count(band) * size], size,
                        file.begin() + TEST_HEADER_LENGTH + stored_at(image, band, 8, 0));
        EXPECT_EQ(transfer(true), 0);
        EXPECT_EQ(read_file(m_file), file) << "layout " << layout;
        std::ranges::fill(m_pixels, std::uint8_t{0});
        EXPECT_EQ(transfer(false), 0);
        EXPECT_TRUE(std::ranges::equal(m_pixels, pixels)) << "layout " << layout;
        for (const bool writing : {false, true})
            for (const fault kind : {fault::fails, fault::moves_half}) {
                fault_arm(writing ? io_call::write : io_call::read, transfers, kind);
                EXPECT_NE(refusal([&] { return transfer(writing); }), "");
            }
        close();
    }
}

TEST_F(VirtualIo, RefusesImagesAndPlacesThatDoNotFit)
{
    const test_geometry tiled{7, 6, 3, 1, 4, 8, IMG_LAYOUT_TILED};
    open(tiled, 7);
    const auto refused = [this](std::int32_t line0 = 8, std::int32_t samp0 = 0) {
        return refusal([=, this] { return transfer(true, line0, samp0); });
    };
    for (std::int32_t img_desc::*const extent :
         {&img_desc::nsamps, &img_desc::nbands, &img_desc::tile_nsamps, &img_desc::tile_nlines}) {
        const setting other(m_memory->*extent, 9);
        EXPECT_NE(refused(), "");
    }
    EXPECT_NE(refused(4, 0), "");
    EXPECT_NE(refused(0, 3), "");
    for (const auto &[line, samp] : {std::pair{-8, 0}, {24, 0}, {0, 8}})
        EXPECT_EQ(refused(line, samp), "");
    m_desc->std_file->data_offset = INT32_MAX - 9;  // a place for the first samples alone
    for (const std::int32_t line : {0, 8}) EXPECT_EQ(refused(line, 0), "");
    m_desc->std_file->data_offset = TEST_HEADER_LENGTH;
    EXPECT_EQ(calls_of(io_call::write), 0);
    for (img_desc *const both : {m_desc, m_memory})
        EXPECT_EQ(refusal([=] { return img_std_io_virtual(1, both, both, 0, 0); }), "");
    close();
    open({.nlines = 7}, 0);  // an image without lines adds none to a file
    std::filesystem::resize_file(m_file, TEST_HEADER_LENGTH);
    EXPECT_EQ(transfer(true), 0);
    EXPECT_EQ(read_file(m_file).size(), 0U + TEST_HEADER_LENGTH);
    close();
}

TEST_F(VirtualIo, ReachesThePixelsInMemoryAndNoneBeyond)
{
    open({7, 6, 3, 2, 0, 0, IMG_LAYOUT_BIP}, 7);
    bytes value{99, 98};
    const auto pixel = [&](std::int32_t writing, std::int32_t line, std::int32_t samp,
                           std::int32_t band) {
        return img_std_pix_io_virtual(writing, m_memory, line, samp, band, value.data());
    };
    EXPECT_EQ(pixel(1, 6, 5, 1) + pixel(0, 0, 0, 1), 0);
    EXPECT_EQ(value, (bytes{3, 4}));
    EXPECT_EQ(pixel(0, 6, 5, 1), 0);
    EXPECT_EQ(value, (bytes{99, 98}));
    --m_memory->std_file->veof_max;  // in the middle of two bytes
    for (const auto &[line, samp, band] : {std::array{-1, 0, 0}, {0, -1, 0}, {0, 0, -1}, {6, 5, 2}})
        EXPECT_EQ(refusal(pixel, 1, line, samp, band), "");
    for (const auto &[line, band] : {std::pair{6, 3}, {INT32_MAX, 0}})
        EXPECT_EQ(refusal(pixel, 1, line, 5, band), "img_std_pix_io_virtual:Pixel out of range.\n");
    std::swap(m_desc, m_memory);
    EXPECT_EQ(refusal(pixel, 1, 0, 0, 0), "");  // in a file
    close();
}

TEST(MemoryImages, AreMovedWithinTheirBytesAlone)
{
    constexpr transfer cases[] = {{.nlines = 0},
                                  {.nsamps = 0},
                                  {.line = 3, .nlines = 2},
                                  {.samp = -1},
                                  {.samp = INT32_MAX, .nsamps = INT32_MAX},
                                  {.band = 2}};
    for (std::int32_t layout = IMG_LAYOUT_BSQ; layout <= 5; ++layout) {
        const bool tiled = layout >= IMG_LAYOUT_TILED && layout <= IMG_LAYOUT_TILED_BIP;
        const test_geometry image{4, 10, 2, 2, tiled ? 5 : 0, tiled ? 4 : 0, layout};
        img_desc *const desc = img_find_image(create_test_memory(image));
        img_std_file *const file = desc->std_file;
        const auto last = static_cast<std::int32_t>(stored_bytes(image)) - 1;
        bytes buffer(80, 9);
        const auto load = [&] {
            return img_is_tiled(desc) ? img_std_read_tiles(desc, 0, 2, 1, buffer.data())
                                      : img_std_read(desc, 0, 0, 4, 10, 1, buffer.data(), 10);
        };
        const auto dump = [&] {
            return img_std_write(desc, 3, 9, 1, 1, 1, buffer.data(), 1, nullptr);
        };
        file->veof = file->veof_max = last - 1;
        EXPECT_TRUE(refusal(load).ends_with(" beyond virtual eof!!\n"));
        EXPECT_TRUE(refusal(dump).ends_with(" past virtual eof!!\n"));
        EXPECT_EQ(desc->mem_image[img_count(last)], 0);
        file->veof_max = last;
        EXPECT_EQ(dump() + load(), 0);
        EXPECT_EQ(file->veof, last);
        EXPECT_EQ(img_std_sample_offset(desc, 3, 9, 1), layout == 5 ? 0 : last - 1);
        for (const auto &[band, line, samp, nlines, nsamps, stride, tiles, writes] : cases) {
            const std::int32_t result = nlines * nsamps == 0 ? 0 : -1;
            EXPECT_EQ(img_std_read(desc, line, samp, nlines, nsamps, band, nullptr, 1), result);
            EXPECT_EQ(img_std_write(desc, line, samp, nlines, nsamps, band, nullptr, 1, nullptr),
                      result);
        }
        for (const auto &[line, samp, band] : {std::array{-1, 0, 0}, {0, -1, 0}, {0, 0, -1}})
            EXPECT_EQ(img_std_sample_offset(desc, line, samp, band), -1);
        EXPECT_EQ(img_read_nontiled(desc, 0, 0, -1, 1, 0, nullptr, 1), 0);
        EXPECT_EQ(img_std_write_nontiled(desc, 0, 0, -1, 1, 0, nullptr, 1, nullptr), 0);
        EXPECT_EQ(img_std_read_nontiled_interleaved(desc, 0, 0, -1, 1, 0, nullptr, 1), 0);
        img_closefile(desc->handle);
    }
}

}  // namespace
