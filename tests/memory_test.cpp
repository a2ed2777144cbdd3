// Each request for memory is denied, one after the other, that one alone or all that follow as
// well: the call that makes it fails with one of its messages, everything is freed, and the next
// time all is well. Requests of ordinary lives of files are denied in fault_test, too.
#include "access/tile_cache.h"
#include "base/scratch.h"
#include "base/settings.h"
#include "chain/chain.h"
#include "chain/stretch.h"
#include "io/io_method.h"
#include "support/file_test.h"

#include <functional>

namespace {

const std::string OUT_OF_CACHE = "Out of cache memory!\n";  // once or several times

struct memory_case {
    std::function<std::int32_t()> use;
    test_geometry image{};
    std::int32_t type = TEST_TYPE;
    std::int32_t megabytes = 0;
    bool may_succeed = false;  // without what it could not get
};

class Memory : public FileTest {
protected:
    img_handle create(const std::string &name, std::int32_t type, const test_geometry &image) const
    {
        if (type == TEST_TYPE) return create_test_file(name, image);
        return img_createfile(name.c_str(), image.nlines, image.nsamps, image.nbands, type,
                              image.tile_nsamps, image.tile_nlines, image.nbytes);
    }
    // Opens the image, with the cache made but for the tile that calls move.
    void prepare(const memory_case &each)
    {
        std::filesystem::remove(m_file);
        img_closefile(create(m_name, each.type, each.image));
        const setting cache_mb(img_cache_mb, each.megabytes);
        m_image = img_openfile(m_name.c_str(), IMG_OPEN_READ_WRITE);
        if (each.type == TEST_TYPE) img_chain_init(m_image);
        if (each.megabytes > 0) load(m_image, {.tiles = true}, m_buffer.data());
        img_free_scratch();
    }
    void check(const memory_case &each, bool lasting)
    {
        bool denied = true;
        for (int nth = 1; denied; ++nth) {
            prepare(each);
            memory_arm(nth, lasting);
            outcome answer = outcome_of(each.use);
            denied = memory_denied();
            memory_arm(0);
            if (denied) {
                EXPECT_TRUE(answer.result < 0 || each.may_succeed) << answer;
                if (answer.text.starts_with(OUT_OF_CACHE)) answer.text = OUT_OF_CACHE;
                if (answer.result < 0) m_messages.insert(answer.text);
                img_closefile(std::max(answer.result, 1));
                answer = outcome_of(each.use);
            }
            EXPECT_TRUE(answer.result >= 0 && answer.text.empty()) << answer;
            img_closefile(std::max(answer.result, 1));
            img_closefile(m_image);
            EXPECT_EQ(img_handle_pool->next + open_descriptors(), 0);
        }
    }

    std::set<std::string> m_messages;  // of calls that failed
    img_handle m_image = -1;
    std::array<std::uint16_t, 32> m_buffer{};
};

TEST_F(Memory, ShortageFailsTheCallThatNeedsIt)
{
    const transfer window{.samp = 4, .nlines = 2, .nsamps = 4}, tile{.line = 1, .tiles = true};
    const auto loads = [&] { return load(m_image, window, m_buffer.data()); };
    const auto dumps = [&] { return dump(m_image, window, m_buffer.data()); };
    const auto dumps_all = [&] {
        return dump(m_image, {.nlines = 2, .nsamps = 8, .stride = 12}, m_buffer.data());
    };
    const auto loads_tile = [&] { return load(m_image, tile, m_buffer.data()); };
    const auto dumps_tile = [&] { return dump(m_image, tile, m_buffer.data()); };
    const auto opens = [&] { return img_openfile(m_name.c_str(), IMG_OPEN_READ_WRITE); };
    const auto loads_merged = [&] {
        img_find_image(m_image)->merge_bands = 1;
        img_find_image(m_image)->merge_fn = [](auto...) { return 0; };
        return loads();
    };
    const test_geometry lines{.nlines = 2, .nsamps = 8, .nbands = 2},
        deep{.nlines = 2, .nsamps = 8, .nbytes = 2};
    const test_geometry mixed{2, 8, 2, 1, 4, 2, IMG_LAYOUT_TILED_BIP};
    const test_geometry pixels{2, 8, 2, 1, 0, 0, IMG_LAYOUT_BIP};
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
    const auto splits_name = [] {
        std::unique_ptr<char[]> filename;
        const img_io_method *method;
        return img_split_name("scene@fault", &filename, &method);
    };
    const auto makes_pool = [] {
        img_id_pool *const pool = img_pool_create(0, 2);
        img_pool_free(pool);
        return pool != nullptr ? 0 : -1;
    };
    const auto makes_cache = [] {
        return img_tile_cache_destroy(img_tile_cache_create(1, 1, 1, 1), 0);
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
        {loads, deep, IMG_TYPE_VITEC},
        {loads_merged, lines},
        {loads_linked, deep, IMG_TYPE_VITEC},
        {loads_tile, mixed, TEST_TYPE, 1, true},
        {dumps, deep, IMG_TYPE_VITEC, 0, true},
        {dumps_all, lines, IMG_TYPE_VITEC, 0, true},  // rows are gathered to spare calls alone
        {dumps, mixed, TEST_TYPE, 1, true},
        {dumps_tile, mixed},
        {dumps_tile, mixed, TEST_TYPE, 1},
        {splits_name},
        {makes_pool},
        {makes_cache}};
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
