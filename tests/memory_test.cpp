// Each request for memory is denied, one after the other, that one alone or all that follow as
// well: the call that makes it fails as documented, everything is freed, and the next time all is
// well.
#include "support/fault_memory.h"

#include "access/tile_cache.h"
#include "base/id_pool.h"
#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/scratch.h"
#include "base/settings.h"
#include "chain/chain.h"
#include "chain/chain_apply.h"
#include "chain/chain_links.h"
#include "chain/stretch.h"
#include "formats/words.h"
#include "imgfile/img.h"
#include "io/io_method.h"
#include "std/std_interleaved_lines.h"
#include "std/std_lines.h"
#include "std/std_tiled.h"
#include "std/std_tiles.h"
#include "support/file_test.h"

#include <functional>

namespace {

using call = std::function<std::int32_t()>;

class Memory : public FileTest {
protected:
    ~Memory() override { img_cache_mb = 0; }

    img_handle create(const std::string &name)
    {
        if (m_type == TEST_TYPE) return create_test_file(name, m_geometry);
        return img_createfile(name.c_str(), 2, 8, 1, m_type, 0, 0, m_geometry.nbytes);
    }
    // Opens the image, with the cache made but for the tile that calls move.
    void prepare(std::int32_t cache_mb)
    {
        img_cache_mb = 0;
        std::filesystem::remove(m_file);
        img_closefile(create(m_name));
        img_cache_mb = cache_mb;
        m_image = img_openfile(m_name.c_str(), IMG_OPEN_READ_WRITE);
        if (m_type == TEST_TYPE) img_chain_init(m_image);
        if (cache_mb > 0) img_load_tiles(m_image, 0, 1, 0, m_buffer.data());
        img_free_scratch();
    }
    // Returns a letter for what the call answers and prints, by the request that is denied.
    std::string denied_requests(const call &use, std::int32_t cache_mb, bool lasting)
    {
        std::string letters;
        for (bool denied = true; denied;) {
            prepare(cache_mb);
            memory_arm(static_cast<int>(letters.size()) + 1, lasting);
            outcome answer = outcome_of(use);
            denied = memory_denied();
            memory_arm(0);
            if (denied) {
                letters += letter_of(answer);
                img_closefile(std::max(answer.result, 1));
                answer = outcome_of(use);
            }
            EXPECT_TRUE(answer.result >= 0 && answer.text == "") << answer;
            img_closefile(std::max(answer.result, 1));
            img_closefile(m_image);
            EXPECT_EQ(img_handle_pool->next + open_descriptors(), 0);
        }
        return letters;
    }
    static char letter_of(outcome answer)
    {
        const auto no_memory = [](const std::string &what) { return perror_line(what, ENOMEM); };
        const std::string cache = "Out of cache memory!\n";
        const std::string table = "img_chain_add_lut_create_link: error mallocing lut!!!\n";
        const std::string stretch =
            "img_set_auto_16to8bit_mapdown: Error installing auto mapdown in image chain\n"
            "DO_16_TO_8: Error in img_set_auto_16to8bit_mapdown()\n";
        const std::pair<std::string, char> failures[] = {
            {"Out of memory!!!\n", 'M'},
            {stretch, 's'},
            {table + stretch, 't'},
            {table, 'T'},
            {cache, 'X'},
            {no_memory("img_std_read_nontiled_interleaved:malloc"), 'i'},
            {no_memory("img_std_write_nontiled:malloc"), 'n'},
            {no_memory("img_read_tiled:malloc"), 'r'},
            {no_memory("img_std_write_tiled:malloc"), 'w'},
            {no_memory("img_std_read_tiles:read"), 'e'},
            {no_memory("img_load_buffer:malloc failed for merge buffer"), 'm'},
            {no_memory("img_apply_img_chain:malloc LUT"), 'l'},
            {no_memory("img_chain_create_stretch_lut_from_buffer:calloc") +
                 "img_apply_img_chain: Error in IMG_CHAIN_LUT_FCN\n",
             'h'},
            {"img_apply_img_chain: Error in IMG_CHAIN_REMAP_FCN\n", 'f'}};
        while (answer.text.starts_with(cache + cache)) answer.text.erase(0, cache.size());
        if (answer.result >= 0) return answer.text.empty() ? '+' : answer.text == cache ? 'x' : '?';
        if (answer.text.empty()) return answer.error == 22 ? '2' : '-';
        if (answer.text.starts_with("img_createfile: could not create ")) return 'C';
        for (const auto &[text, letter] : failures)
            if (answer.text == text) return letter;
        return '?';
    }

    std::int32_t m_type = 0;
    test_geometry m_geometry;
    img_handle m_image = -1;
    std::array<std::uint16_t, 32> m_buffer{};
};

TEST_F(Memory, ShortageFailsTheCallThatNeedsIt)
{
    const call creates = [&] { return create(m_file + "2@fault"); };
    const call opens = [&] { return img_openfile(m_name.c_str(), IMG_OPEN_READ_WRITE); };
    const call loads = [&] {
        return img_load_buffer(m_image, 0, 4, 2, 4, 0, m_buffer.data(), 4, nullptr);
    };
    const call dumps = [&] {
        return img_dump_buffer(m_image, 0, 4, 2, 4, 0, m_buffer.data(), 4, nullptr);
    };
    const call loads_tile = [&] { return img_load_tiles(m_image, 1, 1, 0, m_buffer.data()); };
    const call dumps_tile = [&] { return img_dump_tiles(m_image, 1, 1, 0, m_buffer.data()); };
    const call loads_merged = [&] {
        img_find_image(m_image)->merge_bands = 1;
        img_find_image(m_image)->merge_fn = [](auto...) { return 0; };
        return loads();
    };
    std::vector<std::uint16_t> table(1 << 14);
    const call loads_linked = [&] {
        img_chain_init(m_image);
        const bool added =
            img_chain_add_lut_create_link(m_image, 1, nullptr, img_chain_create_16to8_lut, 2, 13, 8,
                                          0, nullptr, 0) == 0 &&
            img_chain_add_lut_link(m_image, 4, 14, 13, 1, table.data(), 0) == 0 &&
            img_chain_add_lut_link(m_image, 6, 13, 12, 1, table.data(), 0) == 0;
        return added ? loads() : -1;
    };
    const call creates_in_memory = [&] { return create_test_memory(m_geometry); };
    const call makes_cache = [] {
        return img_tile_cache_destroy(img_tile_cache_create(1, 1, 1, 1), 0);
    };
    const call makes_pool = [] {
        img_id_pool *const pool = img_pool_create(0, 2);
        img_pool_free(pool);
        return pool != nullptr ? 0 : -1;
    };
    const call splits_name = [] {
        std::unique_ptr<char[]> filename;
        const img_io_method *method;
        return img_split_name("scene@fault", &filename, &method);
    };
    constexpr std::int32_t vitec = IMG_TYPE_VITEC, helava = IMG_TYPE_HELAVA;
    const test_geometry lines{2, 8, 2, 1, 0, 0, 0}, pixels{2, 8, 2, 1, 0, 0, 1};
    const test_geometry tiles{2, 8, 2, 1, 4, 2, 2}, mixed{2, 8, 2, 1, 4, 2, 4}, deep{2, 8, 1, 2};
    // Exchanging the bytes of what is dumped needs memory of its own.
    constexpr const char *exchange = IMG_WRITES_SWAPPED ? "n" : "";
    const struct {
        const call &use;
        std::int32_t type;
        const test_geometry &image;
        std::int32_t cache_mb;
        std::string once, lasting;
    } cases[] = {{creates, vitec, lines, 0, "MMMMMC", "MMMMMC"},
                 {creates, helava, lines, 0, "MMMMMCC", "MMMMMCC"},
                 {creates, vitec, deep, 0, "MMCts", "MMCts"},
                 {creates_in_memory, vitec, lines, 0, "MM--", "MM--"},
                 {opens, vitec, lines, 0, "MM2MMM", "MM2MMM"},
                 {opens, helava, lines, 0, "MM+22MMM", "MM222MMM"},
                 {opens, vitec, deep, 0, "MM2ts", "MM2ts"},
                 {splits_name, vitec, lines, 0, "-", "-"},
                 {makes_pool, vitec, lines, 0, "--", "--"},
                 {makes_cache, vitec, lines, 0, "--", "--"},
                 {loads, vitec, lines, 0, "", ""},
                 {loads, TEST_TYPE, pixels, 0, "i", "i"},
                 {loads, TEST_TYPE, tiles, 0, "r", "r"},
                 {loads, TEST_TYPE, mixed, 0, "r-", "r-"},
                 {loads, TEST_TYPE, mixed, 1, "r-+xxxx", "r-xxxxx"},
                 {loads, vitec, deep, 0, "-h", "-h"},
                 {loads_merged, TEST_TYPE, lines, 0, "mmmm", "mmmm"},
                 {loads_linked, vitec, deep, 0, "T--llh-f", "T--llh-f"},
                 {loads_tile, TEST_TYPE, mixed, 1, "-+xxxx", "-xxxxx"},
                 {dumps, vitec, deep, 0, exchange, exchange},
                 {dumps, TEST_TYPE, tiles, 0, "w", "w"},
                 {dumps, TEST_TYPE, mixed, 0, "we-e", "we-e"},
                 {dumps, TEST_TYPE, mixed, 1, "we+xxxx", "weXXXXX"},
                 {dumps_tile, TEST_TYPE, mixed, 0, "--e", "--e"},
                 {dumps_tile, TEST_TYPE, mixed, 1, "XX", "XX"}};
    for (const auto &[use, type, image, cache_mb, once, lasting] : cases) {
        m_type = type;
        m_geometry = image;
        EXPECT_EQ(denied_requests(use, cache_mb, false), once);
        EXPECT_EQ(denied_requests(use, cache_mb, true), lasting);
    }

    // Rows that are gathered for want of calls alone can do without, or with room for one of them.
    m_name = m_file;
    std::int32_t stride = 0;
    const call dumps_all = [&] {
        return img_dump_buffer(m_image, 0, 0, 2, 8, 0, m_buffer.data(), stride, nullptr);
    };
    m_type = vitec;
    m_geometry = lines;
    stride = 16;
    EXPECT_EQ(denied_requests(dumps_all, 0, true), "+");
    m_geometry = deep;
    for (const std::int32_t each : {8, 12}) {
        stride = each;
        EXPECT_EQ(denied_requests(dumps_all, 0, false), "+");
        EXPECT_EQ(denied_requests(dumps_all, 0, true), IMG_WRITES_SWAPPED ? "n" : "+");
    }
}

}  // namespace
