// Bytes that are read where they lie, what may become of them meanwhile, and the kernels that
// move and map them.
#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/scratch.h"
#include "chain/chain.h"
#include "chain/chain_lut.h"
#include "chain/ramp.h"
#include "imgfile/img.h"
#include "io/platform.h"
#include "std/std.h"
#include "std/std_bytes.h"
#include "std/std_lines.h"
#include "std/std_samples.h"
#include "support/effort.h"
#include "support/fault_memory.h"
#include "support/fault_system.h"
#include "support/file_test.h"
#include "support/random.h"
#include "support/stretch_model.h"

#include <atomic>
#include <chrono>
#include <functional>
#include <thread>

#include <fcntl.h>
#include <pthread.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

class Lending : public FileTest {
protected:
    Lending() { write_file(m_file, m_content); }
    ~Lending() override
    {
        ::close(m_other);
        host = {};
    }

    void open(std::int32_t oflags) { m_fd = img_platform_open(m_file.c_str(), oflags, 0600); }
    // Lends bytes to `use`. Returns the result; 1: refused without a use.
    std::int32_t lend(std::int32_t offset, std::int32_t count,
                      std::function<void(const std::uint8_t *)> use)
    {
        bool used = false;
        const std::function<void(const std::uint8_t *)> noted = [&](const std::uint8_t *lent) {
            used = true;
            use(lent);
        };
        const img_io_use_fn call = [](void *arg, const std::uint8_t *lent) {
            (*static_cast<const std::function<void(const std::uint8_t *)> *>(arg))(lent);
        };
        const std::int32_t result = img_platform_lend(
            m_fd, offset, count, call, const_cast<void *>(static_cast<const void *>(&noted)));
        return used ? result : result == -1 ? 1 : -2;
    }
    std::int32_t lend_and_compare(std::int32_t offset, std::int32_t count)
    {
        return lend(offset, count, [&](const std::uint8_t *lent) {
            EXPECT_TRUE(std::equal(lent, lent + count, &m_content[0] + offset));
        });
    }
    void cut(std::size_t length) const
    {
        ASSERT_EQ(::ftruncate(m_other, static_cast<off_t>(length)), 0);
    }
    void restore() const { ASSERT_NE(::pwrite(m_other, &m_content[0], m_content.size(), 0), -1); }

    static constexpr std::int32_t SIZE = 300'000;
    bytes m_content = numbered(bytes(SIZE), 0, SIZE);
    std::int32_t m_fd = -1;
    int m_other = ::open((m_folder / "scene").c_str(), O_RDWR | O_CREAT, 0600);
};

TEST_F(Lending, GivesWhatTheFileHasNow)
{
    for (const std::int32_t oflags : {0, 2}) {
        open(oflags);
        for (const auto &[offset, count] : {std::pair{0, 1}, {0, SIZE}, {4095, 2}, {SIZE - 1, 1}})
            EXPECT_EQ(lend_and_compare(offset, count), 0);
        for (const auto &[offset, count] : {std::pair{0, SIZE + 1},
                                            {SIZE, 1},
                                            {-1, 2},
                                            {0, 0},
                                            {5, -1},
                                            {INT32_MAX, INT32_MAX},
                                            {INT32_MIN, 1}})
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
    open(1);
    EXPECT_EQ(lend_and_compare(0, 1), 1);
    img_platform_close(m_fd);
    open(2);
    host.has_no_status = true;
    EXPECT_EQ(lend_and_compare(0, 1), 1);
    struct kind_of_file {
        fault_host host;
        std::int32_t result;
    };
    for (const auto &[kind, result] : {kind_of_file{{.block_devices = true}, 1},
                                       {{.file_system = 0x6969}, 1},
                                       {{.file_system = 0x01021994, .holes = true}, 1},
                                       {{.file_system = 0x01021994}, 0},
                                       {{.holes = true}, 0}}) {
        host = kind;
        EXPECT_EQ(lend_and_compare(0, 1), result);
        EXPECT_EQ(lend_and_compare(0, 1), result);
        img_platform_close(m_fd);
        open(2);
    }
    host = {};
    EXPECT_EQ(lend_and_compare(0, 1), 0);
    EXPECT_EQ(lend(0, 1, [](const std::uint8_t *) { host.has_no_status = true; }), -1);
    host = {};
    EXPECT_EQ(lend_and_compare(0, 1), 0);
    ASSERT_NE(::dup2(m_other, m_fd), -1);  // the file now is another one of the same content
    write_file((m_folder / "other").c_str(), bytes(SIZE, 9));
    const int another = ::open((m_folder / "other").c_str(), O_RDWR);
    ASSERT_NE(::dup2(another, m_fd), -1);
    EXPECT_EQ(lend(0, 1, [](const std::uint8_t *lent) { EXPECT_EQ(*lent, 9); }), 0);
    host.stamp = 1;
    EXPECT_EQ(lend(0, 1, [&](auto) { EXPECT_EQ(::ftruncate(another, 5), 0); }), -1);
    EXPECT_EQ(lend(0, 1, [&](auto) { ASSERT_NE(::dup2(m_other, m_fd), -1); }), -1);
    host = {};
    ::close(another);
    img_platform_close(m_fd);
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
    img_platform_close(m_fd);
    host = {};
}

TEST_F(Lending, EndsWellWhateverBecomesOfTheFile)
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
    img_platform_close(m_fd);
}

// --- Bus errors that are the host's ---

volatile std::uint8_t *hosts_page = nullptr;
std::atomic<int> hosts_errors = 0;

void mend_hosts_page()
{
    ++hosts_errors;
    ::mmap(const_cast<std::uint8_t *>(hosts_page), 4096, PROT_READ,
           MAP_PRIVATE | MAP_ANONYMOUS | MAP_FIXED, -1, 0);
}

class HostsBusErrors : public Lending {
protected:
    HostsBusErrors()
    {
        open(0);
        hosts_errors = 0;
        m_plain.sa_handler = [](int) { mend_hosts_page(); };
        m_informed.sa_flags = SA_SIGINFO;
        m_informed.sa_sigaction = [](int, siginfo_t *info, void *context) {
            EXPECT_TRUE(info->si_addr == hosts_page && context != nullptr);
            mend_hosts_page();
        };
    }
    ~HostsBusErrors() override
    {
        ::signal(SIGBUS, SIG_DFL);
        ::close(m_empty);
        img_platform_close(m_fd);
    }
    // Makes the page where reading raises a bus error, at `place` if that is free.
    bool map_page(const std::uint8_t *place = nullptr) const
    {
        const int flags = MAP_SHARED | (place != nullptr ? MAP_FIXED_NOREPLACE : 0);
        void *const page =
            ::mmap(const_cast<std::uint8_t *>(place), 4096, PROT_READ, flags, m_empty, 0);
        hosts_page = static_cast<std::uint8_t *>(page);
        return page != MAP_FAILED;
    }
    static void touch_page() { EXPECT_EQ(*hosts_page, 0); }
    static struct sigaction installed()
    {
        struct sigaction found;
        ::sigaction(SIGBUS, nullptr, &found);
        return found;
    }
    // How a process ends that meets a bus error while bytes are lent, be it `sent` or its own:
    // minus a signal's number, or what was answered.
    int end_of_child(void (*handler)(int), bool sent, unsigned flags = 0)
    {
        const pid_t child = ::fork();
        if (child == 0) {
            struct sigaction action = {};
            action.sa_handler = handler;
            action.sa_flags = static_cast<int>(flags);
            ::sigaction(SIGBUS, &action, nullptr);
            map_page();
            ::_exit(lend(0, SIZE, [=](auto) {
                if (sent)
                    ::raise(SIGBUS);
                else
                    touch_page();
            }));
        }
        int status = -1;
        ::waitpid(child, &status, 0);
        return WIFSIGNALED(status) ? -WTERMSIG(status) : WEXITSTATUS(status);
    }

    const int m_empty = ::open((m_folder / "empty").c_str(), O_RDWR | O_CREAT, 0600);
    struct sigaction m_plain = {}, m_informed = {};
};

TEST_F(HostsBusErrors, ReachItsHandler)
{
    struct sigaction once = m_plain;
    once.sa_flags = static_cast<int>(SA_RESETHAND);
    // A page of the host below the bytes that are lent, or above them; in this thread or another.
    for (const std::ptrdiff_t step : {-(1 << 20), 1 << 20})
        for (const bool elsewhere : {false, true})
            for (const auto *const action : {&m_plain, &m_informed, &once}) {
                ::sigaction(SIGBUS, action, nullptr);
                const std::int32_t result = lend(0, SIZE, [&](const std::uint8_t *lent) {
                    while (!map_page(lent += step)) continue;
                    if (elsewhere)
                        std::thread(touch_page).join();
                    else
                        touch_page();
                });
                EXPECT_EQ(result, 0);
                EXPECT_TRUE(installed().sa_handler ==
                            (action == &once ? SIG_DFL : action->sa_handler));
                ::munmap(const_cast<std::uint8_t *>(hosts_page), 4096);
            }
    EXPECT_EQ(hosts_errors, 12);

    // Another thread reads what is cut off.
    ::sigaction(SIGBUS, &m_plain, nullptr);
    EXPECT_EQ(lend(0, SIZE,
                   [&](const std::uint8_t *lent) {
                       hosts_page = const_cast<std::uint8_t *>(lent);
                       cut(0);
                       std::thread(touch_page).join();
                   }),
              -1);
    EXPECT_EQ(hosts_errors, 13);
    restore();
}

TEST_F(HostsBusErrors, ReachTheHandlerOfThatMoment)
{
    // Another thread has a handler of its own for a while, which ends at the wrong time.
    struct sigaction during;
    ::sigaction(SIGBUS, &m_plain, nullptr);
    EXPECT_EQ(lend(0, SIZE, [&](auto) { ::sigaction(SIGBUS, &m_informed, &during); }), 0);
    EXPECT_TRUE(installed().sa_sigaction == m_informed.sa_sigaction);
    ::sigaction(SIGBUS, &during, nullptr);
    ::raise(SIGBUS);
    EXPECT_EQ(hosts_errors, 1);
    EXPECT_EQ(lend(0, SIZE, [](auto) { ::raise(SIGBUS); }), 0);
    EXPECT_EQ(hosts_errors, 2);
    EXPECT_TRUE(installed().sa_handler == m_plain.sa_handler);

    // They come before the library knows whose they are.
    struct sigaction fresh = {};
    fresh.sa_handler = [](int) {
        mend_hosts_page();
        hosts_errors += 100;
    };
    ::sigaction(SIGBUS, &fresh, nullptr);
    std::thread other;
    host.after_sigaction = [&] {
        map_page();
        other = std::thread(touch_page);
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    };
    EXPECT_EQ(lend(0, SIZE, [](auto) {}), 0);
    other.join();
    EXPECT_EQ(hosts_errors, 103);
    ::sigaction(SIGBUS, &m_plain, nullptr);
    host.after_sigaction = [] { ::raise(SIGBUS); };
    EXPECT_EQ(lend(0, SIZE, [](auto) {}), 0);
    EXPECT_EQ(hosts_errors, 104);
}

TEST_F(HostsBusErrors, EndTheProcessThatHandlesNone)
{
    EXPECT_EQ(end_of_child(SIG_DFL, true), -SIGBUS);
    EXPECT_EQ(end_of_child(SIG_IGN, true), 0);
    EXPECT_EQ(end_of_child(SIG_DFL, false), -SIGBUS);
    EXPECT_EQ(end_of_child(SIG_IGN, false), -SIGBUS);
    EXPECT_EQ(end_of_child([](int) {}, false, SA_RESETHAND), -SIGBUS);  // after the first
    ::signal(SIGBUS, SIG_IGN);
    EXPECT_EQ(lend(0, SIZE, [](auto) { ::raise(SIGBUS); }), 0);
}

// Valgrind itself ends there.
TEST_F(HostsBusErrors, StayPendingWhereTheyAreBlocked)
{
    sigset_t bus_errors;
    ::sigemptyset(&bus_errors);
    ::sigaddset(&bus_errors, SIGBUS);
    ::pthread_sigmask(SIG_BLOCK, &bus_errors, nullptr);
    ::raise(SIGBUS);
    EXPECT_EQ(lend(0, SIZE, [](auto) {}), 0);
    constexpr std::timespec now{};
    EXPECT_EQ(::sigtimedwait(&bus_errors, nullptr, &now), SIGBUS);
    EXPECT_EQ(::sigtimedwait(&bus_errors, nullptr, &now), -1);
    ::pthread_sigmask(SIG_UNBLOCK, &bus_errors, nullptr);
}

// Another program cuts the file short and puts back what was there, all the time.
TEST_F(Lending, WindowsAreExactOrFailWhileAFileIsCutAndMended)
{
    for (const std::int32_t tile : {0, 64}) {
        const test_geometry image{
            500, 500, 1, 1, tile, tile, tile == 0 ? IMG_LAYOUT_BSQ : IMG_LAYOUT_TILED};
        img_handle handle = create_test_file(m_file, image);
        bytes all(500 * 500), window(100 * 100);
        for (std::size_t i = 0; i < all.size(); ++i)
            all[i] = static_cast<std::uint8_t>(i % 251 + 1);
        ASSERT_EQ(img_dump_buffer(handle, 0, 0, 500, 500, 0, &all[0], 500, nullptr), 0);
        m_content = read_file(m_file);
        const pid_t child = ::fork();
        if (child == 0) ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        std::size_t length = 0;
        while (child == 0) {
            length = (length + 7919) % m_content.size();
            cut(length);
            restore();
        }
        const stderr_capture quiet;
        random_numbers random(1);
        host.seconds_later = 0;
        int exact = 0, foreign = 0;
        for (int i = rounds(300'000); i > 0; --i) {
            const std::int32_t line = random.within(0, 400), samp = random.within(0, 400);
            const std::int32_t size = random.within(1, 100);
            if (img_load_buffer(handle, line, samp, size, size, 0, &window[0], 100, nullptr) == -1)
                continue;
            ++exact;
            for (std::int32_t k = 0; k < size; ++k)
                foreign += std::equal(&window[0] + k * 100, &window[0] + k * 100 + size,
                                      &all[0] + (line + k) * 500 + samp)
                               ? 0
                               : 1;
        }
        EXPECT_GT(exact, 0);
        EXPECT_EQ(foreign, 0);
        host = {};
        ::kill(child, SIGKILL);
        ::waitpid(child, nullptr, 0);
        restore();
        img_closefile(handle);
    }
}

// Many lines in one call end on a full disk as one by one they do.
TEST_F(Lending, JoinedLinesFailAsSingleLinesDo)
{
    for (const std::int32_t swap : {0, 1})
        for (const std::int32_t stride : {6, 8})
            for (host.disk_size = 36; host.disk_size < 36 + 70; host.disk_size += 5) {
                outcome seen[2];
                bytes file[2];
                for (const bool joined : {false, true}) {
                    const img_handle image = create_test_file(
                        joined ? m_file : m_name, {5, 6, 1, 2, 0, 0, IMG_LAYOUT_BSQ, swap});
                    EXPECT_EQ(img_std_write_nontiled(img_find_image(image), 0, 0, -5, 6, 0,
                                                     &m_content[0], 6, nullptr),
                              0);
                    seen[joined] = outcome_of([&] {
                        return img_dump_buffer(image, 0, 0, 5, 6, 0, &m_content[0], stride,
                                               nullptr);
                    });
                    file[joined] = read_file(m_file);
                    EXPECT_EQ(img_find_image(image)->std_file->veof, std::ssize(file[joined]));
                    img_closefile(image);
                }
                EXPECT_EQ(seen[true], seen[false]);
                EXPECT_EQ(file[true], file[false]);
            }
    host = {};
}

// Where only some lines of stored tiles would have to be written and a write fails, all is as if
// whole tiles had been written from the start.
TEST_F(Lending, TouchedLinesFailAsWholeTilesDo)
{
    for (int limit = 36; limit <= 36 + 2 * 16384; limit += 1024) {
        outcome seen[2];
        bytes file[2];
        for (const bool touched : {false, true}) {
            const img_handle image = create_test_file(
                touched ? m_file : m_name, {256, 256, 1, 1, 128, 128, IMG_LAYOUT_TILED, 0});
            const std::int32_t ntiles = limit == 36 ? 0 : 4;  // that are there already
            EXPECT_EQ(img_dump_tiles(image, 0, ntiles, 0, &m_content[7]), 0);
            host.disk_size = limit;
            seen[touched] = outcome_of([&] {
                return img_dump_buffer(image, 70, 4, 58, 190, 0, &m_content[0], 190, nullptr);
            });
            host = {};
            img_closefile(image);
            file[touched] = read_file(m_file);
        }
        EXPECT_EQ(seen[true], seen[false]);
        EXPECT_EQ(file[true], file[false]);
    }
}

// However much of the tiles is there, and whether that is lent or not.
TEST_F(Lending, TouchedLinesLeaveTheOthersAsWholeTilesDo)
{
    constexpr std::size_t run = 2 * 128 * 128;
    for (int i = 0; i < 10; ++i) {
        bytes file[2];
        for (const bool touched : {false, true}) {
            const img_handle image = create_test_file(
                touched ? m_file : m_name, {256, 256, 1, 1, 128, 128, IMG_LAYOUT_TILED, 0});
            const std::int32_t tiles_there = i / 2;
            EXPECT_EQ(img_dump_tiles(image, 0, tiles_there, 0, &m_content[7]), 0);
            host.seconds_later = i % 2;  // 0: what was written this moment is not lent
            std::fill_n(img_take_scratch(run).get(), run, std::uint8_t{0xEE});
            EXPECT_EQ(img_dump_buffer(image, 70, 4, 58, 190, 0, &m_content[0], 190, nullptr), 0);
            host = {};
            img_closefile(image);
            file[touched] = read_file(m_file);
        }
        EXPECT_EQ(file[true], file[false]);
    }
}

// A window that has all of a tile does not make up for the right to read it.
TEST_F(Lending, WritingAloneDoesNotReplaceTiles)
{
    outcome seen[2];
    for (const bool lends : {false, true}) {
        const img_handle image =
            create_test_file(lends ? m_file : m_name, {8, 8, 1, 1, 8, 8, IMG_LAYOUT_TILED, 0});
        img_find_image(image)->oflags ^= IMG_OPEN_READ_WRITE ^ IMG_OPEN_WRITE_ONLY;
        seen[lends] = outcome_of(
            [&] { return img_dump_buffer(image, 0, 0, 8, 8, 0, &m_content[0], 8, nullptr); });
        img_closefile(image);
    }
    EXPECT_EQ(seen[true], seen[false]);
    EXPECT_EQ(seen[true].result, -1);
}

TEST(Scratch, KeepsALittleOfWhatWasTaken)
{
    constexpr std::size_t page = IMG_SCRATCH_ALIGNMENT, limit = IMG_SCRATCH_LIMIT;
    const auto fresh_bytes = [](std::initializer_list<std::size_t> sizes) {
        memory_arm(0);
        std::vector<img_scratch> taken;
        for (const std::size_t size : sizes) {
            taken.push_back(img_take_scratch(size));
            EXPECT_EQ(reinterpret_cast<std::uintptr_t>(taken.back().get()) % page, 0U);
            std::fill_n(taken.back().get(), size, std::uint8_t{1});
        }
        return memory_requested();
    };
    img_free_scratch();
    EXPECT_EQ(fresh_bytes({1, page + 1, limit / 2}), 3 * page + limit / 2);
    EXPECT_EQ(fresh_bytes({page, 2 * page - 1, limit / 2}), 0U);
    EXPECT_EQ(fresh_bytes({limit + 1}), limit + 1);  // which is not kept
    EXPECT_EQ(fresh_bytes({limit / 2}), 0U);
    EXPECT_EQ(fresh_bytes({limit}), limit);  // which leaves no room for the others
    EXPECT_EQ(fresh_bytes({1}), page);
    for (int i = 0; i < 2; ++i)
        EXPECT_EQ(fresh_bytes({1, 1, 1, 1, 1, 1, 1, 1, 1}), (i == 0 ? 8 : 1) * page);
    EXPECT_EQ(img_take_scratch(SIZE_MAX), nullptr);
    img_mgr_cleanup();
    EXPECT_EQ(fresh_bytes({1}), page);
}

TEST(Kernels, CopyRowsAsSampleAfterSampleDoes)
{
    random_numbers random(1);
    const bytes from = numbered(bytes(40'000), 0, 40'000);
    for (int i = rounds(20'000); i > 0; --i) {
        const auto below = [&](std::uint32_t count) { return std::size_t{random.below(count)}; };
        const std::size_t width = 1 + below(2), first = below(5);
        const std::size_t step = width * (1 + below(3)), nsamps = below(i % 9 == 0 ? 300 : 40);
        const std::size_t pitch = step * (nsamps + below(2) * 7),
                          to_pitch = width * (nsamps + below(2));
        const std::size_t nrows = below(18);
        const bool exchange = width == 2 && below(2) == 0;
        bytes to(to_pitch * nrows + nsamps * width + 1, 0xEE), expected = to;
        for (std::size_t row = 0; row < nrows; ++row)
            for (std::size_t samp = 0; samp < nsamps; ++samp)
                for (std::size_t k = 0; k < width; ++k)
                    expected[row * to_pitch + samp * width + k] =
                        from[first + row * pitch + samp * step + (exchange ? 1 - k : k)];
        img_std_copy_rows({&from[first], pitch, step}, &to[0], to_pitch, nrows, nsamps,
                          static_cast<std::int32_t>(width), exchange);
        ASSERT_EQ(to, expected);
    }
}

TEST(Kernels, MapAlongARampAsTheTableDoes)
{
    random_numbers random(1);
    samples given(70'000);
    for (std::size_t i = 0; i < given.size(); ++i) given[i] = static_cast<std::uint16_t>(i);
    const img_buffer_def from{7, 10'000, 0, 0, 10'000, 2, 12, 0},
        to{7, 10'000, 0, 0, 10'000, 1, 8, 0};
    int ramps = 0, tables = 0;
    for (; tables < 40 + rounds(1000); ++tables) {
        const std::int32_t bits = tables % 4 == 0 ? random.within(1, 13) : 12, size = 1 << bits;
        counters histogram(static_cast<std::size_t>(size));
        for (int k = random.within(0, 3); k > 0; --k)
            histogram[random.below(static_cast<std::uint32_t>(size))] += random.below(1000);
        samples table = expected_stretch(histogram, bits, 8);
        if (tables % 7 == 0)
            std::ranges::fill(table,
                              samples{0, 1, 255, 256, 300}[static_cast<std::size_t>(tables % 5)]);
        if (tables % 5 == 0) table[random.below(static_cast<std::uint32_t>(size))] ^= 1;
        img_chain_ramp ramp;
        ramps += img_chain_find_ramp(table.data(), size, &ramp) ? 1 : 0;
        img_chain_lut record{static_cast<std::uint8_t>(bits), 8, size, table.data(), 0};
        bytes mapped(given.size());
        img_buffer_def narrow = from;
        narrow.nbits = bits;
        ASSERT_EQ(img_chain_lut_remap(&record, reinterpret_cast<const std::uint8_t *>(&given[0]),
                                      &narrow, &mapped[0], &to, 0, nullptr),
                  0);
        for (std::size_t i = 0; i < given.size(); ++i)
            ASSERT_EQ(mapped[i], table[std::min<std::size_t>(given[i], table.size() - 1)] % 256);
    }
    EXPECT_GT(ramps, tables / 4);
    EXPECT_LT(ramps, tables);
}

}  // namespace
