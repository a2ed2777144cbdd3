// Windows and whole tiles in every layout, held against the addressing rules alone; how many calls
// of the file they take, and what is said when one of them fails.
#include "access/tile_cache.h"
#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/settings.h"
#include "imgfile/img.h"
#include "std/std.h"
#include "std/std_interleaved_lines.h"
#include "std/std_lines.h"
#include "std/std_region.h"
#include "std/std_tiles.h"

#include "support/effort.h"
#include "support/file_test.h"
#include "support/layout_rules.h"
#include "support/random.h"
#include "support/refusal.h"
#include "support/sample.h"

#include <algorithm>
#include <fstream>
#include <set>

namespace {

// A window, or with `stride` 0 the run of `nlines` whole tiles from tile `line` on.
struct region {
    std::int32_t band, line, samp, nlines, nsamps, stride;
};

std::int32_t transfer(bool writing, img_handle image, const region &at, bytes *buffer,
                      const bytes &fill)
{
    const auto [band, line, samp, nlines, nsamps, stride] = at;
    std::uint8_t *const data = buffer->data();
    if (stride == 0)
        return writing ? img_dump_tiles(image, line, nlines, band, data)
                       : img_load_tiles(image, line, nlines, band, data);
    return writing
               ? img_dump_buffer(image, line, samp, nlines, nsamps, band, data, stride, &fill[0])
               : img_load_buffer(image, line, samp, nlines, nsamps, band, data, stride, &fill[0]);
}

enum class storage { file, cached_file, memory };

// The life of one image, made up of random transfers. What must be stored by now is known byte by
// byte, and with it what a load delivers and whether the file reaches far enough for it.
class random_life {
public:
    random_life(std::uint32_t seed, const std::string &file)
        : m_random(seed), m_file(file), m_name(seed % 2 == 0 ? file : file + "@fault"),
          m_where(static_cast<storage>(seed % 3))
    {
        m_image = {m_random.within(1, 20), m_random.within(1, 20), m_random.within(1, 3),
                   m_random.within(1, 2)};
        m_image.layout = m_random.within(IMG_LAYOUT_BSQ, IMG_LAYOUT_TILED_BIP);
        m_image.swap = m_random.within(0, 1);
        m_shift = m_random.within(0, m_image.nbands - 1);
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
            m_stored.resize(stored_bytes(m_image));
            if (m_where != storage::memory) expect_stored();
        }
    }
    std::ptrdiff_t failures() const { return m_failures; }

private:
    void open(bool created)
    {
        img_cache_mb = m_where == storage::cached_file ? 1 : 0;
        img_default_tile_nsamps = m_random.within(1, 8);
        img_default_tile_nlines = m_random.within(1, 8);
        m_handle = m_where == storage::memory ? create_test_memory(m_image)
                   : created                  ? create_test_file(m_name, m_image)
                                              : open_test_file(m_name, IMG_OPEN_READ_WRITE);
        img_cache_mb = 0;
        m_desc = img_find_image(m_handle);
        m_complete = !created;
        // The pixels of a tile may have their bands in another order.
        std::rotate(m_desc->band_map.begin(), m_desc->band_map.begin() + m_shift,
                    m_desc->band_map.begin() + m_image.nbands);
        if (m_where == storage::memory)
            m_stored.resize(stored_bytes(m_image));
        else if (created)
            m_header = read_file(m_file);
        if (m_where != storage::cached_file || !img_is_tiled(m_desc)) return;
        bytes plane(img_plane_size(m_desc));
        if (img_load_tiles(m_handle, 0, 1, 0, plane.data()) == -1) ++m_failures;
        m_desc->tile_cache->free_entries = m_random.within(1, 4);
    }
    void act()
    {
        const std::uint32_t kind = m_random.below(5);
        if (kind > 2)
            load(random_region());
        else if (kind > 0)
            dump(random_region());
        else if (m_where == storage::file)
            grow_meanwhile();
        if (!is_cached()) expect_stored();
    }

    // --- What is where ---

    bool is_cached() const { return m_desc->tile_cache != nullptr; }
    bool has_stored_tiles() const { return img_is_tiled(m_desc) && m_desc->virtual_tiled == 0; }
    std::size_t nbytes() const { return static_cast<std::size_t>(m_image.nbytes); }

    struct place {            // of one byte
        std::size_t byte;     // in the caller's buffer
        bool exists;          // false: outside the image
        std::int32_t tile;    // stored tile in which it lies
        std::size_t at, end;  // where it is stored; where what is read together with it ends
    };
    place place_of(std::int32_t band, std::int32_t line, std::int32_t samp, std::size_t shift) const
    {
        if (m_image.layout == IMG_LAYOUT_TILED_BIP)
            band = (band + m_image.nbands - m_shift) % m_image.nbands;
        const std::size_t at = stored_at(m_image, band, line, samp) + shift;
        const bool tiled = has_stored_tiles();
        const std::int32_t height = tiled ? m_image.tile_nlines : 1,
                           width = tiled ? m_image.tile_nsamps : 1;
        const std::size_t end =
            stored_at(m_image, is_interleaved(m_image) ? m_image.nbands - 1 : band,
                      line + height - 1 - line % height, samp + width - 1 - samp % width) +
            nbytes();
        return {0, true, line / height * m_desc->std_file->tiles_across + samp / width, at, end};
    }
    // The bytes of a region, whose buffer ends with the last of them.
    std::vector<place> places_of(const region &region) const
    {
        const auto [band, top, left, nlines, nsamps, stride] = region;
        std::vector<place> places;
        const bool in_tiles = stride == 0,
                   exchanged = !in_tiles && m_image.nbytes == 2 && m_image.swap != 0;
        const std::int32_t width = in_tiles ? m_desc->tile_nsamps : nsamps;
        const std::int32_t height = in_tiles ? m_desc->tile_nlines : nlines;
        const std::int32_t across = m_desc->std_file->tiles_across;
        for (std::int32_t i = 0; i < (in_tiles ? nlines : 1) * height; ++i)
            for (std::int32_t j = 0; j < width; ++j) {
                const std::int32_t tile = top + i / height;
                const std::int32_t line = in_tiles ? tile / across * height + i % height : top + i;
                const std::int32_t samp = in_tiles ? tile % across * width + j : left + j;
                const bool exists =
                    (in_tiles && has_stored_tiles()) ||
                    (line >= 0 && line < m_image.nlines && samp >= 0 && samp < m_image.nsamps);
                for (std::size_t k = 0; k < nbytes(); ++k) {
                    places.push_back(exists ? place_of(band, line, samp, exchanged ? 1 - k : k)
                                            : place{});
                    places.back().byte =
                        static_cast<std::size_t>(i * (in_tiles ? width : stride) + j) * nbytes() +
                        k;
                }
            }
        return places;
    }
    region random_region()
    {
        const std::int32_t band = m_random.within(0, m_image.nbands - 1);
        if (img_is_tiled(m_desc) && m_random.below(2) == 0) {
            const std::int32_t ntiles =
                m_desc->std_file->tiles_across * m_desc->std_file->tiles_down;
            const std::int32_t first = m_random.within(0, ntiles - 1);
            return {band, first, 0, m_random.within(1, ntiles - first), 0, 0};
        }
        const std::int32_t line = m_random.within(-3, m_image.nlines);
        const std::int32_t samp = m_random.within(-3, m_image.nsamps);
        const std::int32_t nlines = m_random.within(1, m_image.nlines + 4);
        const std::int32_t nsamps = m_random.within(1, m_image.nsamps + 4);
        return {band, line, samp, nlines, nsamps, nsamps + m_random.within(0, 2)};
    }
    bytes random_bytes(std::size_t count)
    {
        bytes some(count);
        for (auto &byte : some) byte = static_cast<std::uint8_t>(m_random.below(256));
        return some;
    }
    void expect_stored() const
    {
        bytes stored = m_header;
        stored.insert(stored.end(), m_stored.begin(), m_stored.end());
        if (m_where == storage::memory) {
            EXPECT_TRUE(std::equal(stored.begin(), stored.end(), m_desc->mem_image.get()));
        } else {
            EXPECT_EQ(read_file(m_file), stored);
        }
    }

    // --- Transfers ---

    void load(const region &at)
    {
        const std::vector<place> places = places_of(at);
        bytes buffer = random_bytes(places.back().byte + 9), expected = buffer;
        const bytes fill = random_bytes(1);
        bytes filled(2);
        put_sample(filled.data(), m_image.nbytes, fill[0]);
        std::int32_t result = transfer(false, m_handle, at, &buffer, fill);
        std::size_t needed = 0;
        for (const auto &[byte, exists, tile, from, end] : places) {
            needed = std::max(needed, end);
            if (exists && from < m_stored.size()) expected[byte] = m_stored[from];
            // Virtual tiles at the edges have no samples for all of their plane.
            if (!exists) expected[byte] = at.stride != 0 ? filled[byte % nbytes()] : buffer[byte];
        }
        if (m_where == storage::memory && img_is_tiled(m_desc) && needed > 0) {
            EXPECT_EQ(result, -1);  // quietly
            if (at.stride != 0) return;
            result = img_std_read_tiles(m_desc, at.line, at.nlines, at.band, buffer.data());
        }
        // While changed tiles wait in a cache, the file may not be as long yet as they will make
        // it, and the cache may have more than was asked to be stored.
        const bool is_stored = needed <= m_stored.size();
        if (m_complete || !is_cached()) {
            EXPECT_EQ(result, is_stored ? 0 : -1);
        }
        if (result == -1) ++m_failures;
        if (result == 0 ? is_stored : at.stride == 0 && !is_cached()) {
            EXPECT_EQ(buffer, expected);
        }
    }

    void dump(const region &at)
    {
        const std::vector<place> places = places_of(at);
        const bytes given = random_bytes(places.back().byte + 1);
        const bytes fill = is_cached() ? bytes(2) : random_bytes(2);
        bytes buffer = given;
        EXPECT_EQ(transfer(true, m_handle, at, &buffer, fill), 0);
        EXPECT_EQ(buffer, given);
        // In the tiles that a window touches, what is not stored yet gets the fill.
        std::set<std::int32_t> tiles;
        for (const place &each : places)
            if (each.exists && at.stride != 0 && has_stored_tiles()) tiles.insert(each.tile);
        for (const std::int32_t tile : tiles) {
            const std::size_t length = m_stored.size();
            for (const place &each : places_of({at.band, tile, 0, 1, 0, 0}))
                if (each.at >= length) store(each, fill[each.byte % nbytes()]);
        }
        for (const place &each : places)
            if (each.exists) store(each, buffer[each.byte]);
    }
    void store(const place &where, std::uint8_t value)
    {
        m_stored.resize(std::max(m_stored.size(), has_stored_tiles() ? where.end : where.at + 1));
        m_stored[where.at] = value;
    }

    // Someone else appends to the file, which may end within a tile then. Of interleaved tiles
    // only whole samples are ever taken back.
    void grow_meanwhile()
    {
        const std::size_t room = stored_bytes(m_image) - m_stored.size();
        const std::size_t count = std::min<std::size_t>(room, m_random.below(20));
        const bytes more =
            random_bytes(is_interleaved(m_image) ? count / nbytes() * nbytes() : count);
        m_stored.insert(m_stored.end(), more.begin(), more.end());
        std::ofstream out(m_file, std::ios::binary | std::ios::app);
        for (const std::uint8_t byte : more) out.put(static_cast<char>(byte));
    }

    random_numbers m_random;
    std::string m_file, m_name;  // by a method that lends, or by one whose calls are counted
    storage m_where;
    test_geometry m_image;
    std::int32_t m_shift;  // of the bands of an interleaved tile
    img_handle m_handle = -1;
    img_desc *m_desc = nullptr;
    bool m_complete = false;  // the file was as long as its data from the beginning
    bytes m_header, m_stored;
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
test_geometry two_tiles(std::int32_t layout, std::int32_t nbands = 3)
{
    const std::int32_t tile = layout >= IMG_LAYOUT_TILED && layout <= IMG_LAYOUT_TILED_BIP ? 1 : 0;
    return {4, 10, nbands, 2, 5 * tile, 4 * tile, layout};
}

TEST_F(Transfers, TakeFewCalls)
{
    constexpr region part{1, 1, 3, 2, 4, 4}, tiles{1, 0, 0, 2, 0, 0};
    const struct {
        std::int32_t layout;
        region at;
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
        EXPECT_EQ(transfer(writes > 0, image, at, &buffer, bytes(2)), 0);
        EXPECT_EQ((std::pair{calls_of(io_call::read), calls_of(io_call::write)}),
                  (std::pair{reads, writes}));
        EXPECT_TRUE(writes > 0 || calls_of(io_call::seek) == reads);
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
                    for (std::int32_t band = 0; band < image.nbands; ++band)
                        img_dump_buffer(created, 0, 0, 4, 10, band, &rows[0], 10, nullptr);
                    img_closefile(created);
                    bytes before = read_file(m_file);

                    const img_handle opened = open_test_file(m_name, IMG_OPEN_READ_WRITE);
                    fault_arm(call, nth, what);
                    const stderr_capture quiet;
                    img_dump_buffer(opened, 0, 0, 1, 1, 1, &one[0], 1, &one[0]);
                    img_closefile(opened);
                    const bool fired = fault_fired();
                    bytes after = read_file(m_file);
                    const auto at = TEST_HEADER_LENGTH + stored_at(image, 1, 0, 0);
                    std::fill_n(before.begin() + static_cast<std::ptrdiff_t>(at), 2, 0);
                    std::fill_n(after.begin() + static_cast<std::ptrdiff_t>(at), 2, 0);
                    ASSERT_EQ(after, before) << layout << ' ' << nth;
                    if (!fired) break;
                }
}

TEST_F(Transfers, StayWithinAnImageInMemory)
{
    const std::pair lines{"img_read_nontiled: read", "img_write_nontiled: Write"};
    const std::pair tiles{"img_std_read_tiles: read", "img_std_write_tiles: write"};
    const std::pair pixels{"img_std_read_nontiled_interleaved: read",
                           "img_std_write_nontiled_interleaved: Write"};
    const struct {
        std::int32_t layout, nbands;
        std::pair<std::string, std::string> text;
    } cases[] = {{0, 2, lines}, {1, 1, lines}, {5, 2, lines}, {1, 2, pixels},
                 {2, 2, tiles}, {3, 2, tiles}, {4, 2, tiles}};
    constexpr std::int32_t max = INT32_MAX;
    constexpr std::array<std::int32_t, 5> not_inside[] = {
        {-1, 0, 1, 1, 0}, {4, 0, 1, 1, 0},       {3, 0, 2, 1, 0}, {max, 0, max, 1, 0},
        {0, -1, 1, 1, 0}, {0, 10, 1, 1, 0},      {0, 9, 1, 2, 0}, {0, max, 1, max, 0},
        {0, 0, 1, 1, -1}, {0, 0, max, max, max}, {0, 0, 1, 1, 2}};
    for (const auto &[layout, nbands, text] : cases) {
        const test_geometry image = two_tiles(layout, nbands);
        img_desc *const desc = img_find_image(create_test_memory(image));
        img_std_file *const file = desc->std_file;
        const auto last = static_cast<std::int32_t>(stored_bytes(image)) - 1;
        bytes buffer(80, 9);
        const auto load = [&, band = nbands - 1] {
            return img_is_tiled(desc) ? img_std_read_tiles(desc, 0, 2, band, buffer.data())
                                      : img_std_read(desc, 0, 0, 4, 10, band, buffer.data(), 10);
        };
        const auto dump = [&, band = nbands - 1](std::int32_t line, std::int32_t samp) {
            return img_std_write(desc, line, samp, 1, 1, band, buffer.data(), 1, nullptr);
        };
        file->veof = file->veof_max = last - 1;
        EXPECT_EQ(refusal(load), text.first + " beyond virtual eof!!\n");
        EXPECT_EQ(refusal([&] { return dump(3, 9); }), text.second + " past virtual eof!!\n");
        EXPECT_EQ(desc->mem_image[static_cast<std::size_t>(last)], 0);
        if (!img_is_tiled(desc)) {  // the first three lines, and no more
            std::ranges::fill(buffer, 9);
            file->veof = last - 20 * (layout == IMG_LAYOUT_BIP ? nbands : 1);
            EXPECT_EQ(refusal(load), text.first + " beyond virtual eof!!\n");
            EXPECT_TRUE(buffer[59] == 0 && buffer[60] == 9);
        }
        file->veof_max = last;
        EXPECT_EQ(dump(3, 9) + dump(0, 0), 0);
        EXPECT_EQ(file->veof, last);
        EXPECT_EQ(load(), 0);
        EXPECT_EQ(img_std_read(desc, -1, 0, 1, 0, 9, nullptr, 1), 0);
        EXPECT_EQ(img_std_write(desc, 0, -1, 1, 0, 9, nullptr, 1, nullptr), 0);
        EXPECT_EQ(img_std_write(desc, 0, 0, 0, 1, 0, nullptr, 1, nullptr), 0);
        EXPECT_EQ(img_read_nontiled(desc, 0, 0, 0, 1, 0, nullptr, 1), 0);
        EXPECT_EQ(img_std_read_nontiled_interleaved(desc, 0, 0, 0, 1, 0, nullptr, 1), 0);
        for (const auto &[line, samp, nlines, nsamps, at_band] : not_inside) {
            EXPECT_EQ(img_std_read(desc, line, samp, nlines, nsamps, at_band, nullptr, 1), -1);
            EXPECT_EQ(img_std_write(desc, line, samp, nlines, nsamps, at_band, nullptr, 1, nullptr),
                      -1);
        }
        img_closefile(desc->handle);
    }
}

}  // namespace
