// A pool of small integers. The handles of open images come from one.
#ifndef IMG_ID_POOL_H
#define IMG_ID_POOL_H

#include <cstdint>
#include <memory>

// The ids low..high-1, lowest first. The id that was given back last is the next one handed out.
struct img_id_pool {
    std::int32_t count;                   // ids in the pool
    std::int32_t next;                    // ids taken; the free ones are ids[next..count-1]
    std::unique_ptr<std::int32_t[]> ids;  // null: the pool hands out nothing
};

// Returns a new pool, to be freed with img_pool_free; null when memory is short.
img_id_pool *img_pool_create(std::int32_t low, std::int32_t high);
// Returns an id, or -1 without a pool or a free id.
std::int32_t img_pool_take(img_id_pool *pool);
// Puts `id` back; does nothing without a pool or when no id is taken.
void img_pool_give_back(img_id_pool *pool, std::int32_t id);
void img_pool_free(img_id_pool *pool);

#endif
