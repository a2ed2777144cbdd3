// Each call to the access method goes wrong and each request for memory is denied, one after the
// other. Whatever it was: a call of the library that answers 0 has done its work, one that answers
// -1 has said why, nothing stored is lost but what was being written, and afterwards the file is as
// good as ever.
#include "support/effort.h"
#include "support/file_test.h"

#include "base/settings.h"
#include "base/types.h"
#include "io/io_method.h"
#include "std/std_interleaved_lines.h"
#include "std/std_lines.h"
#include "std/std_tiles.h"

#include <unistd.h>

namespace {

struct fault_plan {
    std::optional<io_call> call;  // none: a request for memory
    fault what = fault::fails;
};

std::vector<fault_plan> all_plans()
{
    std::vector<fault_plan> plans{{io_call::open},
                                  {io_call::close},
                                  {io_call::unlink},
                                  {io_call::seek},
                                  {io_call::seek, fault::stands_off},
                                  {std::nullopt}};
    for (const io_call call : {io_call::read, io_call::write})
        for (const fault what :
             {fault::fails, fault::moves_none, fault::moves_one, fault::moves_half})
            plans.push_back({call, what});
    return plans;
}

void arm(const fault_plan &plan, int nth, bool lasting)
{
    fault_arm(plan.call.value_or(io_call::open), plan.call ? nth : 0, plan.what, lasting);
    memory_arm(plan.call ? 0 : nth, lasting);
}

// What the transfers of a layout say; the last one of a write that falls short.
struct wording {
    std::string read, write, written;
};
const std::string TILES_READ = "img_std_read_tiles", TILES_WRITTEN = "img_std_write_tiles";
const wording WORDINGS[] = {
    {"img_read_nontiled", "img_std_write_nontiled", "img_std_write_nontiled: "},
    {"img_std_read_nontiled_interleaved", "img_std_write_nontiled_interleaved",
     "img_std_write_nontiled_inter: "},
    {TILES_READ, TILES_WRITTEN, TILES_WRITTEN + ":"},
    {TILES_READ, TILES_WRITTEN, TILES_WRITTEN + ": "},
    {TILES_READ, TILES_WRITTEN, TILES_WRITTEN + ": "}};

// What is said when a bad call ends a load, or a dump, in a layout.
std::string line_of(const bad_call &bad, std::int32_t layout, bool writing)
{
    const wording &words = WORDINGS[layout];
    const std::string counts =
        std::to_string(bad.got) + " of " + std::to_string(bad.asked) + " bytes ";
    const bool moved = bad.got != -1 && bad.call != io_call::seek && !bad.grows;
    if (writing && bad.call == io_call::read) return perror_line(TILES_READ + ":read", EIO);
    if (!writing && moved) return words.read + ": " + counts + "read!!\n";
    if (!writing) return perror_line(words.read + ":read", EIO);
    if (!moved)
        return perror_line(words.write + ":write", bad.grows && bad.got == 0 ? ENOSPC : EIO);
    const std::string line = words.written + counts + "written!!\n";
    return layout == IMG_LAYOUT_TILED ? line + perror_line(TILES_WRITTEN + ":partial write", EIO)
                                      : line;
}

struct image_kind {
    const char *name;
    std::int32_t type;
    test_geometry geometry;
    std::int32_t header_length;  // or that of the trailer

    friend std::ostream &operator<<(std::ostream &out, const image_kind &kind)
    {
        return out << kind.name;
    }
};

// The life of one file, and what it must hold by then.
class life {
public:
    life(const std::string &name, const image_kind &kind, const fault_plan &plan)
        : m_name(name), m_type(kind.type), m_image(kind.geometry), m_plan(plan),
          m_length(static_cast<std::size_t>(kind.header_length) + stored_bytes(m_image)),
          m_expected(stored_bytes(m_image)), m_doubt(stored_bytes(m_image))
    {
        std::filesystem::remove(name);
    }
    void run()
    {
        create(m_name);
        m_created = m_handle != -1;
        const auto run = [](bool writes, std::int32_t first, std::int32_t ntiles) {
            return transfer{.line = first, .nlines = ntiles, .tiles = true, .writes = writes};
        };
        transfer window{.band = 1, .line = 3, .samp = 2, .nlines = 2, .nsamps = 5};
        window.writes = true;
        live({window, {0, 1, 0, 2, 3, 3, false, true}, {0, 1, 0, 2, 3}, run(true, 3, 1)});
        if (m_created) open(IMG_OPEN_READ_WRITE);
        transfer first_tiles = run(true, 0, 3), last_tiles = run(false, 2, 2);
        first_tiles.band = last_tiles.band = 1;
        live({{1, 1, 1, 3, 4, 4, false, true}, whole(0), first_tiles, last_tiles});
        const bytes before = read_file(m_name);
        if (m_created) open(IMG_OPEN_READ_ONLY);
        live({whole(1), run(false, 0, 4)});
        EXPECT_EQ(read_file(m_name), before);
        create(m_name + "2");
        if (m_handle != -1) remove(m_name + "2");
    }
    // Once nothing goes wrong any more.
    void verify(bool lasting)
    {
        EXPECT_EQ(open_descriptors(), 0);
        m_created ? open(IMG_OPEN_READ_WRITE) : create(m_name);
        live({});  // which completes the file
        EXPECT_GE(std::filesystem::file_size(m_name), m_length);
        open(IMG_OPEN_READ_ONLY);
        m_lost_bytes = 0;
        live({whole(0), whole(1)});
        EXPECT_TRUE(lasting || m_lost_bytes <= m_lost_tiles * m_plane_size);
    }

private:
    bool is_short_of_memory() const { return !m_plan.call && memory_denied(); }
    bool shifts() const { return m_plan.what == fault::stands_off; }
    transfer whole(std::int32_t band) const
    {
        return {.band = band, .nlines = m_image.nlines, .nsamps = m_image.nsamps};
    }
    // Notes what the access method does meanwhile.
    template <typename Action>
    outcome watch(Action action)
    {
        const off_t printed = ::lseek(STDERR_FILENO, 0, SEEK_CUR);
        take_bad_calls();
        outcome seen;
        seen.result = action();
        seen.error = errno;
        seen.text.resize(static_cast<std::size_t>(::lseek(STDERR_FILENO, 0, SEEK_CUR) - printed));
        EXPECT_NE(::pread(STDERR_FILENO, seen.text.data(), seen.text.size(), printed), -1);
        m_bad_calls = take_bad_calls();
        return seen;
    }

    void create(const std::string &file)
    {
        const std::string name = file + "@fault";
        const test_geometry &it = m_image;
        const outcome seen = watch([&] {
            if (m_type == TEST_TYPE) return create_test_file(name, it);
            return img_createfile(name.c_str(), it.nlines, it.nsamps, it.nbands, m_type,
                                  it.tile_nsamps, it.tile_nlines, it.nbytes);
        });
        m_handle = seen.result;
        if (m_handle != -1) img_chain_init(m_handle);
        if (is_short_of_memory()) return;
        EXPECT_TRUE(m_bad_calls.empty() == (m_handle != -1) || shifts());
        EXPECT_EQ(seen.text, m_handle == -1 ? could_not_create(name) : "");
    }
    void open(std::int32_t flags)
    {
        const outcome seen = watch([&] { return open_test_file(m_name + "@fault", flags); });
        m_handle = seen.result;
        if (is_short_of_memory()) return;
        EXPECT_TRUE(m_handle != -1 || (seen.error == 22 && !m_bad_calls.empty()));
        EXPECT_EQ(seen.text, "");
    }
    void remove(const std::string &file)
    {
        img_desc *const desc = img_find_image(m_handle);
        const outcome seen = watch([&] { return img_type_of(desc).delete_image(desc); });
        EXPECT_EQ(seen.result, std::filesystem::exists(file) ? -1 : 0);
        EXPECT_TRUE(seen.result == 0 || m_plan.call == io_call::unlink);
        EXPECT_EQ(img_closefile(m_handle), 0);
        EXPECT_EQ(seen.text, "");
    }
    // Makes the transfers and closes the image.
    void live(const std::vector<transfer> &transfers)
    {
        if (m_handle == -1) return;
        for (const transfer &each : transfers) act(each);
        const int lost = close();
        m_lost_tiles += lost;
        for (const transfer &each : transfers)
            for_each_byte(m_image, each, [&](auto, std::size_t stored) {
                if (lost > 0 && each.writes && m_doubt[stored] == NO_DOUBT)
                    m_doubt[stored] = PERHAPS_LOST;
            });
        EXPECT_LE(std::filesystem::file_size(m_name), m_length);
    }
    // Returns how many changed tiles could not be written back from the cache. The close says so
    // for each, unless memory is short, and says nothing else.
    int close()
    {
        const bool caches = img_find_image(m_handle)->tile_cache != nullptr;
        outcome seen = watch([&] { return img_closefile(m_handle); });
        EXPECT_EQ(seen.result, 0);
        if (is_short_of_memory()) return 1;
        int lost = 0;
        for (const bad_call &bad : m_bad_calls)
            if (const std::string line = told(seen.text, bad, true, is_interleaved(m_image));
                caches && bad.planned && line != "") {
                seen.text.erase(0, line.size());
                ++lost;
            }
        EXPECT_EQ(seen.text, "");
        return lost;
    }

    void act(const transfer &request)
    {
        const img_desc &desc = *img_find_image(m_handle);
        m_image.swap = desc.swap;
        m_image.virtual_nlines = desc.virtual_tiled != 0 ? desc.tile_nlines : 0;
        m_image.virtual_nsamps = desc.virtual_tiled != 0 ? desc.tile_nsamps : 0;
        if (request.tiles && !img_is_tiled(&desc)) return;
        const std::int32_t plane = desc.tile_nlines * desc.tile_nsamps;
        m_plane_size = plane * m_image.nbytes;
        bytes buffer(static_cast<std::size_t>(
            request.nlines * (request.tiles ? plane : request.nsamps) * m_image.nbytes));
        for (auto &byte : buffer)
            if (request.writes)
                byte = m_last_byte = static_cast<std::uint8_t>(m_last_byte % 255 + 1);
        const outcome seen = watch([&] { return carry_out(m_handle, request, buffer.data()); });
        const bool done = seen.result == 0;
        expect_told(seen.text, done, request.writes,
                    img_is_tiled(&desc) && (!request.tiles || is_interleaved(m_image)));
        for_each_byte(m_image, request, [&](std::size_t i, std::size_t stored) {
            std::uint8_t &expected = m_expected[stored], &doubt = m_doubt[stored];
            if (request.writes) doubt = done ? NO_DOUBT : WRITTEN_IN_PART;
            if (request.writes && done) expected = buffer[i];
            EXPECT_TRUE(!done || doubt != NO_DOUBT || buffer[i] == expected);
            if (doubt == PERHAPS_LOST && buffer[i] != expected) ++m_lost_bytes;
        });
    }
    // The first call that did not do what was asked ends a transfer, with a line that tells it. A
    // write may meet the end of the file where it looks at what is there.
    void expect_told(std::string text, bool done, bool writing, bool looks)
    {
        if (is_short_of_memory()) return;
        // Lines that virtual tiles look for in vain are reported, whatever becomes of the write.
        const std::string missed = WORDINGS[IMG_LAYOUT_BSQ].read;
        while (writing && m_image.virtual_nlines != 0 && text.starts_with(missed))
            text.erase(0, text.find('\n') + 1);
        const auto bad = std::ranges::find_if(
            m_bad_calls, [=](const bad_call &each) { return each.planned || !writing; });
        if (bad == m_bad_calls.end())
            EXPECT_TRUE(done && text.empty()) << text;
        else if (done)
            EXPECT_TRUE(is_harmless(*bad) && text.empty()) << text;
        else
            EXPECT_TRUE(!text.empty() && told(text, *bad, writing, looks) == text) << text;
    }
    // A length that is not the file's has to be believed. Once the last pixel of a line is written
    // the file may stand anywhere.
    bool is_harmless(const bad_call &bad) const
    {
        if (bad.call != io_call::seek) return false;
        return bad.asked == IMG_SEEK_END ? shifts() : m_image.layout == IMG_LAYOUT_BIP;
    }
    // Returns the line at the beginning of `text` if it tells of that call. A write that looks at
    // what is stored may have sought that.
    std::string told(const std::string &text, const bad_call &bad, bool writing, bool looks) const
    {
        const std::string looked = perror_line(TILES_READ + ":read", EIO);
        if (writing && looks && bad.call == io_call::seek && text.starts_with(looked))
            return looked;
        const std::string line = line_of(bad, m_image.layout, writing);
        return text.starts_with(line) ? line : "";
    }

    enum : std::uint8_t { NO_DOUBT, WRITTEN_IN_PART, PERHAPS_LOST };
    std::string m_name;
    std::int32_t m_type;
    test_geometry m_image;
    fault_plan m_plan;
    std::size_t m_length;  // of the complete file
    bool m_created = false;
    img_handle m_handle = -1;
    std::vector<bad_call> m_bad_calls;
    std::int32_t m_plane_size = 0;
    std::uint8_t m_last_byte = 0;
    bytes m_expected, m_doubt;  // byte for byte as stored behind the header
    int m_lost_tiles = 0, m_lost_bytes = 0;
};

class Faults : public FileTest, public testing::WithParamInterface<image_kind> {};

TEST_P(Faults, AreReportedAndLoseNothing)
{
    const stderr_capture quiet;
    const setting cache_mb(img_cache_mb, 0);
    const setting width(img_default_tile_nsamps, 4), height(img_default_tile_nlines, 2);
    image_kind kind = GetParam();
    const int stride = 100 / rounds(100);
    int first = 0;
    for (const fault_plan &plan : all_plans())
        for (int variant = 0; variant < 8; ++variant) {
            kind.geometry.nbytes = 1 + variant % 2;
            if (kind.type == IMG_TYPE_HELAVA && kind.geometry.nbytes == 2) continue;
            img_cache_mb = variant / 2 % 2;
            const bool lasting = variant / 4 != 0;
            for (int nth = 1 + first++ % stride;; nth += stride) {
                life file(m_file, kind, plan);
                arm(plan, nth, lasting);
                file.run();
                if (!fault_fired() && !memory_denied()) break;
                arm(plan, 0, false);
                file.verify(lasting);
                ASSERT_FALSE(HasFailure())
                    << "call " << (plan.call ? static_cast<int>(*plan.call) : -1) << ", fault "
                    << static_cast<int>(plan.what) << ", variant " << variant << ", number " << nth;
            }
        }
}

constexpr std::int32_t HEADER = TEST_HEADER_LENGTH;
constexpr test_geometry lines(std::int32_t layout)
{
    return {.nlines = 5, .nsamps = 7, .nbands = 2, .layout = layout};
}
constexpr test_geometry tiles(std::int32_t layout, std::int32_t swap = 0)
{
    return {.nlines = 5,
            .nsamps = 7,
            .nbands = 2,
            .tile_nsamps = 4,
            .tile_nlines = 2,
            .layout = layout,
            .swap = swap};
}
constexpr test_geometry vitec_tiles{.nlines = 10,
                                    .nsamps = 12,
                                    .nbands = 2,
                                    .tile_nsamps = 8,
                                    .tile_nlines = 8,
                                    .layout = IMG_LAYOUT_TILED};
INSTANTIATE_TEST_SUITE_P(
    Kinds, Faults,
    testing::Values(image_kind{"bsq", TEST_TYPE, lines(IMG_LAYOUT_BSQ), HEADER},
                    image_kind{"bip", TEST_TYPE, lines(IMG_LAYOUT_BIP), HEADER},
                    image_kind{"tiled", TEST_TYPE, tiles(IMG_LAYOUT_TILED), HEADER},
                    image_kind{"band_tiled", TEST_TYPE, tiles(IMG_LAYOUT_BAND_TILED), HEADER},
                    image_kind{"tiled_bip", TEST_TYPE, tiles(IMG_LAYOUT_TILED_BIP, 1), HEADER},
                    image_kind{"vitec_tiled", IMG_TYPE_VITEC, vitec_tiles, VITEC_HEADER},
                    image_kind{"vitec", IMG_TYPE_VITEC, lines(IMG_LAYOUT_BSQ), VITEC_HEADER},
                    image_kind{"helava", IMG_TYPE_HELAVA, lines(IMG_LAYOUT_BSQ), HELAVA_TRAILER}),
    [](const auto &each) { return each.param.name; });

}  // namespace
