// The tile cache: a grid of references to entries, which are also on a list in the order of use.
// Read tile_cache.h first.
#include "access/tile_cache.h"

#include "base/count.h"
#include "base/report.h"

#include <algorithm>
#include <cstring>
#include <new>
#include <utility>

namespace {

using entry = img_tile_cache_entry;

// Returns the grid cell, or null outside the grid.
entry **cell_at(const img_tile_cache *cache, std::int32_t col, std::int32_t row)
{
    if (cache == nullptr || col < 0 || col >= cache->ncols || row < 0 || row >= cache->nrows)
        return nullptr;
    return &cache->grid[img_count(row) * img_count(cache->ncols) + img_count(col)];
}

// Returns the tile in the grid cell, or null for an empty cell and outside the grid.
entry *tile_at(const img_tile_cache *cache, std::int32_t col, std::int32_t row)
{
    entry *const *const cell = cell_at(cache, col, row);
    return cell != nullptr ? *cell : nullptr;
}

// Removes a tile from the list; it is not the first one.
void unlink(img_tile_cache *cache, entry *tile)
{
    tile->newer->older = tile->older;
    (tile->older != nullptr ? tile->older->newer : cache->lru) = tile->newer;
}

void link_in_front(img_tile_cache *cache, entry *tile)
{
    tile->newer = nullptr;
    tile->older = cache->mru;
    (cache->mru != nullptr ? cache->mru->newer : cache->lru) = tile;
    cache->mru = tile;
}

void move_to_front(img_tile_cache *cache, entry *tile)
{
    if (tile == cache->mru) return;
    unlink(cache, tile);
    link_in_front(cache, tile);
}

// Returns a new entry at the front of the list, or null after a message.
entry *allocate_entry(img_tile_cache *cache, std::int32_t col, std::int32_t row)
{
    std::unique_ptr<std::uint8_t[]> data(new (std::nothrow)
                                             std::uint8_t[img_count(cache->tile_bytes)]);
    entry *const tile = data ? new (std::nothrow) entry{.dirty = 0,
                                                        .col = col,
                                                        .row = row,
                                                        .data = std::move(data),
                                                        .newer = nullptr,
                                                        .older = nullptr}
                             : nullptr;
    if (tile == nullptr) {
        img_fail("Out of cache memory!\n");
        return nullptr;
    }
    --cache->free_entries;
    link_in_front(cache, tile);
    return tile;
}

// Moves the least recently used entry to another cell. Returns null after a message when the list
// is empty.
entry *reassign_entry(img_tile_cache *cache, std::int32_t col, std::int32_t row)
{
    entry *const tile = cache->lru;
    // unreachable: a cache has room for one entry at least, and it is on the list by now
    if (tile == nullptr) {
        img_fail("Internal cache failure 1!\n");
        return nullptr;
    }
    if (tile->dirty != 0) img_tile_cache_write_back(cache, tile->col, tile->row);
    *cell_at(cache, tile->col, tile->row) = nullptr;
    tile->col = col;
    tile->row = row;
    return tile;
}

}  // namespace

img_tile_cache *img_tile_cache_create(std::int32_t tile_bytes, std::int32_t ncols,
                                      std::int32_t nrows, std::int32_t budget_mb)
{
    if (tile_bytes < 1 || ncols < 0 || nrows < 0) return nullptr;
    const std::int64_t budget = std::int64_t{budget_mb} << 20;
    const std::int64_t room = budget / tile_bytes;
    const std::int64_t cells = std::int64_t{ncols} * nrows;
    // The grid takes memory, too. With tiles of a few samples it would take more than the tiles.
    constexpr std::int64_t modest_grid = std::int64_t{16} << 20;
    const std::int64_t most_cells =
        std::max(budget, modest_grid) / static_cast<std::int64_t>(sizeof(entry *));
    if (room < 1 || cells > most_cells) return nullptr;
    std::unique_ptr<entry *[]> grid(new (std::nothrow) entry *[img_count(cells)] {});
    if (!grid) return nullptr;
    const auto capacity = static_cast<std::int32_t>(std::min(cells, room));
    return new (std::nothrow) img_tile_cache{.nrows = nrows,
                                             .ncols = ncols,
                                             .tile_bytes = tile_bytes,
                                             .capacity = capacity,
                                             .grid = std::move(grid),
                                             .mru = nullptr,
                                             .lru = nullptr,
                                             .free_entries = capacity,
                                             .write_back = nullptr,
                                             .write_back_arg = nullptr};
}

std::int32_t img_tile_cache_set_write_back(img_tile_cache *cache, img_tile_write_back_fn write_back,
                                           void *write_back_arg)
{
    if (cache == nullptr) return -1;
    cache->write_back = write_back;
    cache->write_back_arg = write_back_arg;
    return 0;
}

std::int32_t img_tile_cache_tile_bytes(const img_tile_cache *cache)
{
    return cache != nullptr ? cache->tile_bytes : 0;
}

std::int32_t img_tile_cache_has(const img_tile_cache *cache, std::int32_t col, std::int32_t row)
{
    return tile_at(cache, col, row) != nullptr ? 1 : 0;
}

std::int32_t img_tile_cache_get(img_tile_cache *cache, std::int32_t col, std::int32_t row,
                                std::uint8_t *out)
{
    entry *const tile = tile_at(cache, col, row);
    if (tile == nullptr) return -1;
    std::memcpy(out, tile->data.get(), img_count(cache->tile_bytes));
    move_to_front(cache, tile);
    return 0;
}

std::int32_t img_tile_cache_put(img_tile_cache *cache, std::int32_t col, std::int32_t row,
                                const std::uint8_t *data, std::int32_t dirty)
{
    entry **const cell = cell_at(cache, col, row);
    if (cell == nullptr) return -1;
    entry *tile = *cell;
    if (tile == nullptr)
        tile = cache->free_entries > 0 ? allocate_entry(cache, col, row)
                                       : reassign_entry(cache, col, row);
    if (tile == nullptr) return -1;
    *cell = tile;
    tile->dirty = dirty != 0 ? 1 : 0;
    std::memcpy(tile->data.get(), data, img_count(cache->tile_bytes));
    move_to_front(cache, tile);
    return 0;
}

void img_tile_cache_touch(img_tile_cache *cache, std::int32_t col, std::int32_t row)
{
    if (entry *const tile = tile_at(cache, col, row); tile != nullptr) move_to_front(cache, tile);
}

std::int32_t img_tile_cache_write_back(img_tile_cache *cache, std::int32_t col, std::int32_t row)
{
    const entry *const tile = tile_at(cache, col, row);
    if (tile == nullptr || cache->write_back == nullptr) return -1;
    return cache->write_back(cache->write_back_arg, row, col, tile->data.get());
}

std::int32_t img_tile_cache_destroy(img_tile_cache *cache, std::int32_t flush)
{
    if (cache == nullptr) return -1;
    for (entry *tile = cache->mru; tile != nullptr;) {
        if (flush != 0 && tile->dirty != 0) img_tile_cache_write_back(cache, tile->col, tile->row);
        delete std::exchange(tile, tile->older);
    }
    delete cache;
    return 0;
}
