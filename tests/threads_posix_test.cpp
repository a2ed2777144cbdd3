// Tests of threads_posix.cpp: threads that end and the unloaded library leave nothing behind.
#include "base/threads.h"

#include "imgfile/img.h"
#include "support/file_test.h"

#include <atomic>
#include <csignal>
#include <fstream>
#include <thread>

#include <dlfcn.h>
#include <malloc.h>
#include <sys/wait.h>

namespace {

class Threads : public FileTest {};
class UnloadedLibrary : public FileTest {};

// Working memory that threads kept is freed with them.
TEST_F(Threads, LeaveNoMemory)
{
    img_closefile(
        creating(m_file, IMG_TYPE_VITEC, {.nlines = 700, .nsamps = 700, .nbytes = 2}).result);
    const img_handle image = opening(m_file).result;
    const auto read_in_a_thread = [&] {
        std::thread([&] {
            bytes samples(700 * 700);
            EXPECT_EQ(load(image, {.nlines = 700, .nsamps = 700}, samples.data()), 0);
        }).join();
    };
    for (int i = 0; i < 3; ++i) read_in_a_thread();
    const auto memory = ::mallinfo2();  // always 0 where a sanitizer looks for leaks
    for (int i = 0; i < 30; ++i) read_in_a_thread();
    EXPECT_LE(::mallinfo2().uordblks + ::mallinfo2().hblkhd,
              memory.uordblks + memory.hblkhd + 20'000);
    img_closefile(image);
}

TEST_F(Threads, AreCancelledAfterTheCall)
{
    img_closefile(creating(m_file, IMG_TYPE_VITEC, {.nlines = 50, .nsamps = 50}).result);
    const img_handle image = opening(m_file).result;
    for (int i = 0; i < 20; ++i) {
        std::atomic<bool> reads = false;
        std::thread reader([&] {
            bytes samples(2500);
            for (;; reads = true) {
                load(image, {.nlines = 50, .nsamps = 50}, samples.data());
                ::pthread_testcancel();
            }
        });
        while (!reads) {}
        ::pthread_cancel(reader.native_handle());
        reader.join();
    }
    EXPECT_EQ(img_closefile(image), 0);  // nobody holds its lock
}

// A library that was used by threads, one of which lives on, is unloaded without a trace: threads
// end, processes fork and bus errors reach the host afterwards.
TEST_F(UnloadedLibrary, LeavesNothing)
{
    img_closefile(creating(m_file, IMG_TYPE_VITEC, {.nlines = 300, .nsamps = 700}).result);
    struct sigaction before, after;
    ::sigaction(SIGBUS, nullptr, &before);
    void *const library = ::dlopen(IMGFILE_LIBRARY, RTLD_NOW | RTLD_LOCAL);
    ASSERT_NE(library, nullptr) << ::dlerror();
    const auto open = reinterpret_cast<decltype(&img_openfile)>(::dlsym(library, "img_openfile"));
    const auto read =
        reinterpret_cast<decltype(&img_load_buffer)>(::dlsym(library, "img_load_buffer"));
    const auto close =
        reinterpret_cast<decltype(&img_closefile)>(::dlsym(library, "img_closefile"));
    std::atomic<int> step = 0;
    const auto use = [&] {
        const img_handle image = open(m_file.c_str(), IMG_OPEN_READ_ONLY);
        bytes samples(300 * 700);
        EXPECT_EQ(read(image, 0, 0, 300, 700, 0, samples.data(), 700, nullptr), 0);
        EXPECT_EQ(read(image, 0, 0, 30, 70, 0, samples.data(), 700, nullptr), 0);
        close(image);
    };
    std::thread outlives([&] {
        use();
        step = 1;
        step.notify_all();
        step.wait(1);
    });
    step.wait(0);
    use();
    ::dlclose(library);
    std::ifstream list("/proc/self/maps");
    const std::string maps(std::istreambuf_iterator<char>(list), {});
    EXPECT_EQ(maps.find("libimgfile.so"), maps.npos);
    ::sigaction(SIGBUS, nullptr, &after);
    EXPECT_EQ(after.sa_handler, before.sa_handler);
    if (const pid_t child = ::fork(); child == 0) {
        ::_exit(0);
    } else {
        int status = -1;
        ::waitpid(child, &status, 0);
        EXPECT_EQ(status, 0);
    }
    step = 2;
    step.notify_all();
    outlives.join();
}

}  // namespace
