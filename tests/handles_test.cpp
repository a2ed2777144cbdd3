#include "api/open.h"
#include "base/id_pool.h"
#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "imgfile/img.h"
#include "std/std_tiles.h"
#include "support/file_test.h"

namespace {

using Handles = FileTest;

TEST_F(Handles, NumberSixtyImagesLowestFirstAndTheLastGivenBackNext)
{
    for (img_handle handle = 0; handle < 60; ++handle)
        EXPECT_EQ(creating(m_name, IMG_TYPE_VITEC, {handle, 3}).result, handle);
    EXPECT_EQ(opening(m_name), NO_FREE_HANDLE);
    EXPECT_EQ(creating(m_name, IMG_TYPE_VITEC, {}), NO_FREE_HANDLE);
    for (const img_handle handle : {30, 0, 1}) img_closefile(handle);
    for (const img_handle handle : {1, 0, 30}) EXPECT_EQ(opening(m_name).result, handle);
    for (img_handle handle = 59; handle >= 0; --handle) {
        EXPECT_EQ(img_query_image_type(handle), IMG_TYPE_VITEC);
        EXPECT_EQ(img_closefile(handle), 0);
    }
    img_pool_give_back(img_handle_pool, 7);  // of which none was taken
}

TEST_F(Handles, ThatNameNoImageAreRefusedAndNothingIsStored)
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

TEST_F(Handles, BeginWithoutATypeAndCountMergedBandsAsOne)
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

TEST_F(Handles, MessagesGoToWhoAsksForThem)
{
    static std::vector<std::pair<std::string, int>> told;
    img_message_sink = [](const char *text, int error) { told.emplace_back(text, error); };
    EXPECT_EQ(creating("", IMG_TYPE_VITEC, {}).text, "");
    EXPECT_EQ(img_createfile("", 1, 1, 1, IMG_TYPE_VITEC, 0, 0, 1), -1);
    errno = 5;
    EXPECT_EQ(img_fail_errno("img_std_read_tiles:read"), -1);
    EXPECT_EQ(img_fail("%s!!\n", std::string(600, 'x').c_str()), -1);
    img_message_sink = nullptr;
    const std::pair<std::string, int> no_name{"No image file name specified!!", 0};
    EXPECT_EQ(told[0], no_name);
    EXPECT_EQ(told[1], no_name);
    EXPECT_EQ(told[2], std::pair(std::string("img_std_read_tiles:read"), 5));
    EXPECT_EQ(told[3], std::pair(std::string(511, 'x'), 0));
}

TEST(IdPool, WithoutIdsHasNoneToGive)
{
    img_id_pool none{.count = 2, .next = 1, .ids = nullptr};
    EXPECT_EQ(img_pool_take(&none), -1);
    img_pool_give_back(&none, 0);
    EXPECT_EQ(none.next, 1);
}

}  // namespace
