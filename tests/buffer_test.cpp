// Windows: which part of them the image has, the fill around it, and what is delivered, held
// against the same done sample by sample.
#include "access/buffer.h"
#include "support/file_test.h"
#include "support/random.h"
#include "support/refusal.h"
#include "support/stretch_model.h"

#include <utility>

namespace {

constexpr std::uint8_t UNTOUCHED = 0xEE;

std::int32_t load(img_handle image, const img_window &at, bytes *buffer, std::int32_t stride,
                  std::uint8_t fill = 0)
{
    return img_load_buffer(image, at.line, at.samp, at.nlines, at.nsamps, 0, buffer->data(), stride,
                           &fill);
}
std::int32_t dump(img_handle image, const img_window &at, const void *buffer, std::int32_t stride)
{
    return img_dump_buffer(image, at.line, at.samp, at.nlines, at.nsamps, 0, buffer, stride,
                           nullptr);
}

// Calls `visit(i, line, samp)` for the window's samples, `i` being where the caller has them.
template <typename Visit>
void for_each_sample(const img_window &at, std::int64_t stride, Visit visit)
{
    for (std::int64_t row = 0; row < at.nlines; ++row)
        for (std::int64_t column = 0; column < at.nsamps; ++column)
            visit(static_cast<std::size_t>(row * stride + column), at.line + row, at.samp + column);
}

// A two-byte scene of values up to 4999, some of which have more than 12 bits.
struct scene {
    std::int32_t nlines, nsamps;
    samples pixels_of(const img_window &at, std::uint8_t fill) const
    {
        samples pixels;
        for_each_sample(at, 0, [&](auto, auto line, auto samp) {
            const bool inside = line >= 0 && line < nlines && samp >= 0 && samp < nsamps;
            const auto value = (line * line * 37 + samp * samp * 11) % 5000;
            pixels.push_back(static_cast<std::uint16_t>(inside ? value : fill));
        });
        return pixels;
    }
};

// Checks a random window of an open image.
void check_window(img_handle image, const scene &model, random_numbers &random)
{
    const img_window at{random.within(-5, model.nlines + 2), random.within(-5, model.nsamps + 2),
                        random.within(1, 25), random.within(1, 45)};
    const std::int32_t stride = at.nsamps + random.within(0, 2);
    const auto fill = static_cast<std::uint8_t>(random.below(256));
    const samples window = model.pixels_of(at, fill);
    const samples lut = expected_stretch(window, at.nsamps, fill, 12, 8);
    bytes expected(static_cast<std::size_t>(at.nlines * stride) + 8, UNTOUCHED), buffer = expected;
    auto sample = window.begin();
    for_each_sample(at, stride, [&](auto i, auto, auto) {
        expected[i] = static_cast<std::uint8_t>(lut[std::min<std::size_t>(*sample++, 4095)]);
    });
    EXPECT_EQ(load(image, at, &buffer, stride, fill), 0);
    EXPECT_EQ(buffer, expected);
}

TEST(LoadBuffer, StretchesEveryWindowOfSixtyOpenImagesByItself)
{
    const scratch_folder folder;
    random_numbers random(4);
    for (int round = 0; round < 3; ++round) {  // what a chain owned goes before its next image
        std::vector<scene> scenes;
        for (img_handle image = 0; image < 60; ++image) {
            const img_window all{0, 0, random.within(1, 20), random.within(1, 40)};
            const std::int32_t tile = image % 2 * 8;
            scenes.push_back({all.nlines, all.nsamps});
            ASSERT_EQ(creating(folder / std::to_string(image), IMG_TYPE_VITEC,
                               {all.nlines, all.nsamps, 1, 2, tile, tile})
                          .result,
                      image);
            ASSERT_EQ(dump(image, all, scenes.back().pixels_of(all, 0).data(), all.nsamps), 0);
        }
        for (int each = 0; each < 600; ++each)
            check_window(each % 60, scenes[static_cast<std::size_t>(each % 60)], random);
        for (img_handle image = 60; image-- > 0;) img_closefile(image);
    }
}

// Windows of any numbers, most of them absurd, of a one-byte image of 3 lines x 4 samples.
class ExtremeWindows : public testing::Test {
protected:
    static constexpr std::int64_t ROOM = 64;  // bytes of the caller's buffer
    ~ExtremeWindows() override { img_closefile(image); }

    void check_load(const img_window &at, std::int64_t stride)
    {
        const std::int64_t length = (std::int64_t{at.nlines} - 1) * stride + at.nsamps;
        const bool empty = at.nlines < 1 || at.nsamps < 1;
        const bool refused = at.nsamps > stride || (!empty && length > INT32_MAX);
        if (!refused && !empty && length > ROOM) return;  // the library would fill all of it
        bytes expected(ROOM + 8, UNTOUCHED), buffer = expected;
        if (!refused && !empty)
            for_each_sample(at, stride, [&](auto i, auto line, auto samp) {
                const bool inside = line >= 0 && line < 3 && samp >= 0 && samp < 4;
                expected[i] = inside ? pixels[line * 4 + samp] : 0;
            });
        EXPECT_EQ(load(image, at, &buffer, static_cast<std::int32_t>(stride)), refused ? -1 : 0);
        EXPECT_EQ(buffer, expected);
    }

    void check_dump(const img_window &at, std::int64_t stride)
    {
        bytes expected(pixels, pixels + 12), buffer(ROOM);
        for (auto &sample : buffer) sample = ++last_written;
        std::int64_t end = 0;  // of what is to be read
        for (std::int64_t i = 0; i < 12; ++i) {
            const std::int64_t row = i / 4 - at.line, column = i % 4 - at.samp;
            if (row < 0 || row >= at.nlines || column < 0 || column >= at.nsamps) continue;
            end = row * stride + column + 1;
            if (at.nsamps <= stride && end <= ROOM)
                expected[static_cast<std::size_t>(i)] = buffer[static_cast<std::size_t>(end - 1)];
        }
        if (at.nsamps <= stride && end > ROOM && end <= INT32_MAX) return;  // it would be read
        if (end > INT32_MAX) expected.assign(pixels, pixels + 12);
        EXPECT_EQ(dump(image, at, buffer.data(), static_cast<std::int32_t>(stride)),
                  at.nsamps > stride || end > INT32_MAX ? -1 : 0);
        EXPECT_EQ(bytes(pixels, pixels + 12), expected);
    }

    const img_handle image = create_test_memory({.nlines = 3, .nsamps = 4});
    std::uint8_t *const pixels = img_find_image(image)->mem_image.get();
    std::uint8_t last_written = 0;
};

TEST_F(ExtremeWindows, AreTransferredOrRefused)
{
    const stderr_capture quiet;
    const auto extremes = [](std::int32_t edge) {
        return std::array{INT32_MIN, -1, 0, 1, edge, edge + 1, INT32_MAX};
    };
    for (const auto line : extremes(3))
        for (const auto samp : extremes(4))
            for (const auto nlines : extremes(3))
                for (const auto nsamps : extremes(4))
                    for (const auto stride : extremes(4)) {
                        check_dump({line, samp, nlines, nsamps}, stride);
                        check_load({line, samp, nlines, nsamps}, stride);
                        ASSERT_FALSE(HasFailure()) << line << ' ' << samp << ' ' << nlines << ' '
                                                   << nsamps << ' ' << stride;
                    }
}

TEST(DumpBuffer, OfAnEmptyImageTakesNothingHoweverLargeTheWindow)
{
    const scratch_folder folder;
    const std::string name = folder / "empty";
    const img_handle image = img_createfile(name.c_str(), 14, 0, 7, IMG_TYPE_HELAVA, 0, 0, 1);
    const std::uint8_t sample = 1;
    EXPECT_EQ(img_dump_buffer(image, 0, -2, 14, 1 << 28, 4, &sample, 1 << 28, &sample), 0);
    img_closefile(image);
}

TEST(DumpBuffer, LetsTheRowsOfTwoByteWindowsOverlap)
{
    const img_handle image = create_test_memory({.nlines = 2, .nsamps = 6, .nbytes = 2});
    const samples rows{0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11};
    samples pixels(12);
    EXPECT_EQ(dump(image, {-1, -1, 3, 6}, rows.data(), 3), 0);
    EXPECT_EQ(img_load_buffer(image, 0, 0, 2, 6, 0, pixels.data(), 6, nullptr), 0);
    EXPECT_EQ(pixels, (samples{4, 5, 6, 7, 8, 0, 7, 8, 9, 10, 11, 0}));
    EXPECT_EQ(refusal([&] {
                  return dump(image, {0, 0, 1, 7}, rows.data(), 3);
              }),
              "img_dump_buffer: nlines cannot exceed stride*depth!\n");
    img_closefile(image);
}

void expect_refusals(img_handle handle, std::int32_t nsamps, std::int32_t band,
                     const std::string &of_load, const std::string &of_dump)
{
    EXPECT_EQ(refusal(img_load_buffer, handle, 0, 0, 1, nsamps, band, nullptr, 1, nullptr),
              of_load);
    EXPECT_EQ(refusal(img_dump_buffer, handle, 0, 0, 1, nsamps, band, nullptr, 1, nullptr),
              of_dump);
}

TEST(Buffers, CheckHandleModeStrideAndBandInThisOrder)
{
    const img_handle image = create_test_memory({});
    const std::string unreadable = "img_load_buffer: not a readable image!\n";
    const std::string narrow = "img_load_buffer: nsamps cannot exceed stride!\n";
    const std::string narrow_dump = "img_dump_buffer: nlines cannot exceed stride*depth!\n";
    for (const img_handle handle : {-1, 60, 59, INT32_MIN, INT32_MAX})
        expect_refusals(handle, 2, 1,
                        std::string("img_validate_img_handle: img_handle ") +
                            (handle == 59 ? "not open" : "is out of range") +
                            "\nimg_load_buffer: img_validate_img_handle()\n",
                        "");
    std::int32_t &flags = img_find_image(image)->oflags;
    flags = IMG_OPEN_WRITE_ONLY | IMG_OPEN_BINARY;
    expect_refusals(image, 2, 1, unreadable, narrow_dump);
    flags = IMG_OPEN_READ_ONLY | IMG_OPEN_BINARY;
    expect_refusals(image, 2, 1, narrow, "");
    flags = IMG_OPEN_READ_WRITE | IMG_OPEN_BINARY;
    const img_type_desc type = std::exchange(img_type_table[TEST_TYPE], {});
    expect_refusals(image, 2, 1, unreadable, "");
    img_type_table[TEST_TYPE] = type;
    expect_refusals(image, 2, 1, narrow, narrow_dump);
    for (const std::int32_t band : {-1, 1, INT32_MIN, INT32_MAX}) {
        const std::string missing = "_buffer: band " + std::to_string(band) + " not available!\n";
        expect_refusals(image, 0, band, "img_load" + missing, "img_dump" + missing);
    }
    expect_refusals(image, 1, 0, "", "");  // no buffer, which an empty window does without
    EXPECT_EQ(img_load_buffer(image, 0, 0, 1, 0, 0, nullptr, 1, nullptr), 0);
    EXPECT_EQ(img_dump_buffer(image, 0, 0, 0, 1, 0, nullptr, 1, nullptr), 0);
    img_closefile(image);
}

TEST(LoadBuffer, OfAFileThatEndsEarlyKeepsOneByteSamplesThatCame)
{
    const scratch_folder folder;
    for (const std::int32_t nbytes : {1, 2}) {
        bytes file = vitec_file({.nlines = 4, .nsamps = 8, .nbytes = nbytes});
        file.resize(file.size() + static_cast<std::size_t>(2 * 8 * nbytes + 3), 7);
        write_file(folder / "short", file);
        const img_handle image = opening(folder / "short", IMG_OPEN_READ_ONLY).result;
        bytes expected(40, UNTOUCHED), buffer = expected;
        if (nbytes == 1) std::fill_n(expected.begin(), 2 * 8 + 3, std::uint8_t{7});
        EXPECT_EQ(refusal(load, image, img_window{0, 0, 4, 8}, &buffer, 8, std::uint8_t{0}),
                  "img_read_nontiled: 3 of " + std::to_string(8 * nbytes) + " bytes read!!\n");
        EXPECT_EQ(buffer, expected);
        EXPECT_EQ(load(image, {0, 0, 2, 8}, &buffer, 8), 0);
        img_closefile(image);
    }
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
    desc->merge_fn = [](auto, auto, auto, auto, auto, auto, auto nbands, auto *bands,
                        auto *buffer) {
        for (std::int32_t band = 0; band < nbands; ++band)
            *buffer = static_cast<std::uint8_t>(*buffer * 10 + *bands[band]);
        return -1;  // is not looked at
    };
    bytes buffer(5, UNTOUCHED);
    EXPECT_EQ(img_query_num_bands(image), 1);
    EXPECT_EQ(load(image, {-4, 5, 2, 2}, &buffer, 3, 0), 0);
    EXPECT_EQ(buffer, (bytes{123, 0, UNTOUCHED, 0, 0}));
    EXPECT_EQ(asked, (std::array{-4, 5, 2, 2, 2}));
    desc->merge_fn = nullptr;
    answer = 7;
    EXPECT_EQ(load(image, {4, -5, 2, 2}, &buffer, 3, 9), 7);
    EXPECT_EQ(buffer, (bytes{10, 9, UNTOUCHED, 9, 9}));
    EXPECT_EQ(dump(image, {5, -4, 2, 2}, buffer.data(), 3), 7);
    EXPECT_EQ(asked, (std::array{5, -4, 2, 2, 0}));
    img_type_table[TEST_TYPE] = type;
    img_closefile(image);
}

}  // namespace
