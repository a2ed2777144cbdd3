// Windows: which part of them the image has, the fill around it, and what is delivered, held
// against the same done sample by sample.
#include "access/window.h"
#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/types.h"
#include "imgfile/img.h"
#include "std/std.h"
#include "support/effort.h"
#include "support/file_test.h"
#include "support/guarded_buffer.h"
#include "support/random.h"
#include "support/refusal.h"
#include "support/sample.h"
#include "support/stretch_model.h"

#include <utility>

namespace {

constexpr std::uint8_t UNTOUCHED = 0xEE;

std::int32_t load(img_handle image, const img_window &at, std::int32_t band, std::uint8_t *buffer,
                  std::int32_t stride, std::uint8_t fill = 0)
{
    return img_load_buffer(image, at.line, at.samp, at.nlines, at.nsamps, band, buffer, stride,
                           &fill);
}
std::int32_t dump(img_handle image, const img_window &at, std::int32_t band, const void *buffer,
                  std::int32_t stride)
{
    return img_dump_buffer(image, at.line, at.samp, at.nlines, at.nsamps, band, buffer, stride,
                           nullptr);
}

TEST(LoadBuffer, StretchesTheRowsOfSixtyOpenImagesEachByItself)
{
    const scratch_folder folder;
    random_numbers random(4);
    for (int round = 0; round < 3; ++round) {  // what a chain owned goes before its next image
        std::vector<samples> windows;          // a row, and two samples of fill on either side
        for (img_handle image = 0; image < 60; ++image) {
            const std::int32_t nsamps = random.within(1, 40), nbytes = 1 + (image + round) % 2;
            samples row;  // some samples of which have more than 12 bits
            for (std::int32_t i = 0; i < nsamps; ++i)
                row.push_back(static_cast<std::uint16_t>(random.below(nbytes == 1 ? 256 : 5000)));
            const bytes low(row.begin(), row.end());
            const void *const pixels =
                nbytes == 1 ? static_cast<const void *>(low.data()) : row.data();
            ASSERT_EQ(
                creating(folder / std::to_string(image), IMG_TYPE_VITEC, {1, nsamps, 1, nbytes})
                    .result,
                image);
            ASSERT_EQ(dump(image, {0, 0, 1, nsamps}, 0, pixels, nsamps), 0);
            row.insert(row.begin(), 2, 77);
            row.insert(row.end(), 2, 77);
            windows.push_back(row);
        }
        for (img_handle image = 60; image-- > 0; windows.pop_back()) {
            const samples &window = windows.back();
            const auto length = static_cast<std::int32_t>(window.size());
            const samples lut = expected_stretch(window, length, 77, 12, 8);
            bytes buffer(window.size());
            EXPECT_EQ(load(image, {0, -2, 1, length}, 0, buffer.data(), length, 77), 0);
            for (std::size_t i = 0; i < buffer.size(); ++i)
                ASSERT_EQ(buffer[i], (image + round) % 2 == 0
                                         ? window[i]
                                         : lut[std::min<std::size_t>(window[i], 4095)]);
            img_closefile(image);
        }
    }
}

// Windows of any numbers, most of them absurd. The caller's memory ends with the last sample that
// is to be moved, and what lies behind it cannot be accessed.
class ExtremeWindows : public FileTest {
protected:
    enum { MEMORY = 10, EMPTY = 12 };  // kinds of images; before them files in each layout

    void open(bool in_memory, const test_geometry &image)
    {
        if (!in_memory) img_closefile(create_test_file(m_name, image));
        m_image =
            in_memory ? create_test_memory(image) : open_test_file(m_name, IMG_OPEN_READ_WRITE);
        m_model = model_image(image);
        m_nbytes = image.nbytes;
    }
    // Where in the room a buffer starts that has `count` samples left to its end.
    std::size_t offset_of(std::int64_t count) const
    {
        return m_room.size() - static_cast<std::size_t>(count * m_nbytes);
    }
    bool has_room(std::int64_t count) const { return count <= 56; }
    bool is_addressable(std::int64_t count) const { return count <= INT32_MAX / m_nbytes; }

    void check_load(const img_window &at, std::int32_t stride)
    {
        const bool empty = at.nlines < 1 || at.nsamps < 1;
        std::int64_t length = empty ? 0 : (std::int64_t{at.nlines} - 1) * stride + at.nsamps;
        const bool refused = at.nsamps > stride || !is_addressable(length);
        if (refused) length = 0;
        if (!has_room(length)) return;  // the library would fill all of it
        std::ranges::fill(m_room, UNTOUCHED);
        bytes expected(m_room.begin(), m_room.end());
        for (std::int64_t i = 0; i < length; ++i) {
            const std::int64_t line = at.line + i / stride, samp = at.samp + i % stride;
            if (i % stride >= at.nsamps) continue;
            const std::uint16_t sample = m_model.has(line, samp) ? m_model.at(1, line, samp) : 9;
            put_sample(expected.data() + offset_of(length - i), m_nbytes, sample);
        }
        EXPECT_EQ(load(m_image, at, 1, m_room.data() + offset_of(length), stride, 9),
                  refused ? -1 : 0);
        EXPECT_TRUE(std::ranges::equal(m_room, expected));
    }

    void check_dump(const img_window &at, std::int32_t stride)
    {
        std::vector<std::pair<std::uint16_t *, std::int64_t>> moved;  // to which sample, from where
        for (int i = 0; i < 2 * m_model.geometry().nsamps; ++i) {
            const int line = i % 2, samp = i / 2;
            const std::int64_t row = line - std::int64_t{at.line},
                               column = samp - std::int64_t{at.samp};
            if (row >= 0 && row < at.nlines && column >= 0 && column < at.nsamps)
                moved.emplace_back(&m_model.at(1, line, samp), row * stride + column);
        }
        std::int64_t end = moved.empty() ? 0 : moved.back().second + 1;
        // Rows that lie in part over each other are taken while the bytes of a stride suffice.
        const bool refused =
            at.nsamps > std::int64_t{stride} * m_model.geometry().nbytes || !is_addressable(end);
        if (refused) end = 0;
        if (!has_room(end)) return;  // the library would read all of it
        for (std::uint8_t &byte : m_room) byte = static_cast<std::uint8_t>(m_random.below(256));
        for (const auto &[sample, place] : moved)
            if (!refused) *sample = get_sample(m_room.data() + offset_of(end - place), m_nbytes);
        EXPECT_EQ(dump(m_image, at, 1, m_room.data() + offset_of(end), stride), refused ? -1 : 0);
        check_load({0, 0, 2, 4}, 4);
    }

    const guarded_buffer m_memory;
    const std::span<std::uint8_t> m_room = m_memory.bytes().last(128);
    random_numbers m_random{6};
    img_handle m_image = -1;
    model_image m_model{{}};
    std::int32_t m_nbytes = 1;
};

TEST_F(ExtremeWindows, AreTransferredOrRefused)
{
    constexpr int windows = 7 * 7 * 7 * 7 * 7;
    const stderr_capture quiet;
    for (int kind = 0; kind <= EMPTY; ++kind) {
        const std::int32_t layout = kind / 2 % 5, tile = layout < IMG_LAYOUT_TILED ? 0 : 3;
        open(kind / 2 * 2 == MEMORY,
             {2, kind == EMPTY ? 0 : 4, 2, 1 + kind % 2, tile, tile, layout});
        for (int i = 0; i < rounds(windows); ++i) {
            extreme_arguments any(i, windows);
            const img_window at{any.next(2), any.next(4), any.next(2), any.next(4)};
            const std::int32_t stride = any.next(4);
            check_dump(at, stride);
            check_load(at, stride);
            ASSERT_FALSE(HasFailure()) << "kind " << kind << ", window " << i;
        }
        img_closefile(m_image);
    }
}

TEST(Buffers, CheckHandleModeStrideAndBandInThisOrder)
{
    const img_handle image = create_test_memory({});
    const auto expect = [](img_handle handle, std::int32_t nsamps, std::int32_t band,
                           const std::string &of_load, const std::string &of_dump) {
        EXPECT_EQ(refusal(img_load_buffer, handle, 0, 0, 1, nsamps, band, nullptr, 1, nullptr),
                  of_load);
        EXPECT_EQ(refusal(img_dump_buffer, handle, 0, 0, 1, nsamps, band, nullptr, 1, nullptr),
                  of_dump);
    };
    const std::string unreadable = "img_load_buffer: not a readable image!\n";
    const std::string narrow = "img_load_buffer: nsamps cannot exceed stride!\n";
    const std::string narrow_dump = "img_dump_buffer: nlines cannot exceed stride*depth!\n";
    for (const img_handle handle : {-1, 60, 59, INT32_MIN, INT32_MAX})
        expect(handle, 2, 1,
               std::string("img_validate_img_handle: img_handle ") +
                   (handle == 59 ? "not open" : "is out of range") +
                   "\nimg_load_buffer: img_validate_img_handle()\n",
               "");
    std::int32_t &flags = img_find_image(image)->oflags;
    flags = IMG_OPEN_WRITE_ONLY | IMG_OPEN_BINARY;
    expect(image, 2, 1, unreadable, narrow_dump);
    flags = IMG_OPEN_READ_ONLY | IMG_OPEN_BINARY;
    expect(image, 2, 1, narrow, "");
    flags = IMG_OPEN_READ_WRITE | IMG_OPEN_BINARY;
    const img_type_desc type = std::exchange(img_type_table[TEST_TYPE], {});
    expect(image, 2, 1, unreadable, "");
    img_type_table[TEST_TYPE] = type;
    expect(image, 2, 1, narrow, narrow_dump);
    for (const std::int32_t band : {-1, 1, INT32_MIN, INT32_MAX}) {
        const std::string missing = "_buffer: band " + std::to_string(band) + " not available!\n";
        expect(image, 0, band, "img_load" + missing, "img_dump" + missing);
    }
    expect(image, 1, 0, "", "");  // no buffer, which an empty window does without
    EXPECT_EQ(load(image, {0, 0, 1, 0}, 0, nullptr, 1) + dump(image, {0, 0, 0, 1}, 0, nullptr, 1),
              0);
    const img_handle empty = create_test_memory({.nlines = 0, .nsamps = 4});
    const std::uint8_t sample = 1;
    EXPECT_EQ(dump(empty, {-1, 0, 2, 1}, 0, &sample, INT32_MAX), 0);
    img_closefile(empty);
    img_closefile(image);
    EXPECT_EQ(img_window_test(image, 0, 0, 1, 1), IMG_WINDOW_OUTSIDE);
}

std::array<std::int32_t, 5> asked;  // of the type below: window and band
std::int32_t answer = 0;
const auto note_request = [](auto, auto line, auto samp, auto nlines, auto nsamps, auto band,
                             auto *buffer, auto...) {
    asked = {line, samp, nlines, nsamps, band};
    if constexpr (std::is_same_v<decltype(buffer), std::uint8_t *>)
        *buffer = static_cast<std::uint8_t>(*buffer + band + 1);
    return answer;
};

TEST(Buffers, OfUnclippedImagesAreLeftToTheTypeAndMayMergeItsBands)
{
    const img_handle image = create_test_memory({.nbands = 3});
    img_desc *const desc = img_find_image(image);
    const img_type_desc type = img_type_table[TEST_TYPE];
    img_type_table[TEST_TYPE].read = note_request;
    img_type_table[TEST_TYPE].write = note_request;
    desc->unclipped = desc->merge_bands = 1;
    desc->merge_fn = [](auto line, auto samp, auto nlines, auto nsamps, auto stride, auto nbytes,
                        auto nbands, auto *bands, auto *buffer) {
        EXPECT_EQ((std::array{line, samp, nlines, nsamps, stride, nbytes}),
                  (std::array{0, 0, 2, 1, 3, 1}));
        for (std::int32_t band = 0; band < nbands; ++band)
            *buffer = static_cast<std::uint8_t>(*buffer * 10 + *bands[band]);
        return -1;  // is not looked at
    };
    bytes buffer(5, UNTOUCHED);
    EXPECT_EQ(img_query_num_bands(image), 1);
    EXPECT_EQ(load(image, {-4, 5, 2, 1}, 0, buffer.data(), 3), 0);
    EXPECT_EQ(buffer, (bytes{123, UNTOUCHED, UNTOUCHED, 0, UNTOUCHED}));
    EXPECT_EQ(asked, (std::array{-4, 5, 2, 1, 2}));
    answer = 7;
    EXPECT_EQ(load(image, {-4, 5, 2, 2}, 0, buffer.data(), 3), 7);
    desc->merge_fn = nullptr;
    EXPECT_EQ(load(image, {4, -5, 2, 2}, 0, buffer.data(), 3, 9), 7);
    EXPECT_EQ(buffer, (bytes{10, 9, UNTOUCHED, 9, 9}));
    EXPECT_EQ(dump(image, {5, -4, 2, 2}, 0, buffer.data(), 3), 7);
    EXPECT_EQ(asked, (std::array{5, -4, 2, 2, 0}));
    img_type_table[TEST_TYPE] = type;
    img_closefile(image);
}

}  // namespace
