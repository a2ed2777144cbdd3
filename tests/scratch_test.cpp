// Tests of scratch.cpp: what is kept of working memory.
#include "base/scratch.h"

#include "api/library.h"
#include "imgfile/img.h"
#include "io/io_method.h"
#include "support/fault_memory.h"

#include <gtest/gtest.h>
#include <thread>
#include <vector>

TEST(Scratch, KeepsALittleOfWhatWasTaken)
{
    constexpr std::size_t page = IMG_SCRATCH_ALIGNMENT, limit = IMG_SCRATCH_LIMIT;
    const auto fresh_bytes = [](std::initializer_list<std::size_t> sizes) {
        memory_arm(0);
        std::vector<img_scratch> taken;
        for (const std::size_t size : sizes) {
            taken.push_back(img_take_scratch(size));
            EXPECT_EQ(reinterpret_cast<std::uintptr_t>(taken.back().get()) % page, 0U);
            std::fill_n(taken.back().get(), size, std::uint8_t{1});
        }
        return shortage.requested;
    };
    const bool is_fresh = img_io_method_count == 0;  // other tests have not used the library
    for (int i = 0; is_fresh && i < 2; ++i)
        EXPECT_GE(fresh_bytes({1}), page);  // nothing is kept yet
    img_library_init();
    fresh_bytes({1});  // makes the store of this thread
    img_free_scratch();
    EXPECT_EQ(fresh_bytes({1, page + 1, limit / 2}), 3 * page + limit / 2);
    EXPECT_EQ(fresh_bytes({page, 2 * page - 1, limit / 2}), 0U);
    EXPECT_EQ(fresh_bytes({limit + 1}), limit + 1);  // which is not kept
    EXPECT_EQ(fresh_bytes({limit / 2}), 0U);
    EXPECT_EQ(fresh_bytes({limit}), limit);  // which leaves no room for the others
    EXPECT_EQ(fresh_bytes({1}), page);
    for (int i = 0; i < 2; ++i)
        EXPECT_EQ(fresh_bytes({1, 1, 1, 1, 1, 1, 1, 1, 1}), (i == 0 ? 8 : 1) * page);
    EXPECT_EQ(img_take_scratch(SIZE_MAX), nullptr);
    img_mgr_cleanup();
    EXPECT_EQ(fresh_bytes({1}), page);
    std::thread([&] {
        memory_arm(2);  // the store of the thread
        img_take_scratch(1).reset();
        EXPECT_TRUE(shortage.denied);
        EXPECT_GE(fresh_bytes({1}), page);
    }).join();
}
