// What an operating system, a disk, other programs and a sudden end may do to a file.
#include "std/std.h"
#include "support/effort.h"
#include "support/file_test.h"
#include "support/random.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

// An image of every layout and sample size.
std::vector<test_geometry> images()
{
    std::vector<test_geometry> all;
    for (std::int32_t layout = 0; layout < 5; ++layout)
        for (const std::int32_t nbytes : {1, 2}) {
            const std::int32_t tile = layout < IMG_LAYOUT_TILED ? 0 : 4;
            all.push_back({5, 6, 2, nbytes, tile, tile, layout});
        }
    return all;
}

// A line of one band, and the bytes of its samples.
using image_line = std::pair<transfer, bytes>;

// All lines, each with a value of its own: the last band first, so that whole pixels are there.
std::vector<image_line> lines_of(const test_geometry &image)
{
    std::vector<image_line> lines;
    for (std::int32_t i = 9; i >= 0; --i)
        lines.emplace_back(transfer{.band = i / 5, .line = i * 2 % 5, .nsamps = image.nsamps},
                           bytes(static_cast<std::size_t>(image.nsamps * image.nbytes),
                                 static_cast<std::uint8_t>(i + 1)));
    return lines;
}

// Loads a line that may be there in part: what is not its own is 0.
void expect_no_other(img_handle handle, const image_line &line, bool whole = false)
{
    const auto &[at, own] = line;
    bytes row(own.size());
    const bool there = load(handle, at, &row[0]) == 0;
    EXPECT_TRUE(there || !whole);
    for (const std::uint8_t byte : there ? row : bytes())
        EXPECT_TRUE(byte == own[0] || (byte == 0 && !whole));
}

// What a host sees of an image that it creates and writes, and the file that it leaves.
struct life {
    std::vector<bool> written;
    bytes loaded, file;
    bool operator==(const life &) const = default;
};

life live(const std::string &name, const test_geometry &image, std::int32_t type = TEST_TYPE)
{
    life seen;
    const img_handle handle = create(name, type, image);
    for (const auto &[at, row] : handle != -1 ? lines_of(image) : std::vector<image_line>{}) {
        bytes before(row.size(), UNTOUCHED);
        load(handle, at, &before[0]);
        seen.loaded.insert(seen.loaded.end(), before.begin(), before.end());
        seen.written.push_back(dump(handle, at, &row[0]) == 0);
        host.last_words += seen.written.back() ? 1 : 0;
        EXPECT_EQ(img_find_image(handle)->std_file->veof, std::filesystem::file_size(name));
    }
    img_closefile(handle);
    seen.file = read_file(name);
    return seen;
}

class System : public FileTest {
protected:
    static auto descriptors_in_use()
    {
        return std::distance(std::filesystem::directory_iterator("/proc/self/fd"), {});
    }
    static void expect_refused(const std::string &name)
    {
        const auto in_use = descriptors_in_use();
        for (const std::int32_t mode : {0, 1, 2}) EXPECT_EQ(opening(name, mode), REFUSED_QUIETLY);
        for (const std::int32_t type : {IMG_TYPE_VITEC, IMG_TYPE_HELAVA})
            EXPECT_EQ(creating(name, type, {}).text, could_not_create(name));
        EXPECT_EQ(descriptors_in_use(), in_use) << name;
    }
    // Of a file that is opened afterwards, what was written is there.
    static void expect_kept(const std::string &name, const test_geometry &image,
                            std::vector<bool> written)
    {
        const outcome opened = outcome_of([&] { return open_test_file(name, IMG_OPEN_READ_ONLY); });
        EXPECT_TRUE(opened.result == 0 || (opened == REFUSED_QUIETLY && written.empty()));
        const stderr_capture quiet;
        written.resize(10);
        for (std::size_t i = 0; i < 10; ++i)
            expect_no_other(opened.result, lines_of(image)[i], written[i]);
        img_closefile(opened.result);
    }
};

TEST_F(System, RefusesWhatItCannotOpen)
{
    const bytes file = vitec_file({});
    write_file(m_file, file);
    std::filesystem::create_directory(m_folder / "folder");
    ASSERT_EQ(::mkfifo((m_folder / "pipe").c_str(), 0600), 0);
    for (const char *const name : {"folder", "missing/scene", "pipe"})
        expect_refused(m_folder / name);
    fault_arm(io_call::seek, 1, fault::fails, true);
    expect_refused(m_name);
    write_file(m_file, file);
    host.has_no_status = true;
    expect_refused(m_file);
}

TEST_F(System, OpensLeaveNothingBehind)
{
    img_closefile(creating(m_file, IMG_TYPE_VITEC, {.nlines = 4, .nsamps = 4, .nbytes = 2}).result);
    write_file(m_folder / "cut", vitec_file({}, 150));
    const auto open_both = [&] {
        EXPECT_EQ(img_openfile((m_folder / "cut").c_str(), IMG_OPEN_READ_WRITE), -1);
        EXPECT_EQ(img_openfile(m_file.c_str(), IMG_OPEN_READ_WRITE), 0);
        bytes window(16);
        load(0, {.nlines = 4, .nsamps = 4}, window.data());
        img_closefile(0);
    };
    const auto mappings = [] { return std::ranges::count(read_file("/proc/self/maps"), '\n'); };
    open_both();
    const auto mapped = mappings();
    const auto in_use = descriptors_in_use();
    for (int i = rounds(100'000); i > 0; --i) open_both();
    EXPECT_EQ(descriptors_in_use(), in_use);
    EXPECT_LE(mappings(), mapped + 100);
}

TEST_F(System, ResultsAreTheSameWhateverInterruptsCallsAndSwallowsMessages)
{
    const int saved = ::dup(STDERR_FILENO);
    for (const test_geometry &image : images()) {
        life expected;
        EXPECT_NE(printed_by([&] { expected = live(m_file, image); }), "");
        ::close(STDERR_FILENO);
        EXPECT_TRUE(live(m_file, image) == expected);
        const int full = ::open("/dev/full", O_WRONLY);
        host.interrupts = true;
        EXPECT_TRUE(live(m_file, image) == expected);
        host = {};
        ::dup2(saved, STDERR_FILENO);
        EXPECT_EQ(full, STDERR_FILENO);
    }
    ::close(saved);
}

TEST_F(System, FullDiskCostsNoLineThatWasWritten)
{
    for (const test_geometry &image : images()) {
        bool complete = false;
        const int step =
            image.layout == IMG_LAYOUT_BIP ? 12 : 7;  // reads are of whole pixels there
        for (host.disk_size = 0; !complete; host.disk_size += step) {
            life seen;
            const std::string text = printed_by([&] { seen = live(m_file, image); });
            const bool created = !seen.written.empty();
            complete = created && std::ranges::count(seen.written, false) == 0;
            const char *const method = image.tile_nlines == 0 ? "nontiled" : "tiles";
            const std::string line =
                created ? std::string("img_std_write_") + method : could_not_create(m_file);
            EXPECT_EQ(text.find(line) == text.npos, complete);
            expect_kept(m_file, image, seen.written);
        }
    }
}

TEST_F(System, SuddenEndCostsNoLineThatWasWritten)
{
    constexpr int none = 99;
    // Returns the lines that were written before the end, or `none` when there was no end.
    const auto end_at = [this](int step, std::int32_t type, const test_geometry &image) {
        if (const pid_t child = ::fork(); child != 0) {
            int status = 0;
            ::waitpid(child, &status, 0);
            return WIFEXITED(status) ? WEXITSTATUS(status) : none;
        }
        host.writes_left = 1 + step / 2;
        host.half_done = step % 2 != 0;
        ::close(STDERR_FILENO);
        live(m_file, image, type);
        ::_exit(none);
    };
    std::vector<std::pair<std::int32_t, test_geometry>> cases{{IMG_TYPE_VITEC, {5, 6, 2}},
                                                              {IMG_TYPE_VITEC, {5, 6, 2, 1, 8, 8}},
                                                              {IMG_TYPE_HELAVA, {5, 6, 2}}};
    for (const test_geometry &image : images())
        if (image.nbytes == 2) cases.emplace_back(TEST_TYPE, image);
    for (const auto &[type, image] : cases)
        for (int step = 0, done = 0; done != none; step += 11 / rounds(10)) {
            done = end_at(step, type, image);
            expect_kept(m_file, image,
                        std::vector<bool>(static_cast<std::size_t>(std::min(done, 10)), true));
        }
}

TEST_F(System, DeliversNothingForeignFromAFileThatOthersChange)
{
    const stderr_capture quiet;
    random_numbers random(1);
    host.seconds_later = 0;
    for (const test_geometry &image : images()) {
        const bytes content = live(m_file, image).file;
        const img_handle handle = open_test_file(m_file, IMG_OPEN_READ_WRITE);
        const int fd = ::open(m_file.c_str(), O_RDWR);
        for (int i = rounds(5000); i > 0; --i) {
            EXPECT_EQ(::ftruncate(fd, random.within(0, static_cast<int>(content.size()))), 0);
            EXPECT_NE(::pwrite(fd, &content[0], random.below(3) * content.size() / 2, 0), -1);
            const image_line line = lines_of(image)[random.below(10)];
            expect_no_other(handle, line);
            const bytes before = read_file(m_file);
            EXPECT_EQ(dump(handle, line.first, &line.second[0]), 0);
            bytes after = read_file(m_file);
            EXPECT_EQ(img_find_image(handle)->std_file->veof, static_cast<int>(after.size()));
            after.resize(before.size());
            std::size_t changes = 0;
            for (std::size_t k = 0; k < before.size(); ++k) changes += before[k] != after[k];
            EXPECT_LE(changes, line.second.size());
            expect_no_other(handle, line, image.layout != IMG_LAYOUT_BIP);
        }
        ::close(fd);
        img_closefile(handle);
    }
}

}  // namespace
