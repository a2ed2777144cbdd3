// Each request for memory on a load's way through the chain is denied, one after the other: the
// call that makes it fails, everything is freed, and the next time all is well.
#include "chain/chain.h"
#include "support/fault_memory.h"
#include "support/files.h"
#include "support/stretch_model.h"
#include "support/test_image.h"

#include <cerrno>
#include <gtest/gtest.h>
#include <set>
#include <sstream>

namespace {

// Calls `use` with its first request denied, then with the second, and so on: that one alone, or
// all that follow as well; and each time once more with nothing denied. Returns what was printed,
// line by line.
template <typename Use>
std::set<std::string> deny_each_request(Use use)
{
    stderr_capture capture;
    bool denied = true;
    for (const bool lasting : {true, false})
        for (int nth = 1; denied || nth == 1; ++nth) {
            memory_arm(nth, lasting);
            use();
            denied = memory_denied();
            memory_arm(0);
            use();
            EXPECT_FALSE(testing::Test::HasFailure()) << (lasting ? "from " : "at ") << nth;
        }
    std::istringstream text(capture.text());
    std::set<std::string> lines;
    for (std::string line; std::getline(text, line);) lines.insert(line + "\n");
    return lines;
}

// True when a call did its work. It may have failed for want of memory alone.
bool done(std::int32_t result)
{
    EXPECT_TRUE(result >= 0 || memory_denied());
    return result >= 0;
}

// A load of two-byte samples through the stretch, and then through links of all kinds.
void use_chain(const std::string &name)
{
    const samples pixels{100, 200, 300, 400};
    bytes buffer(8);
    const img_handle image = img_createfile(name.c_str(), 1, 4, 1, IMG_TYPE_VITEC, 0, 0, 2);
    if (!done(image)) return;
    const auto load = [&] {
        return done(img_load_buffer(image, 0, 0, 1, 4, 0, buffer.data(), 4, nullptr));
    };
    if (done(img_dump_buffer(image, 0, 0, 1, 4, 0, pixels.data(), 4, nullptr)) && load()) {
        EXPECT_EQ(buffer[3], expected_stretch(pixels, 4, 0, 12, 8)[400]);
        img_chain_init(image);
        std::uint16_t table[1 << 14] = {};
        done(img_chain_add_lut_link(image, 0, 12, 12, 0, new std::uint16_t[4096]{}, 1));
        done(img_chain_add_lut_create_link(image, 1, nullptr, img_chain_create_16to8_lut, 2, 13, 8,
                                           0, nullptr, 0));
        done(img_chain_add_lut_link(image, 4, 14, 13, 1, table, 0));  // converts its table
        done(img_chain_add_lut_link(image, 6, 13, 12, 1, table, 0));
        load();
        img_chain_init(image);
    }
    img_closefile(image);
}

void use_merged_bands()
{
    const img_handle image = create_test_memory({.nbands = 3});
    if (!done(image)) return;
    img_find_image(image)->merge_bands = 1;
    img_find_image(image)->merge_fn = [](auto...) { return 0; };
    std::uint8_t sample;
    done(img_load_buffer(image, 0, 0, 1, 1, 0, &sample, 1, nullptr));
    img_closefile(image);
}

TEST(Memory, ShortageFailsTheCallThatNeedsIt)
{
    const scratch_folder folder;
    const std::string name = folder / "scene";
    std::set<std::string> lines = deny_each_request([&] {
        use_chain(name);
        use_merged_bands();
    });
    lines.erase("No more open images available!!!\n");  // only where the library starts up here
    EXPECT_EQ(lines,
              (std::set<std::string>{
                  "DO_16_TO_8: Error in img_set_auto_16to8bit_mapdown()\n", "Out of memory!!!\n",
                  "img_apply_img_chain: Error in IMG_CHAIN_LUT_FCN\n",
                  "img_apply_img_chain: Error in IMG_CHAIN_REMAP_FCN\n",
                  "img_chain_add_lut_create_link: error mallocing lut!!!\n",
                  "img_createfile: could not create " + name + "!\n",
                  "img_set_auto_16to8bit_mapdown: Error installing auto mapdown in image chain\n",
                  perror_line("img_apply_img_chain:malloc LUT", ENOMEM),
                  perror_line("img_chain_create_stretch_lut_from_buffer:calloc", ENOMEM),
                  perror_line("img_load_buffer:malloc failed for merge buffer", ENOMEM),
                  perror_line("img_std_write_nontiled:malloc", ENOMEM)}));
}

}  // namespace
