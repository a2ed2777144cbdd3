// Handing out ids. A pool does not check that an id that is given back was taken. Read id_pool.h
// first.
#include "base/id_pool.h"

#include "base/count.h"

#include <new>
#include <numeric>
#include <utility>

img_id_pool *img_pool_create(std::int32_t low, std::int32_t high)
{
    const std::int32_t count = high - low;
    auto ids = std::unique_ptr<std::int32_t[]>(new (std::nothrow) std::int32_t[img_count(count)]);
    if (!ids) return nullptr;
    std::iota(ids.get(), ids.get() + count, low);
    return new (std::nothrow) img_id_pool{.count = count, .next = 0, .ids = std::move(ids)};
}

std::int32_t img_pool_take(img_id_pool *pool)
{
    // unreachable: a pool without its array; img_pool_create makes none
    if (pool == nullptr || !pool->ids || pool->next >= pool->count) return -1;
    return pool->ids[img_count(pool->next++)];
}

void img_pool_give_back(img_id_pool *pool, std::int32_t id)
{
    // unreachable: the same
    if (pool == nullptr || !pool->ids || pool->next <= 0) return;
    pool->ids[img_count(--pool->next)] = id;
}

void img_pool_free(img_id_pool *pool)
{
    delete pool;
}
