// Tests of tile_cache.cpp against a list of tiles.
#include "access/tile_cache.h"

#include "support/random.h"
#include "support/refusal.h"

#include <algorithm>
#include <list>

namespace {

constexpr std::int32_t COLS = 5, ROWS = 3;

TEST(TileCache, HasRoomForTheBudgetOrForEveryCell)
{
    constexpr std::int32_t megabyte = 1 << 20, max = INT32_MAX;
    // bytes of a tile, columns, rows, megabytes; capacity, -1: no cache
    constexpr std::array<std::int32_t, 5> cases[] = {
        {1 << 16, 100, 3, 1, 16}, {1 << 16, 4, 2, 1, 8},  {megabyte + 1, 4, 2, 1, -1},
        {1, 4, 2, -1, -1},        {0, 4, 2, 1, -1},       {1, -4, 2, 1, -1},
        {1, 4, -2, 1, -1},        {1, 4, 0, 1, 0},        {1, 4, 2, max, 8},
        {1, max, max, 1, -1},     {1, 1 << 21, 2, 1, -1}, {1, 1 << 21, 2, 32, 1 << 22}};
    for (const auto &[tile_bytes, ncols, nrows, budget_mb, capacity] : cases) {
        img_tile_cache *const cache = img_tile_cache_create(tile_bytes, ncols, nrows, budget_mb);
        EXPECT_EQ(cache != nullptr ? cache->capacity : -1, capacity) << tile_bytes << ' ' << ncols;
        EXPECT_EQ(cache != nullptr ? cache->free_entries : -1, capacity);
        EXPECT_EQ(img_tile_cache_tile_bytes(cache), cache != nullptr ? tile_bytes : 0);
        EXPECT_EQ(img_tile_cache_set_write_back(cache, nullptr, nullptr),
                  cache != nullptr ? 0 : -1);
        EXPECT_EQ(img_tile_cache_has(cache, 0, 0), 0);
        EXPECT_EQ(img_tile_cache_destroy(cache, 1), cache != nullptr ? 0 : -1);
    }
}

struct cached_tile {
    std::int32_t col, row, dirty;
    std::uint8_t value;  // of each of its two bytes
};
using tile_log = std::vector<std::array<std::int32_t, 3>>;  // column, row and value

std::int32_t log_tile(void *arg, std::int32_t row, std::int32_t col, const std::uint8_t *data)
{
    static_cast<tile_log *>(arg)->push_back({col, row, data[1]});
    return 5;  // matters to img_tile_cache_write_back alone
}

TEST(TileCache, ReplacesTheLeastRecentlyUsedTile)
{
    random_numbers random(3);
    for (std::size_t capacity = 1; capacity <= 6; ++capacity) {
        tile_log written, expected;
        std::list<cached_tile> model{{0, 0, 0, 0}};  // the most recently used in front
        img_tile_cache *const cache = img_tile_cache_create(2, COLS, ROWS, 1);
        cache->capacity = cache->free_entries = static_cast<std::int32_t>(capacity);
        EXPECT_EQ(img_tile_cache_put(cache, 0, 0, bytes(2).data(), 0), 0);
        EXPECT_EQ(img_tile_cache_write_back(cache, 0, 0), -1);
        EXPECT_EQ(img_tile_cache_set_write_back(cache, log_tile, &written), 0);
        const auto expect_written = [&](const cached_tile &tile) {
            if (tile.dirty != 0) expected.push_back({tile.col, tile.row, tile.value});
        };
        for (int i = 0; i < 3000 && written == expected; ++i) {
            const std::int32_t col = random.within(-1, COLS), row = random.within(-1, ROWS);
            const bool is_cell = col >= 0 && col < COLS && row >= 0 && row < ROWS;
            const auto tile = std::find_if(model.begin(), model.end(), [=](const auto &each) {
                return each.col == col && each.row == row;
            });
            const bool has = tile != model.end();
            bytes data(3, static_cast<std::uint8_t>(i));
            EXPECT_EQ(img_tile_cache_has(cache, col, row), has ? 1 : 0);
            const std::uint32_t kind = random.below(5);
            if (has && kind != 0) model.splice(model.begin(), model, tile);
            if (kind == 0) {  // neither moves the tile nor makes it clean
                EXPECT_EQ(img_tile_cache_write_back(cache, col, row), has ? 5 : -1);
                if (has) expected.push_back({col, row, tile->value});
            } else if (kind == 1) {
                img_tile_cache_touch(cache, col, row);
            } else if (kind == 2) {
                EXPECT_EQ(img_tile_cache_get(cache, col, row, data.data()), has ? 0 : -1);
                EXPECT_EQ(data[1], has ? model.front().value : data[2]);
            } else {
                const std::int32_t dirty = random.within(0, 2);
                EXPECT_EQ(img_tile_cache_put(cache, col, row, data.data(), dirty),
                          is_cell ? 0 : -1);
                if (has) model.pop_front();
                if (is_cell) model.push_front({col, row, dirty, data[0]});
                if (model.size() > capacity) expect_written(model.back());
                model.resize(std::min(model.size(), capacity));
            }
        }
        if (capacity % 2 != 0) std::for_each(model.begin(), model.end(), expect_written);
        EXPECT_EQ(img_tile_cache_destroy(cache, static_cast<std::int32_t>(capacity % 2)), 0);
        EXPECT_EQ(written, expected) << "capacity " << capacity;
    }
}

}  // namespace
