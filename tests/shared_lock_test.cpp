// Tests of shared_lock.cpp: who holds a lock, and who waits.
#include "base/shared_lock.h"

#include "support/effort.h"

#include <gtest/gtest.h>
#include <thread>
#include <vector>

#ifdef __clang__  // tests take a lock in ways in which the library does not
#pragma clang diagnostic ignored "-Wthread-safety-analysis"
#endif

namespace {

void run_threads(int count, const auto &action)
{
    std::vector<std::thread> threads;
    for (int i = 0; i < count; ++i) threads.emplace_back(action, i);
    for (std::thread &each : threads) each.join();
}

// More threads than counters; a writer sees no reader, a reader no writer, and all come to their
// turn.
TEST(SharedLock, IsSharedByReadersOrHeldByOneWriter)
{
    img_shared_lock lock;
    std::atomic<int> readers = 0, writers = 0, most_readers = 0;
    run_threads(80, [&](int thread) {
        for (int i = rounds(2000); i > 0; --i) {
            if (thread % 4 == 0) {
                lock.lock();
                EXPECT_EQ(writers.fetch_add(1), 0);
                EXPECT_EQ(readers, 0);
                writers -= 1;
                lock.unlock();
            } else {
                const std::uint32_t counter = lock.lock_shared();
                most_readers = std::max(most_readers.load(), readers.fetch_add(1) + 1);
                EXPECT_EQ(writers, 0);
                std::this_thread::yield();
                readers -= 1;
                lock.unlock_shared(counter);
            }
        }
    });
    EXPECT_GT(most_readers, 1);
}

TEST(SharedLock, IsTakenAtOnceOrNotAtAll)
{
    img_shared_lock lock;
    const std::uint32_t counter = lock.lock_shared();
    EXPECT_FALSE(lock.try_lock());
    std::thread([&] { EXPECT_FALSE(lock.try_lock()); }).join();
    lock.unlock_shared(counter);
    ASSERT_TRUE(lock.try_lock());
    EXPECT_FALSE(lock.try_lock());
    lock.unlock();
    lock.unlock_shared(lock.lock_shared());
    lock.lock();
    lock.unlock();
}

// Each of two writers in an endless loop lets the other one, and readers, in between.
TEST(SharedLock, LetsNobodyWaitForever)
{
    img_shared_lock lock;
    std::atomic<int> left = 3;
    run_threads(3, [&](int thread) {
        bool counted = false;
        for (int i = 0; left > 0 || !counted; ++i) {
            std::uint32_t counter = 0;
            if (thread == 0)
                counter = lock.lock_shared();
            else
                lock.lock();
            if (i == 100) {
                left -= 1;
                counted = true;
            }
            thread == 0 ? lock.unlock_shared(counter) : lock.unlock();
        }
    });
}

}  // namespace
