// Threads beside processes: how many windows are read per second on all processors. Each process
// has an image of its own, and no lock is between two of them: they are the limit. Read task.h
// first.
#include "task.h"

#include "base/count.h"
#include "imgfile/img.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <stdexcept>
#include <thread>

#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

constexpr std::size_t MOST_WORKERS = 64;

// Shared by the workers of one measurement, be they threads or processes.
struct race {
    std::atomic<std::size_t> ready = 0;
    std::atomic<bool> begun = false, over = false;
    std::array<std::atomic<std::int64_t>, MOST_WORKERS> windows = {};
};

struct subject {
    const task &measured;
    std::vector<std::string> files;  // equal images, one for each processor
    std::chrono::milliseconds duration;
};

void fail_unless(bool condition, const char *problem)
{
    if (!condition) throw std::runtime_error(problem);
}

// Reads the task's windows over and over, from a place of its own on.
void work(const subject &read, img_handle image, std::size_t worker, race &shared)
{
    const std::vector<request> &windows = read.measured.requests;
    std::vector<std::uint8_t> buffer(read.measured.buffer_size);
    const auto load = [&](std::size_t number) {
        const request &window = windows[number % windows.size()];
        fail_unless(img_load_buffer(image, window.line, window.samp, window.nlines, window.nsamps,
                                    0, buffer.data(), window.nsamps, nullptr) == 0,
                    "a window cannot be read");
    };
    std::size_t number = worker * windows.size() / MOST_WORKERS;
    for (std::size_t i = 0; i < windows.size(); ++i) load(i);
    ++shared.ready;
    while (!shared.begun) std::this_thread::yield();
    std::int64_t done = 0;
    for (; !shared.over; ++done) load(number++);
    shared.windows[worker] = done;
}

// Lets `count` workers run for a while. Returns their windows per second.
template <typename Start, typename Finish>
double windows_per_second(const subject &read, std::size_t count, race &shared, Start start,
                          Finish finish)
{
    for (std::size_t worker = 0; worker < count; ++worker) start(worker);
    while (shared.ready < count) std::this_thread::yield();
    const auto begin = std::chrono::steady_clock::now();
    shared.begun = true;
    std::this_thread::sleep_for(read.duration);
    shared.over = true;
    const std::chrono::duration<double> time = std::chrono::steady_clock::now() - begin;
    finish();
    std::int64_t windows = 0;
    for (const auto &each : shared.windows) windows += each;
    return static_cast<double>(windows) / time.count();
}

img_handle opened(const std::string &file)
{
    const img_handle image = img_openfile(file.c_str(), IMG_OPEN_READ_ONLY);
    fail_unless(image != -1, "an image cannot be opened");
    return image;
}

double by_processes(const subject &read)
{
    void *const memory =
        ::mmap(nullptr, sizeof(race), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    fail_unless(memory != MAP_FAILED, "no memory to share");
    auto *const shared = new (memory) race;
    const auto start = [&](std::size_t worker) {
        const pid_t child = ::fork();
        fail_unless(child != -1, "a process cannot be started");
        if (child != 0) return;
        work(read, opened(read.files[worker]), worker, *shared);
        ::_exit(0);
    };
    const auto finish = [] {
        for (int status = 0; ::wait(&status) != -1;)
            fail_unless(status == 0, "a process has failed");
    };
    const double result = windows_per_second(read, read.files.size(), *shared, start, finish);
    ::munmap(memory, sizeof(race));
    return result;
}

// Each thread reads the image of its number; the later ones begin with the first again.
double by_threads(const subject &read, std::size_t count, std::size_t nimages)
{
    std::vector<img_handle> images;
    for (std::size_t i = 0; i < nimages; ++i) images.push_back(opened(read.files[i]));
    race shared;
    std::vector<std::thread> threads;
    const auto start = [&](std::size_t worker) {
        threads.emplace_back([&, worker] { work(read, images[worker % nimages], worker, shared); });
    };
    const auto finish = [&] {
        for (std::thread &each : threads) each.join();
    };
    const double result = windows_per_second(read, count, shared, start, finish);
    for (const img_handle image : images) img_closefile(image);
    return result;
}

double median(std::vector<double> values)
{
    std::ranges::sort(values);
    return values[values.size() / 2];
}

}  // namespace

void measure_threads(const image_set &images, const std::vector<task> &tasks, bool small)
{
    const std::size_t processors =
        std::clamp<std::size_t>(std::thread::hardware_concurrency(), 2, MOST_WORKERS / 8);
    const int rounds = small ? 1 : 7;
    std::printf("Windows per second on %zu processors, as a share of those of %zu processes:\n",
                processors, processors);
    std::printf("%-5s%14s%16s%16s%16s\n", "", "processes", "own images", "one image",
                "8, one image");
    for (const auto &[name, file] : {std::pair{"T1", "lines8.img"},
                                     {"T2", "lines8.img"},
                                     {"T4", "tiles8.img"},
                                     {"T5", "tiles8.img"},
                                     {"T6", "tiles16.img"},
                                     {"T7", "lines16.img"}}) {
        const auto found = std::ranges::find(tasks, name, &task::name);
        if (found == tasks.end()) continue;
        subject read{*found, {images.path(file)}, std::chrono::milliseconds(small ? 10 : 400)};
        while (read.files.size() < processors) {
            read.files.push_back(images.path("copy" + std::to_string(read.files.size())));
            std::filesystem::copy_file(read.files[0], read.files.back());
        }
        let_files_rest();
        std::vector<double> limit, own, one, eight;
        for (int round = 0; round < rounds; ++round) {
            limit.push_back(by_processes(read));
            own.push_back(by_threads(read, processors, processors) / limit.back());
            one.push_back(by_threads(read, processors, 1) / limit.back());
            eight.push_back(by_threads(read, 8, 1) / limit.back());
        }
        std::printf("%-5s%14.0f%16.2f%16.2f%16.2f\n", name, median(limit), median(own), median(one),
                    median(eight));
        for (std::size_t i = 1; i < processors; ++i) std::filesystem::remove(read.files[i]);
    }
}
