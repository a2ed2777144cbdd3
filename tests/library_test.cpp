// Tests of library.cpp, and with it of settings.cpp, types.cpp and type_hooks.cpp: start-up,
// clean-up and the tables of types and access methods.
#include "api/library.h"
#include "base/type_hooks.h"
#include "base/types.h"
#include "io/io_method.h"
#include "support/file_test.h"

TEST(Library, StartsWithTheFirstOpen)
{
    if (img_io_method_count != 0) GTEST_SKIP() << "the library is in use: not the first test";
    EXPECT_EQ(img_query_image_type(0) + img_closefile(0) + img_mgr_cleanup(), IMG_NO_TYPE);
    EXPECT_EQ(img_io_method_count, 0);
    memory_arm(1);
    EXPECT_EQ(opening("no such file"), NO_FREE_HANDLE);
    memory_arm(0);
    for (int round = 0; round < 2; ++round) {
        EXPECT_EQ(opening("no such file"), REFUSED_QUIETLY);
        EXPECT_EQ(img_io_method_count, 1);
        EXPECT_EQ(img_find_io_method(""), 0);
        EXPECT_EQ(img_io_method_table[0].get_value(), 0.0);
        for (std::size_t slot = 0; slot <= 44; ++slot)
            EXPECT_EQ(img_type_table[slot].enabled, slot == 0 || slot == 8 ? 1 : 0) << slot;
    }
    EXPECT_EQ(std::string(img_type_table[0].name) + img_type_table[0].extension, "VITec.img");
    EXPECT_EQ(std::string(img_type_table[8].name) + img_type_table[8].extension, "Helava.d");
}

using CleanUp = FileTest;

TEST_F(CleanUp, LeavesOpenImagesAloneAndNoHandleForOthers)
{
    const img_handle handle = creating(m_name, IMG_TYPE_HELAVA, {.nlines = 4}).result;
    EXPECT_EQ(img_mgr_cleanup() + img_mgr_cleanup(), 0);
    EXPECT_EQ(opening(m_name), NO_FREE_HANDLE);
    EXPECT_EQ(creating(m_name, IMG_TYPE_VITEC, {}), NO_FREE_HANDLE);
    const std::uint8_t sample = 9;
    EXPECT_EQ(dump(handle, {.line = 1}, &sample), 0);
    EXPECT_EQ(img_closefile(handle), 0);
    EXPECT_EQ(read_file(m_file)[1], 9);
}
