// Tests of window.cpp: which part of a window lies in the image, in windows of any numbers, most of
// them absurd, held against the same done sample by sample.
#include "access/window.h"
#include "support/effort.h"
#include "support/file_test.h"
#include "support/random.h"

namespace {

// The caller's memory ends with the last sample that is to be moved: the address checker sees what
// goes beyond.
class ExtremeWindows : public FileTest {
protected:
    enum { MEMORY = 10, EMPTY = 12 };  // kinds of images; before them files in each layout

    void check(const transfer &request)
    {
        const std::int32_t nbytes = m_model.image.nbytes;
        std::int64_t samples = 0;  // of the buffer, up to the last one that is moved
        std::int32_t verdict = verdict_on(request, m_model.image);
        if (verdict == 1 && request.writes)
            for_each_byte(m_model.image, request, [&](std::size_t i, auto) {
                samples = std::max(samples, static_cast<std::int64_t>(i) / nbytes + 1);
            });
        if (verdict == 1 && !request.writes)
            samples = (request.nlines - std::int64_t{1}) * request.pitch() + request.nsamps;
        if (samples > INT32_MAX / nbytes) verdict = -1;
        if (verdict == -1) samples = 0;
        if (samples * nbytes > 112) return;  // the library would move all of it
        for (std::uint8_t &byte : m_room) byte = static_cast<std::uint8_t>(m_random.below(256));
        bytes expected = m_room;
        const std::size_t first = m_room.size() - img_count(samples * nbytes);
        if (verdict == 1 && request.writes) m_model.dump(request, &m_room[0] + first, {0, 0});
        if (verdict == 1 && !request.writes)
            m_model.load(request, expected.begin() + static_cast<std::ptrdiff_t>(first));
        EXPECT_EQ(
            carry_out(m_image, request, m_room.data() + first, request.writes ? nullptr : &FILL),
            std::min(verdict, 0));
        EXPECT_EQ(m_room, expected);
    }

    bytes m_room = bytes(128);
    random_numbers m_random{6};
    img_handle m_image = -1;
    file_model m_model{};
};

TEST_F(ExtremeWindows, AreTransferredOrRefused)
{
    constexpr int windows = 7 * 7 * 7 * 7 * 7;
    const stderr_capture quiet;
    for (int kind = 0; kind <= EMPTY; ++kind) {
        test_geometry image{.nlines = 2, .nsamps = 4, .nbands = 2, .nbytes = 1 + kind % 2};
        image.layout = kind / 2 % 5;
        if (image.layout >= IMG_LAYOUT_TILED) image.tile_nsamps = image.tile_nlines = 3;
        if (kind == EMPTY) image.nsamps = 0;
        const bool in_memory = kind / 2 * 2 == MEMORY;
        if (!in_memory) img_closefile(create_test_file(m_file, image));
        m_image =
            in_memory ? create_test_memory(image) : open_test_file(m_name, IMG_OPEN_READ_WRITE);
        m_model = {image, 0, bytes(stored_bytes(image))};
        for (int i = 0; i < rounds(windows); ++i) {
            extreme_arguments any(i, windows);
            transfer at{1, any.next(2), any.next(4), any.next(2), any.next(4), any.next(4)};
            check(at);
            at.writes = true;
            check(at);
            check({.band = 1, .nlines = 2, .nsamps = 4});
            ASSERT_FALSE(HasFailure()) << "kind " << kind << ", window " << i;
        }
        EXPECT_EQ(img_window_test(m_image, 0, 0, 1, 9),
                  kind == EMPTY ? IMG_WINDOW_OUTSIDE : IMG_WINDOW_PARTIAL);
        img_closefile(m_image);
    }
    EXPECT_EQ(img_window_test(m_image, 0, 0, 1, 1), IMG_WINDOW_OUTSIDE);
}

}  // namespace
