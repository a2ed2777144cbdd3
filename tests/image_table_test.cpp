// Tests of image_table.cpp and id_pool.cpp: the handles of open images.
#include "api/open.h"
#include "support/file_test.h"

using Handles = FileTest;

TEST_F(Handles, NumberSixtyImagesFromTheLowestAndReuseTheLastReturned)
{
    for (img_handle handle = 0; handle < 60; ++handle)
        EXPECT_EQ(creating(m_name, IMG_TYPE_VITEC, {.nlines = handle, .nsamps = 3}).result, handle);
    EXPECT_EQ(opening(m_name), NO_FREE_HANDLE);
    EXPECT_EQ(creating(m_name, IMG_TYPE_VITEC, {}), NO_FREE_HANDLE);
    for (const img_handle handle : {30, 0, 1}) img_closefile(handle);
    for (const img_handle handle : {1, 0, 30}) EXPECT_EQ(opening(m_name).result, handle);
    for (img_handle handle = 59; handle >= 0; --handle) {
        EXPECT_EQ(img_query_image_type(handle), IMG_TYPE_VITEC);
        EXPECT_EQ(img_closefile(handle), 0);
    }
    img_release_image(7, 0);  // of which none was taken
}
