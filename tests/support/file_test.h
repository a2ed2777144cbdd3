// Tests of image files: a folder for each, and calls with all that a host sees of them.
#ifndef IMG_TEST_FILE_TEST_H
#define IMG_TEST_FILE_TEST_H

#include "base/id_pool.h"
#include "base/image_table.h"
#include "base/img_desc.h"
#include "chain/chain_links.h"
#include "imgfile/img.h"
#include "support/fault_memory.h"
#include "support/fault_method.h"
#include "support/fault_system.h"
#include "support/format_rules.h"
#include "support/guard.h"
#include "support/refusal.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <gtest/gtest.h>
#include <ostream>

// What a call answers, leaves in errno and prints.
struct outcome {
    std::int32_t result = -2;
    int error = 0;
    std::string text;

    bool operator==(const outcome &) const = default;
    friend std::ostream &operator<<(std::ostream &out, const outcome &seen)
    {
        return out << seen.result << ", errno " << seen.error << ", \"" << seen.text << '"';
    }
};
inline const outcome REFUSED_QUIETLY{-1, 22, ""};
inline const outcome NO_FREE_HANDLE{-1, 24, "No more open images available!!!\n"};

template <typename Action>
outcome outcome_of(Action action)
{
    outcome seen;
    seen.text = printed_by([&] {
        errno = 0;
        seen.result = action();
        seen.error = errno;
    });
    return seen;
}

inline outcome opening(const std::string &name, std::int32_t flags = IMG_OPEN_READ_WRITE)
{
    return outcome_of([&] { return img_openfile(name.c_str(), flags); });
}

// Two-byte images of the test type have no chain.
inline img_handle create(const std::string &name, std::int32_t type, const test_geometry &image)
{
    if (type == TEST_TYPE) return create_test_file(name, image);
    return img_createfile(name.c_str(), image.nlines, image.nsamps, image.nbands, type,
                          image.tile_nsamps, image.tile_nlines, image.nbytes);
}

inline outcome creating(const std::string &name, std::int32_t type, const test_geometry &image)
{
    return outcome_of([&] { return create(name, type, image); });
}

inline std::string could_not_create(const std::string &name)
{
    return "img_createfile: could not create " + name + "!\n";
}

// A folder, fresh handles, and faults that end with the test. No handle stays taken, and no
// descriptor open.
class FileTest : public testing::Test {
protected:
    FileTest()
    {
        test_type_register();
        img_pool_free(img_handle_pool);
        img_handle_pool = img_pool_create(0, IMG_MAX_HANDLES);
        fault_arm(io_call::open, 0);
    }
    ~FileTest() override
    {
        memory_arm(0);
        host = {};
        EXPECT_EQ(open_descriptors, 0);
        EXPECT_TRUE(img_handle_pool == nullptr || img_handle_pool->next == 0);
    }
    scratch_folder m_folder;
    std::string m_file = m_folder / "scene";
    std::string m_name = m_file + "@fault";  // the same file by way of the access method "fault"
};

// Queries an open image, and reads of it what is where mistakes would show: windows and tiles at
// its corners. Two-byte samples come as they are from then on.
inline void expect_reads(file_model expected, img_handle image)
{
    const test_geometry &it = expected.image;
    std::array<std::int32_t, 5> answers{0, 0, 0, 0, img_query_num_bands(image)};
    img_query_dimension(image, &answers[0], &answers[1]);
    img_query_tile_size(image, &answers[2], &answers[3]);
    EXPECT_EQ(answers,
              (std::array{it.nlines, it.nsamps, it.tile_nsamps, it.tile_nlines, it.nbands}));
    img_chain_init(image);
    const auto expect = [&](const transfer &request, std::int64_t samples) {
        bytes buffer(img_count(samples * it.nbytes), UNTOUCHED), wanted = buffer;
        EXPECT_EQ(load(image, request, buffer.data(), &FILL),
                  expected.load(request, wanted.begin()));
        EXPECT_EQ(buffer, wanted);
    };
    const tile_grid grid = tiles_of(it);
    const auto ntiles =
        static_cast<std::int32_t>(grid.height * grid.width > 1 << 16 ? 0 : grid.across * grid.down);
    const std::string text = printed_by([&] {
        for (const std::int32_t band : std::set{0, it.nbands - 1}) {
            if (band < 0 || band >= it.nbands) continue;
            for (const std::int32_t line : {-1, 0, 1, it.nlines - 1})
                for (const std::int32_t samp : {0, it.nsamps - 1})
                    for (const std::int32_t nlines : {1, 2})
                        expect({band, line, samp, nlines, 5}, nlines * 5);
            for (const std::int32_t tile : {0, 1, ntiles - 2, ntiles - 1})
                if (tile >= 0 && tile < ntiles)
                    expect({.band = band, .line = tile, .tiles = true}, grid.height * grid.width);
        }
    });
    EXPECT_EQ(text, expected.text);
}

#endif
