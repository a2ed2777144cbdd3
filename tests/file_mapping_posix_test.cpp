// Tests of file_mapping_posix.cpp: bytes that are read in place, when they are lent, and what may
// become of the file meanwhile.
#include "support/effort.h"
#include "support/lending.h"
#include "support/random.h"

#include <pthread.h>
#include <sys/prctl.h>
#include <sys/wait.h>

TEST_F(Lending, GivesWhatTheFileHasNow)
{
    for (const std::int32_t oflags : {0, 2}) {
        open(oflags);
        for (const auto &[offset, count] : {std::pair{0, 1}, {0, SIZE}, {4095, 2}, {SIZE - 1, 1}})
            EXPECT_EQ(lend_and_compare(offset, count), 0);
        for (const auto &[offset, count] :
             {std::pair{0, SIZE + 1}, {-1, 2}, {0, 0}, {INT32_MAX, INT32_MAX}})
            EXPECT_EQ(lend_and_compare(offset, count), 1);
        m_content[5] ^= 1;
        cut(10);
        EXPECT_EQ(lend_and_compare(10, 1), 1);
        restore();
        EXPECT_EQ(lend_and_compare(0, SIZE), 0);
        m_content.resize(3 * SIZE, 77);
        restore();
        EXPECT_EQ(lend_and_compare(0, 3 * SIZE), 0);
        m_content.resize(SIZE);
        cut(SIZE);
        img_platform_close(m_fd);
        EXPECT_EQ(lend_and_compare(0, 1), 1);
    }
}

TEST_F(Lending, RefusesFilesThatCannotBeMappedOrWatched)
{
    open(1);
    EXPECT_EQ(lend_and_compare(0, 1), 1);
    open(2);
    host.has_no_status = true;
    EXPECT_EQ(lend_and_compare(0, 1), 1);
    constexpr int ram_disk = 0x01021994, network = 0x6969;
    const std::pair<fault_host, bool> kinds[] = {{{.block_devices = true}, false},
                                                 {{.file_system = network}, false},
                                                 {{.file_system = ram_disk, .holes = true}, false},
                                                 {{.file_system = ram_disk}, true},
                                                 {{.holes = true}, true}};
    for (const auto &[kind, lends] : kinds) {
        host = kind;
        for (int i = 0; i < 2; ++i) EXPECT_EQ(lend_and_compare(0, 1), lends ? 0 : 1);
        open(2);
    }
}

// Loans whose result is discarded when they fail begin without a look at the file.
TEST_F(Lending, AsksAgainWhatMayHaveChanged)
{
    open(0);
    const img_io_use_fn use = [](void *arg, const std::uint8_t *lent) {
        *static_cast<std::uint8_t *>(arg) = *lent;
    };
    std::uint8_t seen = 0;
    const auto lend_byte = [&](std::int32_t offset) {
        return img_platform_lend(m_fd, offset, 1, 1, use, &seen);
    };
    EXPECT_EQ(lend_byte(SIZE), -1);  // before anything is mapped
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(lend_byte(5), 0);
        EXPECT_EQ(seen, m_content[5]);
        m_content[5] ^= 1;
        restore();
    }
    cut(0);
    EXPECT_EQ(lend_byte(5), -1);
}

TEST_F(Lending, NoticesThatTheFileIsAnotherOne)
{
    open(2);
    EXPECT_EQ(lend_and_compare(0, 1), 0);
    EXPECT_EQ(lend(0, 1, [](const std::uint8_t *) { host.has_no_status = true; }), -1);
    host = {};
    EXPECT_EQ(lend_and_compare(0, 1), 0);
    write_file((m_folder / "other").c_str(), bytes(SIZE, 9));
    const int another = ::open((m_folder / "other").c_str(), O_RDWR);
    ASSERT_NE(::dup2(m_other, m_fd), -1);
    host.stamp = 1;
    EXPECT_EQ(lend(0, 1, [&](auto) { EXPECT_EQ(::ftruncate(m_other, 5), 0); }), -1);
    EXPECT_EQ(lend(0, 1, [&](auto) { ASSERT_NE(::dup2(another, m_fd), -1); }), -1);
    for (int i = 0; i < 2; ++i) EXPECT_EQ(lend_and_compare(0, 1), 1);  // no more of it is lent
    ::close(another);
}

// Bytes are lent only when a change meanwhile would get another stamp than the last one.
TEST_F(Lending, WaitsUntilChangesShow)
{
    constexpr long second = 1'000'000'000, start = 100 * second;
    const auto at = [&](long stamp, long now) {
        host.stamp = stamp;
        host.now = now;
        return lend_and_compare(0, SIZE);
    };
    open(0);
    EXPECT_EQ(at(start + 1, start + 9'000'000), 1);  // the clock may still say what it said then
    EXPECT_EQ(at(start + 1, start - second), 1);     // another clock
    EXPECT_EQ(at(start + 1, start + 21'000'000), 0);
    EXPECT_EQ(at(start + second, start + 2 * second), 1);  // a clock that counts seconds
    EXPECT_EQ(at(start + second, start + 4 * second), 0);
    EXPECT_EQ(at(start + 5 * second + 6'000'000, start + 5 * second), 1);
    EXPECT_EQ(at(start + 5 * second + 7'000'000, start + 5 * second), 1);
    EXPECT_EQ(at(start + 5 * second + 7'000'100, start + 5 * second), 0);  // one that never stands
}

TEST_F(Lending, SurvivesTruncation)
{
    sigset_t all, mask, bus_errors;
    ::sigfillset(&all);
    ::sigemptyset(&bus_errors);
    ::sigaddset(&bus_errors, SIGBUS);
    open(0);
    for (const bool blocked : {false, true}) {
        ::pthread_sigmask(blocked ? SIG_SETMASK : SIG_UNBLOCK, blocked ? &all : &bus_errors, &mask);
        for (const std::size_t length : {std::size_t{0}, std::size_t{299'990}}) {
            for (const bool mended : {false, true}) {
                host.stamp = 1;
                const auto use = [&](const std::uint8_t *lent) {
                    EXPECT_EQ(lent[5], m_content[105]);
                    cut(length);
                    EXPECT_EQ(lent[SIZE - 101], 0);
                    if (mended) restore();
                    host.stamp = 2;
                };
                EXPECT_EQ(lend(100, SIZE - 100, use), -1);
                restore();
            }
            host = {};
            EXPECT_EQ(lend_and_compare(0, SIZE), 0);
        }
        sigset_t after;
        ::pthread_sigmask(SIG_SETMASK, &mask, &after);
        EXPECT_EQ(::sigismember(&after, SIGBUS), blocked ? 1 : 0);
    }
}

// Another program cuts the file short and puts back what was there, all the time.
TEST_F(Lending, DeliversExactWindowsOrFailsWhileAFileIsTruncated)
{
    for (const std::int32_t tile : {0, 64}) {
        const test_geometry image{500, 500, 1, 1, tile, tile, tile != 0 ? IMG_LAYOUT_TILED : 0};
        img_handle handle = create_test_file(m_file, image);
        const bytes all = numbered(bytes(500 * 500), 0, 500 * 500);
        bytes window(100 * 100);
        ASSERT_EQ(dump(handle, {.nlines = 500, .nsamps = 500}, &all[0]), 0);
        m_content = read_file(m_file);
        const pid_t child = ::fork();
        if (child == 0) {
            ::prctl(PR_SET_PDEATHSIG, SIGKILL);
            for (std::size_t length = 0;; restore())
                cut(length = (length + 7919) % m_content.size());
        }
        const stderr_capture quiet;
        random_numbers random(1);
        host.seconds_later = 0;
        int lent = 0, read = 0;
        for (int i = rounds(300'000); i > 0; --i) {
            const std::int32_t line = random.within(0, 400), samp = random.within(0, 400);
            const std::int32_t size = random.within(1, 100);
            ordinary_reads = 0;
            if (load(handle, {0, line, samp, size, size, 100}, &window[0]) == -1) continue;
            const bool is_lent = ordinary_reads == 0;
            ++(is_lent ? lent : read);
            // The kernel may give an ordinary read zeros of the page in which the file ends.
            for (std::int32_t k = 0; k < size; ++k)
                ASSERT_TRUE(std::equal(&window[0] + k * 100, &window[0] + k * 100 + size,
                                       &all[0] + (line + k) * 500 + samp,
                                       [is_lent](std::uint8_t got, std::uint8_t stored) {
                                           return got == stored || (got == 0 && !is_lent);
                                       }));
        }
        EXPECT_GT(lent + read, 0);
        host = {};
        ::kill(child, SIGKILL);
        ::waitpid(child, nullptr, 0);
        restore();
        img_closefile(handle);
    }
}
