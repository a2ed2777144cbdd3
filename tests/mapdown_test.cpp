// Tests of mapdown.cpp: two-byte windows that run side by side.
#include "chain/mapdown.h"

#include "chain/chain_links.h"
#include "chain/stretch.h"
#include "support/file_test.h"

#include <thread>

namespace {

class Mapdowns : public FileTest {};

// Each window has a table of its own; a chain with other links is not copied.
TEST_F(Mapdowns, OfSeveralWindowsRunAtTheSameTime)
{
    const img_handle image =
        creating(m_file, IMG_TYPE_VITEC, {.nlines = 8, .nsamps = 512, .nbytes = 2}).result;
    std::vector<std::uint16_t> row(512);
    for (std::int32_t line = 0; line < 8; ++line) {
        for (std::size_t i = 0; i < row.size(); ++i)
            row[i] = static_cast<std::uint16_t>((i * 3 + 100) * static_cast<unsigned>(line) % 4096);
        ASSERT_EQ(dump(image, {.line = line, .nsamps = 512}, row.data()), 0);
    }
    const auto window = [&](std::int32_t line) {
        bytes samples(512, UNTOUCHED);
        EXPECT_EQ(load(image, {.line = line, .nsamps = 512}, samples.data()), 0);
        return samples;
    };
    const img_chain &chain = img_chain_of(image);
    ASSERT_TRUE(img_is_mapdown(chain));
    std::array<bytes, 8> expected;
    for (std::int32_t line = 0; line < 8; ++line)
        expected[static_cast<std::size_t>(line)] = window(line);
    EXPECT_NE(expected[2], expected[3]);
    EXPECT_EQ(chain.links[0].lut_fcn.lut[4095], 0);  // the image's own table stays unused
    std::vector<std::thread> threads;
    for (std::int32_t line = 0; line < 8; ++line)
        threads.emplace_back([&, line] {
            for (int i = 0; i < 50; ++i)
                EXPECT_EQ(window(line), expected[static_cast<std::size_t>(line)]);
        });
    for (std::thread &each : threads) each.join();

    std::array<std::uint16_t, 4096> table{};
    const auto expect_other_chain = [&](std::int32_t added) {
        EXPECT_EQ(added, 0);
        EXPECT_FALSE(img_is_mapdown(chain));
        img_chain_init(image);
    };
    expect_other_chain(img_chain_add_lut_link(image, 5, 12, 12, 0, table.data(), 0));
    expect_other_chain(img_chain_add_lut_create_link(image, 0, nullptr, img_chain_create_16to8_lut,
                                                     9, 12, 8, 1, table.data(), 0));
    expect_other_chain(img_chain_add_lut_create_link(image, 0, nullptr, img_chain_create_16to8_lut,
                                                     9, 12, 8, 0, nullptr, 0));
    const img_chain_create_fn other = [](auto...) { return 0; };
    expect_other_chain(
        img_chain_add_lut_create_link(image, 0, nullptr, other, 9, 12, 8, 1, nullptr, 0));
    img_chain_add_lut_create_link(image, 0, nullptr, img_chain_create_16to8_lut, 8, 12, 8, 0,
                                  table.data(), 0);
    const img_chain_process_fn process = [](auto...) { return 0; };
    expect_other_chain(img_chain_add_remap_link(image, 9, 8, nullptr, process, nullptr));
    img_chain_add_lut_create_link(image, 0, nullptr, img_chain_create_16to8_lut, 8, 12, 8, 0,
                                  table.data(), 0);
    img_chain_remove_link(image, 8);
    expect_other_chain(img_chain_add_lut_link(image, 9, 12, 8, 1, new std::uint16_t[4096], 1));
    img_closefile(image);
}

}  // namespace
