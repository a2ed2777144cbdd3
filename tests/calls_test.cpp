// Tests of calls.cpp: calls of many threads, on images of their own and on shared ones.
#include "api/calls.h"

#include "base/settings.h"
#include "io/io_method.h"
#include "io/platform.h"
#include "support/effort.h"
#include "support/file_test.h"
#include "support/random.h"
#include "support/sample.h"

#include <atomic>
#include <functional>
#include <thread>

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

template <typename Action>
void run_threads(int count, Action action)
{
    std::vector<std::thread> threads;
    for (int i = 0; i < count; ++i) threads.emplace_back(action, i);
    for (std::thread &each : threads) each.join();
}

// Kinds of images that many threads read and write.
struct shared_kind {
    const char *name;
    std::int32_t type;
    test_geometry image;
    std::int32_t cache_mb = 0;

    friend std::ostream &operator<<(std::ostream &out, const shared_kind &kind)
    {
        return out << kind.name;
    }
};
constexpr std::int32_t NLINES = 60, NSAMPS = 50, NBANDS = 2;
constexpr test_geometry geometry(std::int32_t layout, std::int32_t tile, std::int32_t nbytes = 1)
{
    return {.nlines = NLINES,
            .nsamps = NSAMPS,
            .nbands = NBANDS,
            .nbytes = nbytes,
            .tile_nsamps = tile,
            .tile_nlines = tile,
            .layout = layout};
}

// Registers ordinary files as an access method that reads at its position only.
void register_positions()
{
    img_register_io_method("positions", nullptr, img_platform_open, img_platform_close,
                           img_platform_read, img_platform_write, img_platform_seek,
                           img_platform_unlink, nullptr);
}

class SharedImage : public FileTest, public testing::WithParamInterface<shared_kind> {
protected:
    static constexpr int THREADS = 4;

    const test_geometry &image() const { return GetParam().image; }
    std::size_t nbytes() const { return static_cast<std::size_t>(image().nbytes); }

    // Opens a new image whose samples all have the value of their band and line, and which shows
    // its samples as they are stored.
    void create(const std::string &name)
    {
        const test_geometry &it = image();
        m_image = GetParam().type == TEST_TYPE ? create_test_file(name, it)
                                               : creating(name, GetParam().type, it).result;
        ASSERT_NE(m_image, -1);
        img_chain_init(m_image);
        for (std::int32_t band = 0; band < NBANDS; ++band)
            for (std::int32_t line = 0; line < NLINES; ++line)
                EXPECT_EQ(dump(m_image, window(band, line, 1), rows(band, line, 1, 0).data()), 0);
    }
    static transfer window(std::int32_t band, std::int32_t line, std::int32_t nlines)
    {
        return {.band = band, .line = line, .nlines = nlines, .nsamps = NSAMPS};
    }
    // Lines as they are stored in the `version`th writing.
    bytes rows(std::int32_t band, std::int32_t line, std::int32_t nlines, int version) const
    {
        bytes samples(static_cast<std::size_t>(nlines * NSAMPS) * nbytes());
        for (std::int32_t i = 0; i < nlines * NSAMPS; ++i)
            put_sample(&samples[static_cast<std::size_t>(i) * nbytes()], image().nbytes,
                       value(band, line + i / NSAMPS, version));
        return samples;
    }
    static std::uint16_t value(std::int32_t band, std::int32_t line, int version)
    {
        return static_cast<std::uint16_t>((band * 60 + line + version * 120) % 240);
    }
    // Reads lines of which each must be of one version, all of them of the same.
    void expect_one_version(std::int32_t band, std::int32_t line, std::int32_t nlines)
    {
        bytes samples(static_cast<std::size_t>(nlines * NSAMPS) * nbytes(), UNTOUCHED);
        ASSERT_EQ(load(m_image, window(band, line, nlines), samples.data()), 0);
        const int version = samples == rows(band, line, nlines, 0) ? 0 : 1;
        EXPECT_TRUE(samples == rows(band, line, nlines, version)) << band << ", " << line;
    }

    img_handle m_image = -1;
};

// Each thread writes bands of lines of its own, whole, in two versions by turns; all read all.
TEST_P(SharedImage, ShowsNoHalfOfAWrite)
{
    const setting cache_mb(img_cache_mb, GetParam().cache_mb);
    const setting width(img_default_tile_nsamps, 16), height(img_default_tile_nlines, 16);
    register_positions();
    for (const std::string &name : {m_file, m_file + "@positions"}) {
        create(name);
        run_threads(THREADS, [&](int thread) {
            random_numbers random(static_cast<std::uint32_t>(thread));
            constexpr std::int32_t height_of_part = NLINES / THREADS;
            for (int i = rounds(1000); i > 0; --i) {
                const std::int32_t band = random.within(0, NBANDS - 1);
                const std::int32_t part = random.within(0, THREADS - 1) * height_of_part;
                if (random.below(4) == 0) {
                    const std::int32_t own = thread * height_of_part;
                    const bytes written = rows(band, own, height_of_part, i % 2);
                    EXPECT_EQ(dump(m_image, window(band, own, height_of_part), written.data()), 0);
                } else {
                    expect_one_version(band, part, height_of_part);
                }
                EXPECT_EQ(img_query_num_bands(m_image), NBANDS);
            }
        });
        img_closefile(m_image);
        if (GetParam().cache_mb != 0) continue;  // its budget would make tiles of this image, too
        m_image = GetParam().type == TEST_TYPE ? open_test_file(m_file, IMG_OPEN_READ_ONLY)
                                               : opening(m_file).result;
        img_chain_init(m_image);
        for (std::int32_t part = 0; part < THREADS; ++part)
            expect_one_version(0, part * NLINES / THREADS, NLINES / THREADS);
        img_closefile(m_image);
    }
}

INSTANTIATE_TEST_SUITE_P(
    Kinds, SharedImage,
    testing::Values(shared_kind{"vitec", IMG_TYPE_VITEC, geometry(IMG_LAYOUT_BSQ, 0)},
                    shared_kind{"vitec_tiled", IMG_TYPE_VITEC, geometry(IMG_LAYOUT_TILED, 16)},
                    shared_kind{"vitec_two_bytes", IMG_TYPE_VITEC, geometry(IMG_LAYOUT_BSQ, 0, 2)},
                    shared_kind{"helava", IMG_TYPE_HELAVA, geometry(IMG_LAYOUT_BSQ, 0)},
                    shared_kind{"bip", TEST_TYPE, geometry(IMG_LAYOUT_BIP, 0)},
                    shared_kind{"tiled_bip", TEST_TYPE, geometry(IMG_LAYOUT_TILED_BIP, 8, 2)},
                    shared_kind{"cached", TEST_TYPE, geometry(IMG_LAYOUT_TILED_BIP, 8), 1},
                    shared_kind{"virtual", TEST_TYPE, geometry(IMG_LAYOUT_BSQ, 0), 1}),
    [](const auto &each) { return each.param.name; });

// The other image that an operation of the access method "nested" reads, and how that went.
img_handle other_image = -1;
int nested_calls = 0;

// Reads, but first does what an operation may do: calls the library for another image, and
// img_mgr_cleanup. It also forks, which it must not; that must not hang.
std::int32_t nested_read(std::int32_t fd, void *buffer, std::uint32_t count)
{
    std::uint8_t sample = 0;
    if (load(other_image, {}, &sample) == 0 && sample == 3 && img_mgr_cleanup() == 0) {
        if (const pid_t child = ::fork(); child == 0) ::_exit(0);
        int status = -1;
        ::wait(&status);
        nested_calls += status == 0 ? 1 : 0;
    }
    return img_platform_read(fd, buffer, count);
}

class Calls : public FileTest {
protected:
    // An image of 20 lines and as many samples, all of value `value`.
    void write_image(const std::string &name, std::uint8_t value)
    {
        const img_handle image =
            creating(name, IMG_TYPE_VITEC, {20, 20, 1, 1, 8, 8, IMG_LAYOUT_TILED}).result;
        const bytes samples(400, value);
        EXPECT_EQ(dump(image, {.nlines = 20, .nsamps = 20}, samples.data()), 0);
        img_closefile(image);
    }
};

// Both calls meet on one image in every order. Each answers as before the other or after it.
TEST_F(Calls, MeetInEveryOrder)
{
    write_image(m_file, 7);
    img_handle image = -1;
    using call = std::function<std::int32_t(bytes &)>;
    const call calls[] = {
        [&](bytes &) { return img_openfile(m_file.c_str(), IMG_OPEN_READ_WRITE) == -1 ? -1 : 0; },
        [&](bytes &) {
            return img_createfile((m_folder / "new").c_str(), 3, 3, 1, IMG_TYPE_HELAVA, 0, 0, 1) ==
                           -1
                       ? -1
                       : 0;
        },
        [&](bytes &) { return img_closefile(image); },
        [&](bytes &) {
            std::int32_t nlines = 20, nsamps = 20;
            const std::int32_t result = img_query_dimension(image, &nlines, &nsamps);
            EXPECT_EQ(nlines + nsamps, 40);
            return result;
        },
        [&](bytes &) { return img_query_tile_size(image, nullptr, nullptr); },
        [&](bytes &) { return img_query_image_type(image) == IMG_TYPE_VITEC ? 0 : -1; },
        [&](bytes &) { return img_query_num_bands(image) == 1 ? 0 : -1; },
        [&](bytes &to) { return load(image, {.nlines = 20, .nsamps = 20}, to.data()); },
        [&](bytes &to) { return load(image, {.nlines = 6, .tiles = true}, to.data()); },
        [&](bytes &) {
            const bytes samples(400, 7);
            return dump(image, {.nlines = 20, .nsamps = 20}, samples.data());
        },
        [&](bytes &) {
            const bytes samples(9 * 64, 7);
            return dump(image, {.nlines = 9, .tiles = true}, samples.data());
        },
        [&](bytes &) { return img_mgr_cleanup(); },
    };
    const stderr_capture quiet;
    for (const call &first : calls)
        for (const call &second : calls)
            for (int i = 0; i < 4; ++i) {
                img_pool_free(img_handle_pool);
                img_handle_pool = img_pool_create(0, IMG_MAX_HANDLES);
                image = opening(m_file).result;
                std::atomic<int> ready = 0;
                std::array<std::int32_t, 2> results{};
                run_threads(2, [&](int thread) {
                    bytes samples(9 * 64, 7);
                    ready += 1;
                    while (ready < 2) {}
                    const std::size_t which = static_cast<std::size_t>(thread);
                    results[which] = (thread == 0 ? first : second)(samples);
                    EXPECT_EQ(std::ranges::count(samples, 7) + std::ranges::count(samples, 0),
                              std::ssize(samples));
                });
                const bool fails = &first == &calls[2] || &second == &calls[2] ||
                                   &first == &calls[11] || &second == &calls[11];
                EXPECT_TRUE(fails || results == (std::array{0, 0}))
                    << &first - calls << ", " << &second - calls;
                for (img_handle each = 0; each < 4; ++each) img_closefile(each);
            }
}

// One thread closes and opens two images of different content, by turns under the same handle. The
// others read it, and may find it closed, but never a mixture.
TEST_F(Calls, FindTheImageOrNone)
{
    const std::array names{m_file, m_folder / "other"};
    for (std::uint8_t i = 0; i < 2; ++i) write_image(names[i], static_cast<std::uint8_t>(10 + i));
    const stderr_capture quiet;
    std::atomic<bool> over = false;
    std::atomic<int> seen = 0;
    run_threads(5, [&](int thread) {
        if (thread == 0) {
            for (int i = rounds(2'000); i > 0 || seen < 100; --i) {
                const img_handle image =
                    img_openfile(names[static_cast<std::size_t>(i % 2)].c_str(), 0);
                EXPECT_EQ(image, 0);
                std::this_thread::yield();
                EXPECT_EQ(img_closefile(image), 0);
            }
            over = true;
        }
        bytes samples(400);
        while (!over) {
            std::ranges::fill(samples, UNTOUCHED);
            const bool found = load(0, {.nlines = 20, .nsamps = 20}, samples.data()) == 0;
            const std::uint8_t expected = found ? (samples[0] == 10 ? 10 : 11) : UNTOUCHED;
            EXPECT_EQ(std::ranges::count(samples, expected), 400);
            seen += found ? 1 : 0;
        }
    });
}

TEST_F(Calls, RunInsideOfOperationsForOtherImages)
{
    write_image(m_file, 9);
    write_image(m_folder / "other", 3);
    img_register_io_method("nested", nullptr, img_platform_open, img_platform_close, nested_read,
                           img_platform_write, img_platform_seek, img_platform_unlink, nullptr);
    const img_handle image = opening(m_file + "@nested").result;
    other_image = opening(m_folder / "other").result;
    bytes samples(400);
    EXPECT_EQ(load(image, {.nlines = 20, .nsamps = 20}, samples.data()), 0);
    EXPECT_EQ(std::ranges::count(samples, 9), 400);
    EXPECT_GT(nested_calls, 0);
    img_closefile(image);
    img_closefile(other_image);
}

// Lines of several threads do not mix on the error stream.
TEST_F(Calls, PrintWholeLines)
{
    const std::string text = printed_by([&] {
        run_threads(4, [&](int thread) {
            std::uint8_t sample;
            for (int i = 0; i < 300; ++i) load(60 + thread, {}, &sample);
        });
    });
    const std::string lines[] = {"img_validate_img_handle: img_handle is out of range\n",
                                 "img_load_buffer: img_validate_img_handle()\n"};
    std::size_t position = 0;
    for (int i = 0; i < 2400; ++i) {
        const bool first = text.compare(position, lines[0].size(), lines[0]) == 0;
        const std::string &line = lines[first ? 0 : 1];
        ASSERT_EQ(text.compare(position, line.size(), line), 0) << position;
        position += line.size();
    }
    EXPECT_EQ(position, text.size());
}

// Another program cuts and restores a file. Reads of many threads fail or get its samples.
TEST_F(Calls, ReadAFileThatOthersCut)
{
    write_image(m_file, 9);
    const bytes content = read_file(m_file);
    const img_handle image = opening(m_file).result;
    const int other = ::open(m_file.c_str(), O_RDWR);
    const stderr_capture quiet;
    host.seconds_later = 3600;  // bytes that were just written are lent
    std::atomic<bool> over = false;
    run_threads(4, [&](int thread) {
        for (int i = rounds(3000); thread == 0 && i > 0; --i) {
            EXPECT_EQ(::ftruncate(other, i % 2 == 0 ? 0 : 400), 0);
            EXPECT_NE(::pwrite(other, content.data(), content.size(), 0), -1);
            std::this_thread::yield();
        }
        if (thread == 0) over = true;
        bytes samples(400);
        while (!over) {
            std::ranges::fill(samples, std::uint8_t{9});
            load(image, {.nlines = 20, .nsamps = 20}, samples.data());
            EXPECT_EQ(std::ranges::count(samples, 9) + std::ranges::count(samples, 0), 400);
        }
    });
    ::close(other);
    bytes samples(400);
    EXPECT_EQ(load(image, {.nlines = 20, .nsamps = 20}, samples.data()), 0);
    EXPECT_EQ(std::ranges::count(samples, 9), 400);
    img_closefile(image);
}

// A child finds every image whole, whatever the other threads were doing.
TEST_F(Calls, WorkInAForkedChild)
{
    write_image(m_file, 5);
    const img_handle image = opening(m_file).result;
    std::atomic<bool> over = false;
    run_threads(4, [&](int thread) {
        for (int i = rounds(300); thread == 0 && i > 0; --i) {
            const pid_t child = ::fork();
            if (child == 0) {
                bytes samples(400, 5);
                bool works = dump(image, {.line = 3, .nsamps = 20}, samples.data()) == 0;
                works = works && load(image, {.nlines = 20, .nsamps = 20}, samples.data()) == 0;
                const img_handle again = img_openfile(m_file.c_str(), IMG_OPEN_READ_ONLY);
                works = works && again != -1 && std::ranges::count(samples, 5) == 400;
                img_closefile(again);
                img_closefile(image);
                ::_exit(works ? 0 : 1);
            }
            int status = -1;
            ::waitpid(child, &status, 0);
            EXPECT_EQ(status, 0);
        }
        if (thread == 0) over = true;
        bytes samples(400, 5);
        while (!over) {
            if (thread == 1)
                EXPECT_EQ(dump(image, {.nlines = 20, .nsamps = 20}, samples.data()), 0);
            else if (thread == 2)
                EXPECT_EQ(load(image, {.nlines = 20, .nsamps = 20}, samples.data()), 0);
            else
                img_closefile(img_openfile(m_file.c_str(), IMG_OPEN_READ_ONLY));
        }
    });
    img_closefile(image);
}

}  // namespace
