// Tests of bus_error_guard_posix.cpp: whose the bus errors are that occur while bytes are lent.
#include "support/lending.h"

#include <atomic>
#include <chrono>
#include <thread>

#include <pthread.h>
#include <sys/mman.h>
#include <sys/wait.h>

namespace {

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
        hosts_errors = 0;
        m_plain.sa_handler = [](int) { mend_hosts_page(); };
        m_informed.sa_flags = SA_SIGINFO | SA_NODEFER;
        m_informed.sa_sigaction = [](int, siginfo_t *info, void *context) {
            EXPECT_TRUE(info->si_addr == hosts_page && context != nullptr);
            mend_hosts_page();
        };
    }
    ~HostsBusErrors() override
    {
        ::signal(SIGBUS, SIG_DFL);
        ::close(m_empty);
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
    static void raise_error(const std::uint8_t *) { ::raise(SIGBUS); }
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
            open(0);
            map_page();
            ::_exit(lend(0, SIZE, [=](auto *lent) { sent ? raise_error(lent) : touch_page(); }));
        }
        int status = -1;
        ::waitpid(child, &status, 0);
        return WIFSIGNALED(status) ? -WTERMSIG(status) : WEXITSTATUS(status);
    }

    const int m_empty = ::open((m_folder / "empty").c_str(), O_RDWR | O_CREAT, 0600);
    struct sigaction m_plain = {}, m_informed = {};
};

TEST_F(HostsBusErrors, ReachTheirHandler)
{
    struct sigaction once = m_plain;
    once.sa_flags = static_cast<int>(SA_RESETHAND);
    // A page of the host below the bytes that are lent, or above them; in this thread or another.
    for (const std::ptrdiff_t step : {-(1 << 20), 1 << 20})
        for (const bool elsewhere : {false, true})
            for (const auto *const action : {&m_plain, &m_informed, &once}) {
                ::sigaction(SIGBUS, action, nullptr);
                open(0);
                const auto use = [&](const std::uint8_t *lent) {
                    while (!map_page(lent += step)) continue;
                    elsewhere ? std::thread(touch_page).join() : touch_page();
                };
                EXPECT_EQ(lend(0, SIZE, use), 0);
                img_platform_close(m_fd);
                EXPECT_TRUE(installed().sa_handler ==
                            (action == &once ? SIG_DFL : action->sa_handler));
                ::munmap(const_cast<std::uint8_t *>(hosts_page), 4096);
            }
    EXPECT_EQ(hosts_errors, 12);
}

// Handlers of the host that are installed later, in front of the library's, and that call the one
// which they have replaced.
std::array<struct sigaction, 2> replaced;
std::array<int, 2> passed;

template <std::size_t handler>
void pass_on(int signal, siginfo_t *info, void *context)
{
    ++passed[handler];
    const struct sigaction &next = replaced[handler];
    if ((next.sa_flags & SA_SIGINFO) != 0)
        next.sa_sigaction(signal, info, context);
    else
        next.sa_handler(signal);
}

TEST_F(HostsBusErrors, ReachAllHandlersOnce)
{
    struct sigaction added = {};
    added.sa_flags = SA_SIGINFO;
    ::sigaction(SIGBUS, &m_plain, nullptr);
    open(0);
    EXPECT_EQ(lend(0, SIZE, [](auto) {}), 0);
    added.sa_sigaction = pass_on<0>;
    ::sigaction(SIGBUS, &added, &replaced[0]);
    EXPECT_EQ(lend(0, SIZE, raise_error), 0);
    added.sa_sigaction = pass_on<1>;
    ::sigaction(SIGBUS, &added, &replaced[1]);
    ::raise(SIGBUS);  // the library has not seen it yet
    EXPECT_EQ(lend(0, SIZE, raise_error), 0);
    EXPECT_EQ(hosts_errors, 3);
    EXPECT_EQ(passed, (std::array{3, 2}));
}

template <int>
void ignore(int)
{
}

TEST_F(HostsBusErrors, AreLeftAloneByTheLibraryAfterManyHandlers)
{
    open(0);
    int loans = 0;
    for (const auto handler : {ignore<0>, ignore<1>, ignore<2>, ignore<3>, ignore<4>, ignore<5>,
                               ignore<6>, ignore<7>, ignore<8>}) {
        ::signal(SIGBUS, handler);
        loans += lend(0, SIZE, [](auto) {}) == 0 ? 1 : 0;
    }
    EXPECT_EQ(loans, 8);
    EXPECT_EQ(installed().sa_handler, ignore<8>);
}

TEST_F(HostsBusErrors, ReachTheHandlerThatIsInstalledThen)
{
    open(0);
    // Another thread has a handler of its own for a while, which ends at the wrong time.
    struct sigaction during;
    ::sigaction(SIGBUS, &m_plain, nullptr);
    EXPECT_EQ(lend(0, SIZE, [&](auto) { ::sigaction(SIGBUS, &m_informed, &during); }), 0);
    EXPECT_TRUE(installed().sa_sigaction == m_informed.sa_sigaction);
    ::sigaction(SIGBUS, &during, nullptr);
    ::raise(SIGBUS);
    EXPECT_EQ(hosts_errors, 1);
    EXPECT_EQ(lend(0, SIZE, raise_error), 0);
    EXPECT_EQ(hosts_errors, 2);

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
        other = std::thread([] {
            sigset_t none;  // the library blocks them in this thread meanwhile
            ::sigemptyset(&none);
            ::pthread_sigmask(SIG_SETMASK, &none, nullptr);
            touch_page();
        });
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

TEST_F(HostsBusErrors, MayComeAtAnyTime)
{
    ::sigaction(SIGBUS, &m_plain, nullptr);
    open(0);
    EXPECT_EQ(lend(0, SIZE, [](auto) {}), 0);
    const pid_t reader = ::getpid(), child = ::fork();
    if (child == 0) {
        for (int i = 0; i < 3000; ++i) ::kill(reader, SIGBUS);
        ::_exit(0);
    }
    while (::waitpid(child, nullptr, WNOHANG) == 0) EXPECT_EQ(lend(0, SIZE, [](auto) {}), 0);
    EXPECT_GT(hosts_errors, 0);
}

TEST_F(HostsBusErrors, EndTheProcessThatHasNoHandler)
{
    EXPECT_EQ(end_of_child(SIG_DFL, true), -SIGBUS);
    EXPECT_EQ(end_of_child(SIG_IGN, true), 0);
    EXPECT_EQ(end_of_child(SIG_DFL, false), -SIGBUS);
    EXPECT_EQ(end_of_child(SIG_IGN, false), -SIGBUS);
    EXPECT_EQ(end_of_child([](int) {}, false, SA_RESETHAND), -SIGBUS);  // after the first
}

// Valgrind itself ends there.
TEST_F(HostsBusErrors, StayPendingWhereTheyAreBlocked)
{
    sigset_t bus_errors;
    ::sigemptyset(&bus_errors);
    ::sigaddset(&bus_errors, SIGBUS);
    ::pthread_sigmask(SIG_BLOCK, &bus_errors, nullptr);
    ::raise(SIGBUS);
    open(0);
    EXPECT_EQ(lend(0, SIZE, [](auto) {}), 0);
    constexpr std::timespec now{};
    EXPECT_EQ(::sigtimedwait(&bus_errors, nullptr, &now), SIGBUS);
    EXPECT_EQ(::sigtimedwait(&bus_errors, nullptr, &now), -1);
    ::pthread_sigmask(SIG_UNBLOCK, &bus_errors, nullptr);
}

}  // namespace
