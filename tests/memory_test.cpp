// Each request for memory is denied, one after the other, that one alone or all that follow as
// well: the call that makes it fails with one of its messages, everything is freed, and the next
// time all is well. Requests of ordinary lives of files are denied in fault_test, too.
#include "base/scratch.h"
#include "base/settings.h"
#include "chain/chain.h"
#include "chain/stretch.h"
#include "support/file_test.h"

#include <functional>

namespace {

const std::string OUT_OF_CACHE = "Out of cache memory!\n";  // once or several times

struct memory_case {
    std::function<std::int32_t()> use;
    test_geometry image{};
    std::int32_t type = TEST_TYPE;
    std::int32_t megabytes = 0;
    bool may_succeed = false;  // it has another way, which gives the same
};

class Memory : public FileTest {
protected:
    void check(const memory_case &each, bool lasting)
    {
        const setting cache_mb(img_cache_mb, each.megabytes);
        bool denied = true;
        for (int nth = 1; denied; ++nth) {
            std::filesystem::remove(m_file);
            img_closefile(create(m_name, each.type, each.image));
            m_image = img_openfile(m_name.c_str(), IMG_OPEN_READ_WRITE);
            if (each.type == TEST_TYPE) img_chain_init(m_image);
            // The cache is made but for the tile that calls move.
            if (each.megabytes > 0) load(m_image, {.tiles = true}, m_buffer.data());
            img_free_scratch();
            memory_arm(nth, lasting);
            outcome answer = outcome_of(each.use);
            denied = shortage.denied;
            const auto moved = m_buffer;
            memory_arm(0);
            if (denied) {
                // Of an ordinary file, a small window needs memory only if it is lent.
                const bool lends = m_name == m_file;
                const bool failed = answer.result < 0;
                EXPECT_TRUE(failed || each.may_succeed || lends) << answer;
                if (answer.text.starts_with(OUT_OF_CACHE)) answer.text = OUT_OF_CACHE;
                if (failed) m_messages.insert(answer.text);
                img_closefile(std::max(answer.result, 1));
                answer = outcome_of(each.use);
                EXPECT_TRUE(failed || moved == m_buffer);
            }
            EXPECT_TRUE(answer.result >= 0 && answer.text.empty()) << answer;
            img_closefile(std::max(answer.result, 1));
            img_closefile(m_image);
            EXPECT_EQ(img_handle_pool->next + open_descriptors, 0);
        }
    }

    std::set<std::string> m_messages;  // of calls that failed
    img_handle m_image = -1;
    std::array<std::uint16_t, 32> m_buffer{};
};

TEST_F(Memory, ShortageFailsTheCallThatNeedsIt)
{
    const auto moves = [&](const transfer &request) {
        return [=, this] { return carry_out(m_image, request, m_buffer.data()); };
    };
    const auto loads = moves({0, 0, 4, 2, 4}), loads_tile = moves({0, 1, 0, 1, 1, {}, true}),
               dumps = moves({0, 0, 4, 2, 4, {}, false, true}),
               dumps_all = moves({0, 0, 0, 2, 8, 12, false, true}),
               dumps_tile = moves({0, 1, 0, 1, 1, {}, true, true});
    const auto opens = [&] { return img_openfile(m_name.c_str(), IMG_OPEN_READ_WRITE); };
    const auto loads_merged = [&] {
        img_find_image(m_image)->merge_bands = 1;
        img_find_image(m_image)->merge_fn = [](auto...) { return 0; };
        return loads();
    };
    const test_geometry lines{2, 8, 2}, deep{2, 8, 1, 2}, pixels{2, 8, 2, 1, 0, 0, IMG_LAYOUT_BIP},
        mixed{2, 8, 2, 1, 4, 2, IMG_LAYOUT_TILED_BIP};
    std::vector<std::uint16_t> table(1 << 14);
    const auto loads_linked = [&] {
        img_chain_init(m_image);
        const bool added =
            img_chain_add_lut_create_link(m_image, 1, nullptr, img_chain_create_16to8_lut, 2, 13, 8,
                                          0, nullptr, 0) == 0 &&
            img_chain_add_lut_link(m_image, 4, 14, 13, 1, table.data(), 0) == 0 &&
            img_chain_add_lut_link(m_image, 6, 13, 12, 1, table.data(), 0) == 0;
        return added ? loads() : -1;
    };
    const auto creates = [&](std::int32_t type, const test_geometry &image) {
        return [=, this] { return create(m_file + "2", type, image); };
    };
    const std::vector<memory_case> cases = {
        {creates(IMG_TYPE_VITEC, deep)},
        {creates(IMG_TYPE_HELAVA, lines)},
        {[] { return create_test_memory({}); }},
        {opens, lines, IMG_TYPE_HELAVA, 0, true},  // as another type sees it
        {opens, deep, IMG_TYPE_VITEC},
        {loads, pixels},
        {loads, mixed, TEST_TYPE, 1, true},
        {loads, deep, IMG_TYPE_VITEC, 0, true},  // without a table of its own, it takes turns
        {loads_merged, lines},
        {loads_linked, deep, IMG_TYPE_VITEC},
        {loads_tile, mixed, TEST_TYPE, 1, true},
        {dumps, deep, IMG_TYPE_VITEC, 0, true},
        {dumps_all, lines, IMG_TYPE_VITEC, 0, true},  // rows are gathered to spare calls alone
        {dumps, mixed, TEST_TYPE, 1, true},
        {dumps_tile, mixed},
        {dumps_tile, mixed, TEST_TYPE, 1}};
    for (const std::string &name : {m_name, m_file})
        for (const memory_case &each : cases)
            for (const bool lasting : {false, true}) {
                SCOPED_TRACE(&each - &cases[0]);
                m_name = name;
                check(each, lasting);
            }

    const std::string no_stretch =
        "img_set_auto_16to8bit_mapdown: Error installing auto mapdown in image chain\n"
        "DO_16_TO_8: Error in img_set_auto_16to8bit_mapdown()\n";
    const std::string no_table = "img_chain_add_lut_create_link: error mallocing lut!!!\n";
    std::set<std::string> messages{
        "",
        "Out of memory!!!\n",
        OUT_OF_CACHE,

        no_stretch,
        no_table,
        no_table + no_stretch,
        could_not_create(m_file + "2"),
        perror_line("img_chain_create_stretch_lut_from_buffer:calloc", ENOMEM) +
            "img_apply_img_chain: Error in IMG_CHAIN_LUT_FCN\n",
        "img_apply_img_chain: Error in IMG_CHAIN_REMAP_FCN\n"};
    for (const char *const where :
         {"img_std_read_nontiled_interleaved:malloc", "img_read_tiled:malloc",
          "img_load_buffer:malloc failed for merge buffer", "img_std_write_nontiled:malloc",
          "img_std_write_tiled:malloc", "img_std_read_tiles:read",
          "img_apply_img_chain:malloc LUT"})
        messages.insert(perror_line(where, ENOMEM));
    EXPECT_EQ(m_messages, messages);
}

}  // namespace
