// The mutex, and the lock of many readers. There, a reader adds itself to its counter, then looks
// for a writer; a writer announces itself, then looks at the counters. Both in sequentially
// consistent order: at least one of the two sees the other. Read shared_lock.h first.
#include "base/shared_lock.h"

#include "base/threads.h"

#include <algorithm>
#include <bit>

namespace {

// Returns a number that no other thread has until `COUNTERS` threads have taken one.
std::uint32_t number_of_thread()
{
    static std::atomic<std::uint32_t> next{0};
    constinit static thread_local std::uint32_t number = 0;  // 0: none yet
    if (number == 0) number = next.fetch_add(1, std::memory_order_relaxed) % UINT32_MAX + 1;
    return number - 1;
}

// Turns begin again after the last number.
std::int32_t next_turn(std::int32_t turn)
{
    return static_cast<std::int32_t>(static_cast<std::uint32_t>(turn) + 1);
}

}  // namespace

void img_mutex::lock()
{
    std::int32_t holders = 0;
    if (m_holders.compare_exchange_strong(holders, 1)) return;
    while (m_holders.exchange(2) != 0) img_wait_for_change(m_holders, 2);
}

void img_mutex::unlock()
{
    if (m_holders.exchange(0) == 2) img_wake_waiting(m_holders);
}

void img_shared_lock::take_turn()
{
    const std::int32_t mine = m_next.fetch_add(1);
    for (std::int32_t now = m_serving.load(); now != mine; now = m_serving.load())
        img_wait_for_change(m_serving, now);
}

void img_shared_lock::pass_turn()
{
    const std::int32_t mine = m_serving.fetch_add(1);
    if (m_next.load() != next_turn(mine)) img_wake_waiting(m_serving);
}

std::uint32_t img_shared_lock::lock_shared()
{
    const std::uint32_t index = number_of_thread() % COUNTERS;
    const std::uint64_t bit = std::uint64_t{1} << index;
    if ((m_used_counters.load() & bit) == 0) m_used_counters.fetch_or(bit);
    std::atomic<std::int32_t> &readers = m_counters[index].readers;
    readers.fetch_add(1);
    if (m_has_writer.load() == 0) return index;
    // In its turn the reader is alone with the other readers.
    unlock_shared(index);
    take_turn();
    readers.fetch_add(1);
    pass_turn();
    return index;
}

void img_shared_lock::unlock_shared(std::uint32_t index)
{
    std::atomic<std::int32_t> &readers = m_counters[index].readers;
    // uncounted: a writer comes just then
    if (readers.fetch_sub(1) == 1 && m_has_writer.load() != 0) img_wake_waiting(readers);
}

void img_shared_lock::lock()
{
    take_turn();
    m_has_writer.store(1);
    for (std::uint64_t used = m_used_counters.load(); used != 0; used &= used - 1) {
        auto &readers = m_counters[static_cast<std::size_t>(std::countr_zero(used))].readers;
        for (std::int32_t now = readers.load(); now != 0; now = readers.load())
            img_wait_for_change(readers, now);
    }
}

void img_shared_lock::unlock()
{
    m_has_writer.store(0);
    pass_turn();
}

bool img_shared_lock::try_lock()
{
    std::int32_t turn = m_serving.load();
    if (!m_next.compare_exchange_strong(turn, next_turn(turn))) return false;
    m_has_writer.store(1);
    const bool is_free = std::ranges::all_of(
        m_counters, [](const counter &each) { return each.readers.load() == 0; });
    if (!is_free) unlock();
    return is_free;
}

void img_shared_lock::reset_in_child()
{
    // uncounted: children of the tests end without a count
    for (counter &each : m_counters) each.readers.store(0);
    m_serving.store(m_next.load());
    m_has_writer.store(0);
}
