// Tests of image files: a folder for each, opening and creating with all that a host sees of it,
// and files put together byte by byte as other writers may have left them.
#ifndef IMG_TEST_FILE_TEST_H
#define IMG_TEST_FILE_TEST_H

#include "base/id_pool.h"
#include "base/image_table.h"
#include "base/img_desc.h"
#include "chain/chain_links.h"
#include "imgfile/img.h"
#include "support/fault_method.h"
#include "support/files.h"
#include "support/layout_rules.h"
#include "support/test_image.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cerrno>
#include <gtest/gtest.h>
#include <ostream>

// What a call answers, leaves in errno and prints.
struct outcome {
    std::int32_t result = -2;
    int error = 0;
    std::string text;

    bool operator==(const outcome &) const = default;
    friend std::ostream &operator<<(std::ostream &out, const outcome &it)
    {
        return out << it.result << ", errno " << it.error << ", \"" << it.text << '"';
    }
};
inline const outcome REFUSED_QUIETLY{-1, 22, ""};
inline const outcome NO_FREE_HANDLE{-1, 24, "No more open images available!!!\n"};

template <typename Action>
outcome outcome_of(Action action)
{
    outcome seen;
    seen.text = printed_by([&] {
        errno = 0;
        seen.result = action();
        seen.error = errno;
    });
    return seen;
}

inline outcome opening(const std::string &name, std::int32_t flags = IMG_OPEN_READ_WRITE)
{
    return outcome_of([&] { return img_openfile(name.c_str(), flags); });
}

inline outcome creating(const std::string &name, std::int32_t type, const test_geometry &image)
{
    return outcome_of([&] {
        return img_createfile(name.c_str(), image.nlines, image.nsamps, image.nbands, type,
                              image.tile_nsamps, image.tile_nlines, image.nbytes);
    });
}

inline std::string could_not_create(const std::string &name)
{
    return "img_createfile: could not create " + name + "!\n";
}

// A folder, fresh handles, and the assurance that none stays taken and no descriptor open.
class FileTest : public testing::Test {
protected:
    FileTest()
    {
        test_type_register();
        img_pool_free(img_handle_pool);
        img_handle_pool = img_pool_create(0, IMG_MAX_HANDLES);
        fault_arm(io_call::open, 0);
    }
    ~FileTest() override
    {
        EXPECT_EQ(open_descriptors(), 0);
        EXPECT_TRUE(img_handle_pool == nullptr || img_handle_pool->next == 0);
    }
    scratch_folder m_folder;
    std::string m_file = m_folder / "scene";
    std::string m_name = m_file + "@fault";  // the same file by way of the access method "fault"
};

// Stores a word, unless it would not lie within the file.
inline void put_word(bytes &file, std::size_t at, std::int64_t word, bool little_endian = false)
{
    for (std::size_t i = 0; at <= file.size() - 4 && i < 4; ++i)
        file[at + i] = static_cast<std::uint8_t>(word >> 8 * (little_endian ? i : 3 - i));
}

struct vitec_variant {
    std::int32_t link = 108;  // the image block lies 4 bytes further
    std::int32_t header_length = 132, version = 7;
    bool little_endian = false;
};

// Returns a file of `length` bytes with those fields of a VITec header that readers look at.
inline bytes vitec_file(const test_geometry &image, std::size_t length = 244,
                        const vitec_variant &variant = {})
{
    bytes file(length);
    const auto put = [&](std::size_t at, std::int64_t word) {
        put_word(file, at, word, variant.little_endian);
    };
    const auto block = static_cast<std::size_t>(std::int64_t{variant.link} + 4);
    put(0, 0x005B0720);
    put(4, variant.link);
    put(block, variant.header_length);
    put(block + 24, variant.version);
    put(block + 36, image.nsamps);
    put(block + 40, image.nlines);
    put(block + 44, image.tile_nsamps);
    put(block + 48, image.tile_nlines);
    put(block + 56, image.nbands);
    put(block + 60, std::int64_t{image.nbytes} - 1);
    return file;
}

// Returns `nsamples` samples of value 0 and a Helava trailer.
inline bytes helava_file(const test_geometry &image, std::size_t nsamples,
                         bool little_endian = false)
{
    bytes file(nsamples + 16);
    put_word(file, nsamples, image.nbands, little_endian);
    put_word(file, nsamples + 4, image.nsamps, little_endian);
    put_word(file, nsamples + 8, image.nlines, little_endian);
    put_word(file, nsamples + 12, 0x48411484, little_endian);
    return file;
}

// Gives the bytes from `first` to `end` values that tell where they lie.
inline bytes numbered(bytes content, std::int64_t first, std::size_t end)
{
    for (auto at = static_cast<std::size_t>(first); at < end; ++at)
        content[at] = static_cast<std::uint8_t>(at * 7 + at / 256);
    return content;
}

// Returns a VITec file with numbered bytes after the image block.
inline file_image vitec(test_geometry image, std::size_t length, const vitec_variant &variant = {})
{
    image.layout = has_tiles(image) ? IMG_LAYOUT_TILED : IMG_LAYOUT_BSQ;
    image.swap = (std::endian::native == std::endian::little) != variant.little_endian ? 1 : 0;
    const std::int64_t block = std::int64_t{variant.link} + 4;
    return {image, block + variant.header_length,
            numbered(vitec_file(image, length, variant), std::max<std::int64_t>(block, 112) + 68,
                     length)};
}

// Reads of an open image what is where mistakes would show: windows and tiles at its corners.
inline void expect_reads(const file_image &it, img_handle image)
{
    const test_geometry &at = it.image;
    std::array<std::int32_t, 5> answers{0, 0, 0, 0, img_query_num_bands(image)};
    img_query_dimension(image, &answers[0], &answers[1]);
    img_query_tile_size(image, &answers[2], &answers[3]);
    EXPECT_EQ(answers,
              (std::array{at.nlines, at.nsamps, at.tile_nsamps, at.tile_nlines, at.nbands}));
    img_chain_init(image);  // two-byte samples come as they are
    reader expected(it);
    const auto expect = [&expected](const bytes &wanted, auto read) {
        bytes buffer(wanted.size(), UNTOUCHED);
        EXPECT_EQ(read(buffer.data()), expected.fell_short() ? -1 : 0);
        EXPECT_EQ(buffer, wanted);
    };
    const auto read_band = [&](std::int32_t band) {
        for (const std::int32_t line : {-1, 0, 1, at.nlines - 1})
            for (const std::int32_t samp : {0, at.nsamps - 1})
                for (const std::int32_t nlines : {1, 2})
                    expect(expected.window(band, line, samp, nlines, 5), [&](auto *buffer) {
                        return img_load_buffer(image, line, samp, nlines, 5, band, buffer, 5,
                                               &FILL);
                    });
        const std::int32_t ntiles = expected.ntiles();
        for (const std::int32_t tile : {0, 1, ntiles - 2, ntiles - 1})
            if (tile >= 0 && tile < ntiles)
                expect(expected.tile(band, tile),
                       [&](auto *buffer) { return img_load_tiles(image, tile, 1, band, buffer); });
    };
    const std::string text = printed_by([&] {
        if (at.nbands > 0) read_band(0);
        if (at.nbands > 1) read_band(at.nbands - 1);
    });
    EXPECT_EQ(text, expected.text());
}

#endif
