// Tests of load_window.cpp, and with it of fill.cpp: what is refused, and two-byte windows as hosts
// see them, stretched, filled and clipped.
#include "base/count.h"
#include "base/types.h"
#include "support/file_test.h"
#include "support/random.h"
#include "support/stretch_model.h"

#include <cstring>

using Windows = FileTest;

TEST_F(Windows, AreCheckedByHandleModeStrideAndBandInThisOrder)
{
    const img_handle image = create_test_memory({});
    const auto expect = [](img_handle handle, std::int32_t nsamps, std::int32_t band,
                           const std::string &loading, const std::string &dumping) {
        const transfer at{.band = band, .nsamps = nsamps, .stride = 1};
        EXPECT_EQ(refusal([&] { return load(handle, at, nullptr); }), loading);
        EXPECT_EQ(refusal([&] { return dump(handle, at, nullptr); }), dumping);
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
    {
        const setting none(img_type_table[TEST_TYPE], img_type_desc{});
        expect(image, 2, 1, unreadable, "");
    }
    expect(image, 2, 1, narrow, narrow_dump);
    for (const std::int32_t band : {-1, 1, INT32_MIN, INT32_MAX}) {
        const std::string missing = "_buffer: band " + std::to_string(band) + " not available!\n";
        expect(image, 0, band, "img_load" + missing, "img_dump" + missing);
    }
    expect(image, 1, 0, "", "");  // no buffer, which an empty window does without
    EXPECT_EQ(load(image, {.nsamps = 0}, nullptr) + dump(image, {.nlines = 0}, nullptr), 0);
    const img_handle empty = create_test_memory({.nlines = 0, .nsamps = 4});
    const std::uint8_t sample = 1;
    EXPECT_EQ(dump(empty, {.line = -1, .nlines = 2, .stride = INT32_MAX}, &sample), 0);
    img_closefile(empty);
    img_closefile(image);
}

// Two-byte windows of some lines, and of 16,384 samples and more, whose stretch takes another path.
TEST_F(Windows, OfTwoByteImagesAreStretchedInEveryPlace)
{
    random_numbers random(4);
    for (const test_geometry &image : {test_geometry{.nlines = 9, .nsamps = 11, .nbytes = 2},
                                       {.nlines = 150, .nsamps = 170, .nbytes = 2},
                                       {150, 170, 1, 2, 64, 32}}) {
        file_model model = vitec(image, VITEC_HEADER + stored_bytes(image));
        for (std::size_t i = VITEC_HEADER; i < model.content.size(); i += 2)  // to beyond 12 bits
            model.content[i] = static_cast<std::uint8_t>(random.below(1 + random.below(40)));
        write_file(m_file, model.content);
        const img_handle handle = opening(m_name).result;
        const std::int32_t nlines = image.nlines, nsamps = image.nsamps;
        for (const transfer &at : {transfer{0, 1, 2, nlines - 2, nsamps - 3, nsamps},
                                   {0, -7, -5, nlines + 4, nsamps, nsamps + 4},
                                   {0, 6, 5, nlines, nsamps + 1, nsamps + 1},
                                   {0, -1, -1, nlines + 2, nsamps + 2, nsamps + 9},
                                   {0, nlines, 0, nlines, nsamps, nsamps + 1}}) {
            for (const auto fill : {std::uint8_t{0}, std::uint8_t{200}}) {
                const std::size_t width = img_count(at.nsamps), pitch = img_count(at.pitch());
                transfer packed = at;
                packed.stride = at.nsamps;
                samples window(img_count(at.nlines) * width);
                bytes raw(window.size() * 2), buffer(window.size() / width * pitch, UNTOUCHED);
                bytes expected = buffer;
                model.load(packed, raw.begin(), fill);
                std::memcpy(window.data(), raw.data(), raw.size());
                const samples lut = expected_stretch(window, at.nsamps, fill, 12, 8);
                for (std::size_t i = 0; i < window.size(); ++i)
                    expected[i / width * pitch + i % width] =
                        static_cast<std::uint8_t>(lut[std::min<std::size_t>(window[i], 4095)]);
                EXPECT_EQ(load(handle, at, buffer.data(), &fill), 0);
                ASSERT_EQ(buffer, expected) << at.line << ' ' << nlines;
                EXPECT_TRUE(at.line < nlines || buffer[0] == (fill == 0 ? 0 : 11));
            }
        }
        bytes buffer(100, UNTOUCHED);
        std::filesystem::resize_file(m_file, VITEC_HEADER + 30);
        const stderr_capture quiet;
        EXPECT_EQ(load(handle, {.line = -1, .nlines = 9, .nsamps = 11}, buffer.data()), -1);
        EXPECT_EQ(buffer, bytes(100, UNTOUCHED));  // nothing is delivered of a read that failed
        std::filesystem::resize_file(m_file, model.content.size());
        img_closefile(handle);
    }
}
