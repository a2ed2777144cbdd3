// Tests of transfers.cpp, and of all layers below it at work together: windows and whole tiles in
// every layout, held against the model; how many calls of the file they take, and what is printed
// when one of them fails.
#include "access/tile_cache.h"
#include "base/settings.h"
#include "std/std.h"
#include "std/std_tiles.h"
#include "support/effort.h"
#include "support/file_test.h"
#include "support/random.h"

#include <fstream>

namespace {

enum class storage { file, cached_file, memory };

// The life of one image, made up of random transfers. The model knows what must be stored by now,
// and with it what a load delivers and whether the file reaches far enough for it.
class random_life {
public:
    random_life(std::uint32_t seed, const std::string &file)
        : m_random(seed), m_file(file),
          m_name(file + std::array{"@refusing", "@fault", "", "@fault"}[seed % 4]),
          m_where(static_cast<storage>(seed % 3))
    {
        m_image = {m_random.within(1, 20), m_random.within(1, 20), m_random.within(1, 3),
                   m_random.within(1, 2)};
        m_image.layout = m_random.within(IMG_LAYOUT_BSQ, IMG_LAYOUT_TILED_BIP);
        m_image.swap = m_random.within(0, 1);
        m_image.band_shift = m_random.within(0, m_image.nbands - 1);
        if (m_image.layout >= IMG_LAYOUT_TILED) m_image.tile_nsamps = m_random.within(1, 8);
        // With one of the tile sizes alone an image is untiled, but stored in multiples of it.
        if (m_image.tile_nsamps != 0 || (m_where != storage::memory && m_random.below(4) == 0))
            m_image.tile_nlines = m_random.within(1, 8);
    }
    void run()
    {
        for (const bool created : {true, false}) {
            if (m_where == storage::memory && !created) break;
            open(created);
            for (int i = 0; i < 15 && !testing::Test::HasFailure(); ++i) act();
            img_closefile(m_handle);
            m_model.complete();
            if (m_where != storage::memory) {
                EXPECT_EQ(read_file(m_file), m_model.content);
            }
        }
    }
    std::ptrdiff_t failures() const { return m_failures; }

private:
    void open(bool created)
    {
        const setting cache_mb(img_cache_mb, m_where == storage::cached_file ? 1 : 0);
        const setting width(img_default_tile_nsamps, m_random.within(1, 8));
        const setting height(img_default_tile_nlines, m_random.within(1, 8));
        m_handle = m_where == storage::memory ? create_test_memory(m_image)
                   : created                  ? create_test_file(m_name, m_image)
                                              : open_test_file(m_name, IMG_OPEN_READ_WRITE);
        m_desc = img_find_image(m_handle);
        m_complete = !created;
        // The pixels of a tile may have their bands in another order.
        std::rotate(m_desc->band_map.begin(), m_desc->band_map.begin() + m_image.band_shift,
                    m_desc->band_map.begin() + m_image.nbands);
        if (m_where == storage::memory)
            m_model = {m_image, 0, bytes(stored_bytes(m_image))};
        else if (created)
            m_model = {m_image, TEST_HEADER_LENGTH, read_file(m_file)};
        m_model.image.virtual_nsamps = m_desc->virtual_tiled != 0 ? m_desc->tile_nsamps : 0;
        m_model.image.virtual_nlines = m_desc->virtual_tiled != 0 ? m_desc->tile_nlines : 0;
        if (m_where != storage::cached_file || !img_is_tiled(m_desc)) return;
        bytes plane(img_plane_size(m_desc));
        if (::load(m_handle, {.tiles = true}, plane.data()) == -1) ++m_failures;
        m_desc->tile_cache->free_entries = m_random.within(1, 4);
    }
    void act()
    {
        const std::uint32_t kind = m_random.below(5);
        if (kind > 2)
            load(random_transfer());
        else if (kind > 0)
            dump(random_transfer());
        else if (m_where == storage::file)
            grow_meanwhile();
        if (!is_cached()) expect_stored();
    }
    bool is_cached() const { return m_desc->tile_cache != nullptr; }

    transfer random_transfer()
    {
        transfer at{.band = m_random.within(0, m_image.nbands - 1)};
        if (img_is_tiled(m_desc) && m_random.below(2) == 0) {
            const tile_grid grid = tiles_of(m_model.image);
            const auto ntiles = static_cast<std::int32_t>(grid.across * grid.down);
            at.tiles = true;
            at.line = m_random.within(0, ntiles - 1);
            at.nlines = m_random.within(1, ntiles - at.line);
            return at;
        }
        at.line = m_random.within(-3, m_image.nlines);
        at.samp = m_random.within(-3, m_image.nsamps);
        at.nlines = m_random.within(1, m_image.nlines + 4);
        at.nsamps = m_random.within(1, m_image.nsamps + 4);
        at.stride = at.nsamps + m_random.within(0, 2);
        return at;
    }
    bytes random_bytes(std::size_t count)
    {
        bytes some(count);
        for (auto &byte : some) byte = static_cast<std::uint8_t>(m_random.below(256));
        return some;
    }
    bytes random_buffer(const transfer &request)
    {
        const tile_grid grid = tiles_of(m_model.image);
        return random_bytes(
            img_count(m_image.nbytes * request.nlines *
                      (request.tiles ? grid.height * grid.width : request.pitch())));
    }
    void expect_stored() const
    {
        const std::uint8_t *const memory = m_desc->mem_image.get();
        EXPECT_EQ(memory != nullptr ? bytes(memory, memory + m_model.content.size())
                                    : read_file(m_file),
                  m_model.content);
    }

    // While changed tiles wait in a cache, the file may not be as long yet as they will make it,
    // and the cache may have more than was asked to be stored.
    void load(const transfer &request)
    {
        bytes buffer = random_buffer(request), expected = buffer;
        const std::uint8_t fill = random_bytes(1)[0];
        const std::int32_t wanted = m_model.load(request, expected.begin(), fill);
        std::int32_t result = ::load(m_handle, request, buffer.data(), &fill);
        bool moves = request.tiles;
        for_each_byte(m_model.image, request, [&](auto, auto) { moves = true; });
        if (m_where == storage::memory && img_is_tiled(m_desc) && moves) {
            EXPECT_EQ(result, -1);  // quietly
            if (!request.tiles) return;
            result = img_std_read_tiles(m_desc, request.line, request.nlines, request.band,
                                        buffer.data());
        }
        if (m_desc->virtual_tiled != 0 && request.tiles) {  // beyond the image they hold anything
            bytes inside = expected;
            for_each_byte(m_model.image, request,
                          [&](std::size_t i, auto) { inside[i] = buffer[i]; });
            buffer = inside;
        }
        if (m_complete || !is_cached()) {
            EXPECT_EQ(result, wanted);
        }
        if (result == -1) ++m_failures;
        // What a loan that was refused has left in the buffer is worth nothing.
        const bool refuses = m_name.ends_with("@refusing");
        if (result == 0 ? wanted == 0 : !is_cached() && !refuses) {
            EXPECT_EQ(buffer, expected);
        }
    }
    void dump(const transfer &request)
    {
        const bytes given = random_buffer(request), fill = is_cached() ? bytes(2) : random_bytes(2);
        bytes buffer = given;
        const auto dumps = [&] {
            EXPECT_EQ(::dump(m_handle, request, buffer.data(), &fill[0]), 0);
        };
        if (m_desc->virtual_tiled != 0)  // what is not stored yet is looked for line by line
            EXPECT_EQ(printed_by(dumps).find("tiles"), std::string::npos);
        else
            dumps();
        EXPECT_EQ(buffer, given);
        m_model.dump(request, given.data(), fill);
    }
    // Another program appends to the file, which may end within a tile then. Of interleaved tiles
    // only whole samples are ever taken back.
    void grow_meanwhile()
    {
        const std::size_t room = m_model.at(stored_bytes(m_image)) - m_model.content.size();
        std::size_t count = std::min<std::size_t>(room, m_random.below(20));
        if (is_interleaved(m_image)) count -= count % img_count(m_image.nbytes);
        const bytes more = random_bytes(count);
        m_model.content.insert(m_model.content.end(), more.begin(), more.end());
        std::ofstream out(m_file, std::ios::binary | std::ios::app);
        for (const std::uint8_t byte : more) out.put(static_cast<char>(byte));
    }

    random_numbers m_random;
    std::string m_file, m_name;  // by a method that lends, refuses to, or never does
    storage m_where;
    test_geometry m_image;
    img_handle m_handle = -1;
    img_desc *m_desc = nullptr;
    bool m_complete = false;  // the file was as long as its data from the beginning
    file_model m_model{};
    std::ptrdiff_t m_failures = 0;  // each of which prints a line
};

class Transfers : public FileTest {};

TEST_F(Transfers, FollowTheAddressingRules)
{
    for (int seed = 1; seed <= rounds(5000); ++seed) {
        random_life life(static_cast<std::uint32_t>(seed), m_file);
        const std::string text = printed_by([&] { life.run(); });
        EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), life.failures()) << text;
        ASSERT_FALSE(HasFailure()) << "seed " << seed;
    }
}

// Two tiles side by side, if the layout has any.
test_geometry two_tiles(std::int32_t layout)
{
    const bool tiled = layout >= IMG_LAYOUT_TILED;
    return {4, 10, 3, 2, tiled ? 5 : 0, tiled ? 4 : 0, layout};
}

TEST_F(Transfers, TakeFewCalls)
{
    const transfer part{.band = 1, .line = 1, .samp = 3, .nlines = 2, .nsamps = 4};
    const transfer tiles{.band = 1, .nlines = 2, .tiles = true};
    const struct {
        std::int32_t layout;
        transfer at;
        int reads, writes;
    } cases[] = {{0, part, 2, 0}, {1, part, 2, 0},  {2, part, 2, 0},  {3, part, 1, 0},
                 {4, part, 1, 0}, {0, part, 0, 2},  {1, part, 0, 8},  {2, part, 2, 2},
                 {3, part, 1, 1}, {2, tiles, 0, 2}, {3, tiles, 0, 1}, {4, part, 5, 1},
                 {4, tiles, 4, 1}};
    for (const auto &[layout, at, reads, writes] : cases) {
        img_closefile(create_test_file(m_name, two_tiles(layout)));
        const img_handle image = open_test_file(m_name, IMG_OPEN_READ_WRITE);
        bytes buffer(80);
        fault_arm(io_call::open, 0);
        EXPECT_EQ(writes > 0 ? dump(image, at, &buffer[0]) : load(image, at, &buffer[0]), 0);
        EXPECT_EQ((std::pair{calls_of(io_call::read), calls_of(io_call::write)}),
                  (std::pair{reads, writes}));
        EXPECT_TRUE(writes > 0 || calls_of(io_call::seek) == reads);
        img_closefile(image);
    }
}

TEST_F(Transfers, TellHowFarAWriteWent)
{
    const std::string texts[] = {"img_std_write_nontiled: 1 of 20 bytes written!!\n",
                                 "img_std_write_nontiled_inter: 1 of 2 bytes written!!\n",
                                 "img_std_write_tiles:1 of 40 bytes written!!\n" +
                                     perror_line("img_std_write_tiles:partial write", EIO)};
    for (const std::int32_t layout : {0, 1, 2}) {
        const img_handle image = create_test_file(m_name, two_tiles(layout));
        const bytes line(20);
        fault_arm(io_call::write, 1, fault::moves_one);
        EXPECT_EQ(refusal([&] { return dump(image, {.nsamps = 10}, line.data()); }), texts[layout]);
        img_closefile(image);
    }
}

// A method may answer anything: what was stored before stays, but for what is being written.
TEST_F(Transfers, SurviveAnswersBeyondReason)
{
    for (const std::int32_t layout : {0, 1, 2, 3, 4})
        for (const io_call call : {io_call::read, io_call::seek})
            for (const fault what : {fault::answers_min, fault::answers_max})
                for (int nth = 1;; ++nth) {
                    const test_geometry image = two_tiles(layout);
                    const img_handle created = create_test_file(m_file, image);
                    bytes rows(80, 7), one(2, 9);
                    for (const std::int32_t band : {0, 1, 2})
                        dump(created, {.band = band, .nlines = 4, .nsamps = 10}, &rows[0]);
                    img_closefile(created);
                    bytes before = read_file(m_file);

                    const img_handle opened = open_test_file(m_name, IMG_OPEN_READ_WRITE);
                    fault_arm(call, nth, what);
                    const stderr_capture quiet;
                    dump(opened, {.band = 1}, &one[0], &one[0]);
                    img_closefile(opened);
                    bytes after = read_file(m_file);
                    const auto at = TEST_HEADER_LENGTH + stored_at(image, 1, 0, 0);
                    std::fill_n(before.begin() + at, 2, 0);
                    std::fill_n(after.begin() + at, 2, 0);
                    ASSERT_EQ(after, before) << layout << ' ' << nth;
                    if (!fault_fired()) break;
                }
}

}  // namespace
