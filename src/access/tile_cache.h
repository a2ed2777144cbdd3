// A bounded cache of tiles with least-recently-used replacement. It knows nothing of images: rows,
// columns and the size of a tile are the owner's, and a changed tile that is replaced goes back
// through an operation that the owner installs. For an image, a row is a band and a column a tile
// number.
#ifndef IMG_TILE_CACHE_H
#define IMG_TILE_CACHE_H

#include <cstdint>
#include <memory>

// Stores one tile on behalf of the owner. Only img_tile_cache_write_back looks at the result.
using img_tile_write_back_fn = std::int32_t (*)(void *arg, std::int32_t row, std::int32_t col,
                                                const std::uint8_t *data);

// One cached tile. Made by img_tile_cache_put and freed with the cache; in between it is on the
// cache's list and in the grid cell of its row and column.
struct img_tile_cache_entry {
    std::uint8_t dirty;  // 1: not written back yet
    std::int32_t col, row;
    std::unique_ptr<std::uint8_t[]> data;  // tile_bytes bytes
    img_tile_cache_entry *newer;  // towards the most recently used; null: it is the most recent
    img_tile_cache_entry *older;  // towards the least recently used; null: it is the oldest
};

struct img_tile_cache {
    std::int32_t nrows, ncols;
    std::int32_t tile_bytes;
    std::int32_t capacity;                           // entries that may be allocated in all
    std::unique_ptr<img_tile_cache_entry *[]> grid;  // nrows x ncols; null: nothing cached
    img_tile_cache_entry *mru, *lru;                 // ends of the list; null: it is empty
    std::int32_t free_entries;                       // entries that may still be allocated
    img_tile_write_back_fn write_back;               // null: changed tiles are lost
    void *write_back_arg;
};

// All operations accept a null cache, and a column or row outside the grid: they then do nothing.
// Results are written "success; otherwise".

// Returns a cache for as many tiles of `tile_bytes` as fit into `budget_mb` megabytes, at most one
// per cell. Null when no tile fits, when memory is short, and when the grid alone would take more
// than the budget and more than 16 MB.
img_tile_cache *img_tile_cache_create(std::int32_t tile_bytes, std::int32_t ncols,
                                      std::int32_t nrows, std::int32_t budget_mb);
// Installs the owner's operation and its first argument. 0; -1.
std::int32_t img_tile_cache_set_write_back(img_tile_cache *cache, img_tile_write_back_fn write_back,
                                           void *write_back_arg);
// Bytes of one tile; 0.
std::int32_t img_tile_cache_tile_bytes(const img_tile_cache *cache);
// 1 when the cell holds a tile; 0.
std::int32_t img_tile_cache_has(const img_tile_cache *cache, std::int32_t col, std::int32_t row);
// Copies the cell's tile to `out` and makes it the most recently used. 0; -1, also for an empty
// cell.
std::int32_t img_tile_cache_get(img_tile_cache *cache, std::int32_t col, std::int32_t row,
                                std::uint8_t *out);
// Stores a tile and makes it the most recently used. It replaces the cell's tile and `dirty` flag;
// in a full cache it replaces the least recently used tile, which is written back first if it is
// dirty. 0; -1, also after a message when memory is short: the cell then stays empty.
std::int32_t img_tile_cache_put(img_tile_cache *cache, std::int32_t col, std::int32_t row,
                                const std::uint8_t *data, std::int32_t dirty);
// Makes the cell's tile the most recently used.
void img_tile_cache_touch(img_tile_cache *cache, std::int32_t col, std::int32_t row);
// The result of the owner's operation for the cell's tile; -1, also when there is no tile or no
// operation.
std::int32_t img_tile_cache_write_back(img_tile_cache *cache, std::int32_t col, std::int32_t row);
// Frees the cache. `flush` not 0: dirty tiles are written back first, the most recently used before
// the others. 0; -1.
std::int32_t img_tile_cache_destroy(img_tile_cache *cache, std::int32_t flush);

#endif
