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

#include <chrono>
#include <thread>

namespace {

struct fault_plan {
    std::optional<io_call> call;  // none: a request for memory
    fault what = fault::fails;
};

std::vector<fault_plan> all_plans()
{
    std::vector<fault_plan> plans{{std::nullopt}, {io_call::seek, fault::stands_off}};
    for (const io_call call :
         {io_call::open, io_call::close, io_call::read, io_call::write, io_call::seek})
        plans.push_back({call});
    for (const io_call call : {io_call::read, io_call::write})
        for (const fault what : {fault::moves_none, fault::moves_one, fault::moves_half})
            plans.push_back({call, what});
    return plans;
}

void arm(const fault_plan &plan, int nth, bool lasting)
{
    fault_arm(plan.call.value_or(io_call::open), plan.call ? nth : 0, plan.what, lasting);
    memory_arm(plan.call ? 0 : nth, lasting);
}

// What the transfers of a layout say; the last one of a write that falls short.
const std::string TILES_READ = "img_std_read_tiles", TILES_WRITTEN = "img_std_write_tiles";
const std::array<std::string, 3> WORDINGS[] = {
    {"img_read_nontiled", "img_std_write_nontiled", "img_std_write_nontiled: "},
    {"img_std_read_nontiled_interleaved", "img_std_write_nontiled_interleaved",
     "img_std_write_nontiled_inter: "},
    {TILES_READ, TILES_WRITTEN, TILES_WRITTEN + ":"},
    {TILES_READ, TILES_WRITTEN, TILES_WRITTEN + ": "},
    {TILES_READ, TILES_WRITTEN, TILES_WRITTEN + ": "}};

// What is said when a bad call ends a load, or a dump, in a layout.
std::string line_of(const bad_call &bad, std::int32_t layout, bool writing)
{
    const auto &[read, write, written] = WORDINGS[layout];
    const std::string counts =
        std::to_string(bad.got) + " of " + std::to_string(bad.asked) + " bytes ";
    const bool moved = bad.got != -1 && bad.call != io_call::seek && !bad.grows;
    if (writing && bad.call == io_call::read) return perror_line(TILES_READ + ":read", EIO);
    if (!writing)
        return moved ? read + ": " + counts + "read!!\n" : perror_line(read + ":read", EIO);
    if (!moved) return perror_line(write + ":write", bad.grows && bad.got == 0 ? ENOSPC : EIO);
    const std::string line = written + counts + "written!!\n";
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
        open();
        m_created = m_handle != -1;
        constexpr bool tiles = true, writes = true;
        live({{1, 3, 2, 2, 5, {}, !tiles, writes},
              {0, 1, 0, 2, 3, {}, !tiles, writes},
              {0, 1, 0, 2, 3},
              {0, 3, 0, 1, 1, {}, tiles, writes}});
        if (m_created) open(IMG_OPEN_READ_WRITE);
        live({{1, 1, 1, 3, 4, {}, !tiles, writes},
              whole(0),
              {1, 0, 0, 3, 1, {}, tiles, writes},
              {1, 2, 0, 2, 1, {}, tiles}});
        const bytes before = read_file(m_name);
        if (m_created) open(IMG_OPEN_READ_ONLY);
        live({whole(1), {0, 0, 0, 4, 1, {}, tiles}});
        EXPECT_EQ(read_file(m_name), before);
    }
    // Once nothing goes wrong any more.
    void verify(bool lasting)
    {
        EXPECT_EQ(open_descriptors, 0);
        m_created ? open(IMG_OPEN_READ_WRITE) : open();
        live({});  // which completes the file
        EXPECT_GE(std::filesystem::file_size(m_name), m_length);
        open(IMG_OPEN_READ_ONLY);
        m_lost_bytes = 0;
        live({whole(0), whole(1)});
        EXPECT_TRUE(lasting || m_lost_bytes <= m_lost_tiles * m_plane_size);
    }

private:
    bool is_short_of_memory() const { return !m_plan.call && shortage.denied; }
    bool shifts() const { return m_plan.what == fault::stands_off; }
    transfer whole(std::int32_t band) const
    {
        return {.band = band, .nlines = m_image.nlines, .nsamps = m_image.nsamps};
    }
    // Notes what the access method does meanwhile.
    template <typename Action>
    outcome watch(Action action)
    {
        bad_calls.clear();
        return outcome_of(action);
    }

    // Opens the image, or creates it where no flags are given.
    void open(std::optional<std::int32_t> flags = {})
    {
        const std::string name = m_name + "@fault";
        const outcome seen = watch(
            [&] { return flags ? open_test_file(name, *flags) : create(name, m_type, m_image); });
        m_handle = seen.result;
        const bool failed = m_handle == -1;
        if (!failed) img_chain_init(m_handle);
        if (is_short_of_memory()) return;
        EXPECT_TRUE(failed ? !bad_calls.empty() : flags || bad_calls.empty() || shifts());
        EXPECT_TRUE(!failed || !flags || seen.error == 22);
        EXPECT_EQ(seen.text, failed && !flags ? could_not_create(name) : "");
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
        for (const bad_call &bad : bad_calls)
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
        const std::string missed = WORDINGS[IMG_LAYOUT_BSQ][0];
        while (writing && m_image.virtual_nlines != 0 && text.starts_with(missed))
            text.erase(0, text.find('\n') + 1);
        const auto bad = std::ranges::find_if(
            bad_calls, [=](const bad_call &each) { return each.planned || !writing; });
        if (bad == bad_calls.end())
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
    std::int32_t m_plane_size = 0;
    std::uint8_t m_last_byte = 0;
    bytes m_expected, m_doubt;  // byte for byte as stored behind the header
    int m_lost_tiles = 0, m_lost_bytes = 0;
};

class Faults : public FileTest, public testing::WithParamInterface<image_kind> {
protected:
    // Another thread reads another image all the while, which no fault may touch.
    void read_beside(const std::stop_token &over)
    {
        bytes samples(SIZE);
        while (!over.stop_requested()) {
            std::ranges::fill(samples, UNTOUCHED);
            EXPECT_EQ(load(m_other, {.nsamps = SIZE}, samples.data()), 0);
            EXPECT_EQ(std::ranges::count(samples, 8), SIZE);
            std::this_thread::sleep_for(std::chrono::microseconds(100));
        }
    }
    ~Faults() override
    {
        m_beside = {};
        img_closefile(m_other);
    }

private:
    static constexpr std::int32_t SIZE = 20'000;  // more than is copied by way of working memory
    img_handle m_other = [this] {
        const std::string name = m_folder / "other";
        write_file(name, helava_file({.nsamps = SIZE}, SIZE));
        const img_handle image = img_openfile(name.c_str(), IMG_OPEN_READ_WRITE);
        EXPECT_EQ(dump(image, {.nsamps = SIZE}, bytes(SIZE, 8).data()), 0);
        return image;
    }();
    std::jthread m_beside{[this](const std::stop_token &over) { read_beside(over); }};
};

TEST_P(Faults, AreReportedAndLoseNothing)
{
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
                if (!fault_fired() && !shortage.denied) break;
                arm(plan, 0, false);
                file.verify(lasting);
                ASSERT_FALSE(HasFailure())
                    << "call " << (plan.call ? static_cast<int>(*plan.call) : -1) << ", fault "
                    << static_cast<int>(plan.what) << ", variant " << variant << ", number " << nth;
            }
        }
}

const image_kind KINDS[] = {
    {"bsq", TEST_TYPE, {5, 7, 2}, TEST_HEADER_LENGTH},
    {"bip", TEST_TYPE, {5, 7, 2, 1, 0, 0, IMG_LAYOUT_BIP}, TEST_HEADER_LENGTH},
    {"tiled", TEST_TYPE, {5, 7, 2, 1, 4, 2, IMG_LAYOUT_TILED}, TEST_HEADER_LENGTH},
    {"band_tiled", TEST_TYPE, {5, 7, 2, 1, 4, 2, IMG_LAYOUT_BAND_TILED}, TEST_HEADER_LENGTH},
    {"tiled_bip", TEST_TYPE, {5, 7, 2, 1, 4, 2, IMG_LAYOUT_TILED_BIP, 1}, TEST_HEADER_LENGTH},
    {"vitec_tiled", IMG_TYPE_VITEC, {10, 12, 2, 1, 8, 8, IMG_LAYOUT_TILED}, VITEC_HEADER},
    {"vitec", IMG_TYPE_VITEC, {5, 7, 2}, VITEC_HEADER},
    {"helava", IMG_TYPE_HELAVA, {5, 7, 2}, HELAVA_TRAILER}};
INSTANTIATE_TEST_SUITE_P(Kinds, Faults, testing::ValuesIn(KINDS),
                         [](const auto &each) { return each.param.name; });

}  // namespace
