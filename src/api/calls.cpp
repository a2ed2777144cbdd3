// The locks of calls. Read calls.h first, then base/shared_lock.h.
#include "api/calls.h"

#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/scratch.h"
#include "base/shared_lock.h"
#include "base/threads.h"
#include "io/platform.h"

namespace {

img_shared_lock library_lock;

// Calls in progress of this thread, one inside the other. The first one shares the library's lock.
constinit thread_local std::int32_t depth = 0;

struct image_slot {
    img_shared_lock lock;
    // Counts openings and closings: odd while the handle names an image.
    std::atomic<std::uint32_t> opening;
};
std::array<image_slot, IMG_MAX_HANDLES> slots;

image_slot &slot_of(img_handle handle)
{
    return slots[img_count(handle)];
}

bool needs_image_alone(img_purpose purpose, const img_desc *desc)
{
    return purpose == img_purpose::load && desc->cache_mb != 0;
}

// --- Forks ---

// Handlers of the host that run between ours may call the library, as if from inside of a call.

void before_fork() IMG_UNCHECKED_LOCKS
{
    if (depth++ > 0) return;  // it would wait for itself
    library_lock.lock();
    img_scratch_before_fork();
}

void after_fork_in_parent() IMG_UNCHECKED_LOCKS
{
    if (--depth > 0) return;
    img_scratch_after_fork(/*in_child=*/false);
    library_lock.unlock();
}

void after_fork_in_child() IMG_UNCHECKED_LOCKS
{
    // uncounted: children of the tests end without a count
    if (--depth > 0) return;
    img_scratch_after_fork(/*in_child=*/true);
    img_platform_after_fork();
    library_lock.reset_in_child();
}

// Before the host's own handlers, if it can be: ours then hold the lock for the shortest time.
[[gnu::constructor]] void load()
{
    img_watch_forks(before_fork, after_fork_in_parent, after_fork_in_child);
}

// At the end of the process other threads may still be inside: then everything stays.
[[gnu::destructor]] void unload()
{
    if (!library_lock.try_lock()) return;  // uncounted: nothing is counted any more
    img_stop_scratch();
    img_platform_unload();
    img_free_handle_pool();
    library_lock.unlock();
}

}  // namespace

img_call::img_call() IMG_UNCHECKED_LOCKS
{
    if (depth++ > 0) return;
    m_cancellation = img_defer_cancellation();
    m_counter = library_lock.lock_shared();
}

img_call::~img_call() IMG_UNCHECKED_LOCKS
{
    if (--depth > 0) return;
    library_lock.unlock_shared(m_counter);
    img_allow_cancellation(m_cancellation);
}

img_image_use::img_image_use(img_handle handle, img_purpose purpose) : m_handle(handle)
{
    if (!img_is_handle(handle)) return;
    const std::uint32_t opening = slot_of(handle).opening.load();
    const bool alone = purpose == img_purpose::dump || purpose == img_purpose::close;
    if (!enter(alone, opening)) return;
    if (needs_image_alone(purpose, m_desc)) {
        leave();
        if (!enter(true, opening)) return;  // uncounted: the image is closed just then
    }
    if (purpose == img_purpose::close) slot_of(handle).opening.store(opening + 1);
}

img_image_use::~img_image_use()
{
    if (m_desc != nullptr) leave();
}

// Takes the lock. Returns false, without it, when the image of that opening is closed.
bool img_image_use::enter(bool alone, std::uint32_t opening) IMG_UNCHECKED_LOCKS
{
    image_slot &slot = slot_of(m_handle);
    if (opening % 2 == 0) return false;
    m_is_alone = alone;
    if (alone)
        slot.lock.lock();
    else
        m_counter = slot.lock.lock_shared();
    if (slot.opening.load() == opening) {
        m_desc = img_image_slot(m_handle);
        return true;
    }
    leave();
    return false;
}

void img_image_use::leave() IMG_UNCHECKED_LOCKS
{
    image_slot &slot = slot_of(m_handle);
    if (m_is_alone)
        slot.lock.unlock();
    else
        slot.lock.unlock_shared(m_counter);
    m_desc = nullptr;
}

void img_publish_image(img_handle handle)
{
    slot_of(handle).opening.fetch_add(1);
}

img_pause::img_pause() IMG_UNCHECKED_LOCKS : m_is_alone(depth == 0)
{
    if (m_is_alone) library_lock.lock();
}

img_pause::~img_pause() IMG_UNCHECKED_LOCKS
{
    if (m_is_alone) library_lock.unlock();
}
