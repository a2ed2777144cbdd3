// Tests of queries.cpp: what is known of an open image, and of handles that name none.
#include "api/open.h"
#include "support/file_test.h"

using Queries = FileTest;

TEST_F(Queries, RefuseHandlesThatNameNoImageAndStoreNothing)
{
    const img_handle closed = img_alloc_image("any", 0);
    EXPECT_EQ(img_validate_img_handle(closed), 0);
    img_release_image(closed, 0);
    for (const img_handle handle : {-1, 60, INT32_MIN, INT32_MAX, closed}) {
        std::int32_t first = 77, second = 88;
        const std::string text = printed_by([&] {
            EXPECT_EQ(img_query_dimension(handle, &first, &second), -1);
            EXPECT_EQ(img_query_tile_size(handle, &first, &second), -1);
            EXPECT_EQ(img_query_num_bands(handle), -1);
            EXPECT_EQ(img_query_nbits(handle), -1);
            EXPECT_EQ(img_query_image_type(handle), 44);
            EXPECT_EQ(img_closefile(handle), 0);
            EXPECT_EQ(img_validate_img_handle(handle), -1);
        });
        EXPECT_EQ((std::array{first, second}), (std::array{77, 88}));
        EXPECT_EQ(text, std::string("img_validate_img_handle: img_handle ") +
                            (handle == closed ? "not open\n" : "is out of range\n"));
    }
}

TEST_F(Queries, FindNoTypeInAFreshRecordAndCountMergedBandsAsOne)
{
    const img_handle handle = img_alloc_image("scene.img@nosuch", IMG_OPEN_WRITE_ONLY);
    img_desc *const desc = img_find_image(handle);
    EXPECT_EQ((std::array{desc->type, desc->oflags, desc->layout, desc->handle}),
              (std::array{44, 0x8001, 6, handle}));
    desc->band_map = {};
    img_set_image_params(desc, 512, 640, 128, 64, 3, 2, 10, 2, 0, nullptr, nullptr, nullptr);
    EXPECT_EQ(desc->band_map, (std::array{0, 1, 2}));
    EXPECT_EQ(img_query_nbits(handle), 10);
    EXPECT_EQ(img_query_dimension(handle, nullptr, nullptr), 0);
    EXPECT_EQ(img_query_tile_size(handle, nullptr, nullptr), 0);
    desc->merge_bands = 1;
    EXPECT_EQ(img_query_num_bands(handle), 1);
    img_release_image(handle, 0);
}
