// Tests of std_offset.cpp: where samples lie.
#include "base/image_table.h"
#include "base/img_desc.h"
#include "imgfile/img.h"
#include "std/std.h"
#include "std/std_offset.h"

#include "support/layout_rules.h"
#include "support/random.h"

#include <gtest/gtest.h>

TEST(SampleOffset, FollowsTheLayoutRulesOrIsRefused)
{
    constexpr std::int32_t max = INT32_MAX;
    random_numbers random(5);
    for (int round = 0; round < 300; ++round) {
        test_geometry image{random.within(1, 30), random.within(1, 30), random.within(1, 3),
                            random.within(1, 2)};
        image.layout = round % 6;
        const bool tiled = image.layout >= 2 && image.layout <= 4;
        if (tiled) image.tile_nsamps = random.within(1, 9);
        if (tiled) image.tile_nlines = random.within(1, 9);
        img_desc *const desc = img_find_image(create_test_memory(image));
        img_std_file *const file = desc->std_file;
        const auto expect = [=](std::int32_t line, std::int32_t samp, std::int32_t band,
                                std::int64_t offset) {
            EXPECT_EQ(img_std_sample_offset(desc, line, samp, band),
                      desc->layout == 5 && offset != -1 ? 0 : offset)
                << desc->layout << ' ' << line << ' ' << samp << ' ' << band;
        };
        const std::int32_t band = random.within(0, image.nbands - 1);
        const std::int32_t line = random.within(0, image.nlines - 1);
        const std::int32_t samp = random.within(0, image.nsamps - 1);
        const auto at = static_cast<std::int32_t>(stored_at(image, band, line, samp));
        file->data_offset = 512;
        expect(line, samp, band, 512 + at);
        expect(-1, samp, band, -1);
        expect(line, -1, band, -1);
        expect(line, samp, -1, -1);
        const std::int32_t pixel =
            image.nbytes * (image.layout == IMG_LAYOUT_BIP ? image.nbands : 1);
        const std::int32_t length = file->padded_nsamps * pixel, last = (max - 512) / length;
        if (!tiled) expect(last, 0, 0, 512 + last * length);
        if (image.layout < 2) expect(last + 1, 0, 0, -1);
        file->data_offset = max - at;
        expect(line, samp, band, max);
        if (image.layout < 5) {
            ++file->data_offset;
            expect(line, samp, band, -1);
            file->padded_nsamps = max;  // so many that products of three could wrap
            expect(max, max, max, -1);
        }
        file->data_offset = 0;
        if (tiled) {
            expect(image.tile_nlines * file->tiles_down, samp, band, -1);
            expect(line, image.tile_nsamps * file->tiles_across, band, -1);
        }
        img_closefile(desc->handle);
    }
}
