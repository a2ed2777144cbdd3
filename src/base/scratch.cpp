// Working memory. Capacities are powers of two, so that sizes that differ a little share a block.
// Address sanitizers see the bytes beyond the size that was asked for, and blocks that are kept, as
// not usable. A store is used by its thread alone, without a lock, but for two occasions on which
// that thread is in no call: a fork and clean-up. Read scratch.h first.
#include "base/scratch.h"

#include "base/shared_lock.h"
#include "base/threads.h"

#include <algorithm>
#include <array>
#include <bit>
#include <limits>
#include <new>
#include <utility>

#if defined(__SANITIZE_ADDRESS__)
#define IMG_ADDRESS_SANITIZER
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define IMG_ADDRESS_SANITIZER
#endif
#endif
#ifdef IMG_ADDRESS_SANITIZER
#include <sanitizer/asan_interface.h>
#endif

namespace {

struct kept_block {
    std::uint8_t *block;  // null: none
    std::size_t capacity;
};

constexpr std::align_val_t ALIGNMENT{IMG_SCRATCH_ALIGNMENT};

// Makes the first `size` bytes of a block usable, the others not.
void mark_usable([[maybe_unused]] const kept_block &memory, [[maybe_unused]] std::size_t size)
{
#ifdef IMG_ADDRESS_SANITIZER
    ASAN_UNPOISON_MEMORY_REGION(memory.block, size);
    ASAN_POISON_MEMORY_REGION(memory.block + size, memory.capacity - size);
#endif
}

void free_block(const kept_block &memory)
{
    mark_usable(memory, memory.capacity);
    ::operator delete[](memory.block, ALIGNMENT);
}

class store;
struct list_entry {
    store *previous = nullptr, *next = nullptr;  // in the list of all stores
};

// The blocks that one thread keeps.
class store : public list_entry {
public:
    store() = default;
    ~store() { free_all(); }
    store(const store &) = delete;
    store &operator=(const store &) = delete;

    // Returns a block of that capacity, or null.
    std::uint8_t *take(std::size_t capacity)
    {
        kept_block *const found = std::ranges::find(m_kept, capacity, &kept_block::capacity);
        return found != m_kept.end() ? take_out(found).block : nullptr;
    }
    // Keeps a block of at most IMG_SCRATCH_LIMIT bytes.
    void keep(const kept_block &back)
    {
        while (m_kept.back().block != nullptr || m_bytes + back.capacity > IMG_SCRATCH_LIMIT)
            free_block(take_out(m_kept.begin()));
        *std::ranges::find(m_kept, std::size_t{0}, &kept_block::capacity) = back;
        m_bytes += back.capacity;
        mark_usable(back, 0);
    }
    void free_all()
    {
        while (m_kept.front().block != nullptr) free_block(take_out(m_kept.begin()));
    }

private:
    // Takes an entry off the kept blocks; the later ones move up.
    kept_block take_out(kept_block *entry)
    {
        const kept_block taken = std::exchange(*entry, {});
        m_bytes -= taken.capacity;
        std::rotate(entry, entry + 1, m_kept.end());
        return taken;
    }

    std::array<kept_block, 8> m_kept{};  // oldest first; free entries at the end
    std::size_t m_bytes = 0;
};

img_mutex list_mutex;
store *stores IMG_GUARDED_BY(list_mutex) = nullptr;  // of all threads; the first of a list

// The store of this thread; null: it has none.
constinit thread_local store *own_store = nullptr;
constinit thread_local bool forks = false;  // this thread holds list_mutex for a fork
std::atomic<bool> is_stopped = false;       // the stores are gone, whatever own_store says

void enlist(store *added)
{
    const img_mutex_lock lock(list_mutex);
    added->next = stores;
    if (stores != nullptr) stores->previous = added;
    stores = added;
}

void forget(store *ended)
{
    {
        const img_mutex_lock lock(list_mutex);
        store *listed = stores;
        // uncounted: as below
        while (listed != nullptr && listed != ended) listed = listed->next;
        if (listed == nullptr) return;  // uncounted: the process ends, and with it all stores
        (ended->previous != nullptr ? ended->previous->next : stores) = ended->next;
        if (ended->next != nullptr) ended->next->previous = ended->previous;
    }
    delete ended;
}

// Called when a thread ends that has a store.
void on_thread_end(void *object)
{
    own_store = nullptr;
    forget(static_cast<store *>(object));
}

// Returns the store of this thread, or null.
store *find_store()
{
    // uncounted: nothing is counted after the stop
    return is_stopped.load(std::memory_order_relaxed) ? nullptr : own_store;
}

// The same; one that is missing is made if possible.
store *need_store()
{
    store *const found = find_store();
    if (found != nullptr || is_stopped || forks) return found;  // uncounted: as above
    auto *const made = new (std::nothrow) store;
    if (made == nullptr) return nullptr;
    if (!img_set_thread_object(made)) {
        delete made;
        return nullptr;
    }
    enlist(made);
    own_store = made;
    return made;
}

}  // namespace

img_scratch img_take_scratch(std::size_t size)
{
    if (size > std::numeric_limits<std::ptrdiff_t>::max()) return nullptr;
    const std::size_t capacity =
        std::max(size > IMG_SCRATCH_LIMIT ? size : std::bit_ceil(size), IMG_SCRATCH_ALIGNMENT);
    store *const keeper = find_store();
    std::uint8_t *memory = keeper != nullptr ? keeper->take(capacity) : nullptr;
    if (memory == nullptr) memory = new (ALIGNMENT, std::nothrow) std::uint8_t[capacity];
    img_scratch block(memory, {capacity});
    if (block) mark_usable({block.get(), capacity}, size);
    return block;
}

void img_scratch_return::operator()(std::uint8_t *block) const
{
    store *const keeper = capacity <= IMG_SCRATCH_LIMIT ? need_store() : nullptr;
    if (keeper != nullptr)
        keeper->keep({block, capacity});
    else
        free_block({block, capacity});
}

void img_start_scratch()
{
    img_watch_thread_ends(on_thread_end);
}

void img_free_scratch()
{
    const img_mutex_lock lock(list_mutex);
    for (store *each = stores; each != nullptr; each = each->next) each->free_all();
}

void img_stop_scratch()
{
    img_ignore_thread_ends();
    is_stopped = true;
    const img_mutex_lock lock(list_mutex);
    while (stores != nullptr) delete std::exchange(stores, stores->next);
}

void img_scratch_before_fork() IMG_UNCHECKED_LOCKS
{
    list_mutex.lock();
    forks = true;
}

void img_scratch_after_fork(bool in_child) IMG_UNCHECKED_LOCKS
{
    forks = false;
    list_mutex.unlock();
    if (!in_child) return;  // uncounted: children of the tests end without a count
    // uncounted: the same
    for (store *each = stores; each != nullptr; each = each->next)
        if (each != own_store) each->free_all();  // uncounted: the same
}
