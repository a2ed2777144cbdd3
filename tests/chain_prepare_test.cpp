// Tests of chain_prepare.cpp: what definitions, buffers and widths the links of a chain get.
#include "support/chain_fixture.h"

#include <numeric>

TEST_F(Chain, GivesALinkWhatItAsksForOrWhatTheImageHas)
{
    samples pixels(20, 9);  // the last five are the fill
    std::iota(pixels.begin(), pixels.end() - 5, std::uint16_t{1000});
    dump(image, {.nlines = 3, .nsamps = 5}, pixels.data());
    for (auto [lines_more, stride, bits] : {std::array{1, 7, 0}, {0, 5, 12}, {0, 0, 8}}) {
        img_buffer_def asked{3 + lines_more, 5, 0, 0, stride, 2, 12, 9};
        img_chain_add_remap_link(image, 4, bits, &asked, shift_down, stride == 0 ? nullptr : ask);
        // Computing a table on the way leaves the data where it is.
        img_chain_add_lut_create_link(image, 2, nullptr, img_chain_create_16to8_lut, 3, 12, 8, 0,
                                      nullptr, 0);
        EXPECT_EQ(load(), 0);
        if (bits == 0) bits = 12;  // unstated: as the image has them
        def.nbytes = img_chain_nbytes(bits);
        for (std::int32_t i = 0; i < 15; ++i)
            EXPECT_EQ(get(buffer.data(), def, i),
                      pixels[img_count(i + 5 * lines_more)] >> (12 - bits));
        img_chain_init(image);
    }
}
