// Tests of std_memory.cpp, and of regions and tiles of images in memory.
#include "base/types.h"
#include "std/std.h"
#include "std/std_memory.h"

#include "std/std_interleaved_lines.h"
#include "std/std_lines.h"
#include "std/std_region.h"
#include "std/std_tiles.h"
#include "support/file_test.h"

#include <numeric>
#include <span>

namespace {

class VirtualIo : public FileTest {
protected:
    // Opens a file of 20 lines and an image in memory, whose bytes are 1, 2, 3, ...
    void open(std::int32_t nbands, const test_geometry &memory)
    {
        m_image = geometry(20, nbands, memory.nbytes, memory.layout);
        img_closefile(create_test_file(m_name, m_image));
        m_desc = img_find_image(open_test_file(m_name, IMG_OPEN_READ_WRITE));
        m_memory = img_find_image(create_test_memory(memory));
        m_pixels = {m_memory->mem_image.get(), stored_bytes(memory)};
        std::iota(m_pixels.begin(), m_pixels.end(), std::uint8_t{1});
        fault_arm(io_call::open, 0);
    }
    // An image of some lines, with tiles of 8 lines and 4 samples if the layout has any.
    static test_geometry geometry(std::int32_t nlines, std::int32_t nbands, std::int32_t nbytes,
                                  std::int32_t layout)
    {
        const std::int32_t tile = layout < IMG_LAYOUT_TILED ? 0 : 4;
        return {nlines, 6, nbands, nbytes, tile, 2 * tile, layout};
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

    test_geometry m_image;
    img_desc *m_desc = nullptr, *m_memory = nullptr;
    std::span<std::uint8_t> m_pixels;
};

TEST_F(VirtualIo, MovesAllAtOnceOrBandByBand)
{
    const struct {
        std::int32_t layout, nbands, transfers;
        const char *cut_short;  // the last transfer
    } cases[] = {
        {0, 3, 3, "img_std_io_virtual: 42 of 84 bytes ioed!!\n"},
        {1, 3, 1, "img_std_io_virtual:Only 126 of 252 bytes ioed!!\n"},
        {2, 3, 1, "img_std_io_virtual:Only 192 of 384 bytes ioed!!\n"},
        {3, 3, 3, "img_std_io_virtual: 64 of 128 bytes ioed!!\n"},
        {4, 1, 1, "img_std_io_virtual:Only 64 of 128 bytes ioed!!\n"},
    };
    for (const auto &[layout, nbands, transfers, cut_short] : cases) {
        open(nbands, geometry(7, nbands, 2, layout));
        const std::size_t size = m_pixels.size() / static_cast<std::size_t>(transfers);
        const bytes pixels(m_pixels.begin(), m_pixels.end());
        bytes file = read_file(m_file);
        for (std::int32_t band = 0; band < transfers; ++band)
            std::copy_n(&pixels[static_cast<std::size_t>(band) * size], size,
                        file.begin() + TEST_HEADER_LENGTH + stored_at(m_image, band, 8, 0));
        EXPECT_EQ(transfer(true), 0);
        EXPECT_EQ(read_file(m_file), file) << "layout " << layout;
        std::ranges::fill(m_pixels, std::uint8_t{0});
        EXPECT_EQ(transfer(false), 0);
        EXPECT_TRUE(std::ranges::equal(m_pixels, pixels)) << "layout " << layout;
        EXPECT_EQ((std::pair{calls_of(io_call::write), calls_of(io_call::read)}),
                  (std::pair{transfers, transfers}));
        for (const bool writing : {false, true})
            for (const fault kind : {fault::fails, fault::moves_half}) {
                fault_arm(writing ? io_call::write : io_call::read, transfers, kind);
                EXPECT_EQ(refusal([&] { return transfer(writing); }),
                          kind == fault::fails ? perror_line("img_std_io_virtual:write", EIO)
                                               : cut_short);
            }
        close();
        open(nbands, geometry(0, nbands, 2, layout));  // an image without lines adds none to a file
        const std::size_t length = read_file(m_file).size();
        std::filesystem::resize_file(m_file, TEST_HEADER_LENGTH);
        EXPECT_EQ(transfer(true) + transfer(false), 0);
        EXPECT_EQ(read_file(m_file).size(), 0U + TEST_HEADER_LENGTH);
        close();
        EXPECT_EQ(read_file(m_file).size(), length);
    }
}

TEST_F(VirtualIo, RefusesImagesAndPlacesThatDoNotFit)
{
    const auto only = [](const std::string &what) {
        return "Only images with same " + what + " currently supported!\n";
    };
    const std::string corners = "Tiled images must be loaded/dumped on tile boundaries!!\n";
    const struct {
        test_geometry memory;
        std::int32_t line0, samp0;
        std::string expected;
    } cases[] = {
        {{7, 5, 2, 1, 8, 8, 2}, 1, 1, only("# samps")},
        {{7, 6, 2, 1, 8, 8, 2}, 1, 1, only("# bands")},
        {{7, 6, 3, 1, 8, 8, 2}, 1, 1, only("tile sizes")},
        {{7, 6, 3, 1, 4, 4, 2}, 0, 0, only("tile sizes")},
        {{7, 6, 3, 1, 4, 8, 2}, 4, 0, corners},
        {{7, 6, 3, 1, 4, 8, 2}, 0, 3, corners},
        {{7, 6, 3, 1, 4, 8, 2}, 24, 0, ""},
        {{7, 6, 3, 1, 4, 8, 2}, -8, 0, ""},
        {{7, 6, 3}, -1, 0, ""},
        {{7, 6, 3}, 0, INT32_MAX, ""},
    };
    for (const auto &each : cases) {
        open(3, each.memory);
        for (const bool writing : {false, true})
            EXPECT_EQ(refusal([&] { return transfer(writing, each.line0, each.samp0); }),
                      each.expected);
        m_desc->std_file->data_offset = INT32_MAX - 9;  // a place for the first samples alone
        refusal([&] { return transfer(true, 0); });
        m_desc->std_file->data_offset = TEST_HEADER_LENGTH;
        EXPECT_EQ(calls_of(io_call::read) + calls_of(io_call::write), 0);
        for (img_desc *const both : {m_desc, m_memory})
            EXPECT_EQ(refusal([=] { return img_std_io_virtual(1, both, both, 0, 0); }), "");
        close();
    }
}

TEST_F(VirtualIo, ReachesThePixelsInMemoryAndNoneBeyond)
{
    const std::string beyond = "img_std_pix_io_virtual:Pixel out of range.\n";
    for (const std::int32_t nbytes : {1, 2}) {
        open(3, {7, 6, 3, nbytes, 0, 0, IMG_LAYOUT_BIP});
        bytes value(static_cast<std::size_t>(nbytes), 99);
        const auto pixel = [&](std::int32_t writing, std::int32_t line, std::int32_t samp,
                               std::int32_t band) {
            return img_type_of(m_memory).pix_io_virtual(writing, m_memory, line, samp, band,
                                                        value.data());
        };
        const auto refused = [&](auto... place) { return refusal(pixel, 1, place...); };
        EXPECT_EQ(pixel(1, 6, 5, 1) + pixel(0, 6, 5, 2), 0);
        EXPECT_EQ(value.back(), (126 * nbytes) % 256);
        EXPECT_EQ(pixel(1, 0, 0, 0) + pixel(0, 6, 5, 1), 0);
        EXPECT_EQ(value, bytes(value.size(), 99));
        EXPECT_EQ(refused(6, 5, 3), beyond);
        EXPECT_EQ(refused(INT32_MAX, 0, 0), beyond);
        EXPECT_EQ(refused(-1, 0, 0) + refused(0, -1, 0) + refused(0, 0, -1), "");
        --m_memory->std_file->veof_max;  // in the middle of two bytes
        EXPECT_EQ(refused(6, 5, 2), nbytes == 1 ? beyond : "");
        std::swap(m_desc, m_memory);
        EXPECT_EQ(refused(0, 0, 0), "");  // in a file
        close();
    }
}

TEST(MemoryImages, AreMovedWithinTheirBytesAlone)
{
    const std::pair lines{"img_read_nontiled: read", "img_write_nontiled: Write"};
    const std::pair tiles{"img_std_read_tiles: read", "img_std_write_tiles: write"};
    const std::pair pixels{"img_std_read_nontiled_interleaved: read",
                           "img_std_write_nontiled_interleaved: Write"};
    const std::pair<std::string, std::string> texts[] = {lines, pixels, tiles, tiles, tiles, lines};
    constexpr std::int32_t max = INT32_MAX;
    constexpr std::array<std::int32_t, 5> not_inside[] = {
        {-1, 0, 1, 1, 0}, {3, 0, 2, 1, 0},     {max, 0, max, 1, 0}, {0, -1, 1, 1, 0},
        {0, 9, 1, 2, 0},  {0, max, 1, max, 0}, {0, 0, 1, 1, -1},    {0, 0, 1, 1, 2}};
    for (std::int32_t layout = IMG_LAYOUT_BSQ; layout <= 5; ++layout) {
        test_geometry image{.nlines = 4, .nsamps = 10, .nbands = 2, .nbytes = 2, .layout = layout};
        if (layout >= IMG_LAYOUT_TILED && layout <= IMG_LAYOUT_TILED_BIP) {
            image.tile_nsamps = 5;
            image.tile_nlines = 4;
        }
        img_desc *const desc = img_find_image(create_test_memory(image));
        img_std_file *const file = desc->std_file;
        const auto last = static_cast<std::int32_t>(stored_bytes(image)) - 1;
        bytes buffer(80, 9);
        const auto load = [&] {
            return img_is_tiled(desc) ? img_std_read_tiles(desc, 0, 2, 1, buffer.data())
                                      : img_std_read(desc, 0, 0, 4, 10, 1, buffer.data(), 10);
        };
        const auto dump = [&](std::int32_t line, std::int32_t samp) {
            return img_std_write(desc, line, samp, 1, 1, 1, buffer.data(), 1, nullptr);
        };
        file->veof = file->veof_max = last - 1;
        EXPECT_EQ(refusal(load), texts[layout].first + " beyond virtual eof!!\n");
        EXPECT_EQ(refusal([&] { return dump(3, 9); }),
                  texts[layout].second + " past virtual eof!!\n");
        EXPECT_EQ(desc->mem_image[static_cast<std::size_t>(last)], 0);
        file->veof_max = last;
        EXPECT_EQ(dump(3, 9) + dump(0, 0) + load(), 0);
        EXPECT_EQ(file->veof, last);
        EXPECT_EQ(img_std_read(desc, -1, 0, 1, 0, 9, nullptr, 1), 0);
        EXPECT_EQ(img_std_write(desc, 0, 0, 0, 1, 0, nullptr, 1, nullptr), 0);
        for (const auto &[line, samp, nlines, nsamps, band] : not_inside) {
            EXPECT_EQ(img_std_read(desc, line, samp, nlines, nsamps, band, nullptr, 1), -1);
            EXPECT_EQ(img_std_write(desc, line, samp, nlines, nsamps, band, nullptr, 1, nullptr),
                      -1);
        }
        img_closefile(desc->handle);
    }
}

}  // namespace
