// The time of a window while the image, the window, the tiles, the bands or the number of open
// images grow. Read task.h first.
#include "task.h"

#include "base/count.h"
#include "imgfile/img.h"

#include <algorithm>
#include <benchmark/benchmark.h>
#include <random>
#include <stdexcept>

namespace {

struct subject {
    std::string what;
    std::int32_t nlines, nsamps, nbands, tile;  // of each image, which is sparse
    std::int32_t side, nimages;                 // of the window, in samples; open images
};

// A window of one of the images, whose size is that of the subject.
struct position {
    std::size_t image;
    std::int32_t line, samp, band;
};

// Aligned, so that names sort by their numbers.
std::string label(const char *what, std::int32_t number)
{
    const std::string digits = std::to_string(number);
    return std::string(what) + std::string(5 - digits.size(), ' ') + digits;
}

std::string make_image(const image_set &images, const subject &measured, std::int32_t number)
{
    std::string path = images.path("scaling" + std::to_string(number) + ".img");
    const img_handle image =
        img_createfile(path.c_str(), measured.nlines, measured.nsamps, measured.nbands,
                       IMG_TYPE_VITEC, measured.tile, measured.tile, 1);
    if (image == -1) throw std::runtime_error("cannot create " + path);
    img_closefile(image);
    return path;
}

// Only 64 positions, so that the round before the timed part touches all pages.
std::vector<position> positions_anywhere(const subject &measured)
{
    std::mt19937 random(7);
    const auto below = [&random](std::int32_t end) {
        return static_cast<std::int32_t>(random() % static_cast<std::uint32_t>(end));
    };
    std::vector<position> all(64);
    for (position &each : all)
        each = {.image = img_count(below(measured.nimages)),
                .line = below(measured.nlines - measured.side),
                .samp = below(measured.nsamps - measured.side),
                .band = below(measured.nbands)};
    return all;
}

void read_windows(benchmark::State &state, const image_set &images, const subject &measured)
{
    std::vector<std::string> paths(img_count(measured.nimages));
    for (std::int32_t i = 0; i < measured.nimages; ++i)
        paths[img_count(i)] = make_image(images, measured, i);
    let_files_rest();
    std::vector<img_handle> handles(paths.size());
    std::ranges::transform(paths, handles.begin(), [](const std::string &path) {
        return img_openfile(path.c_str(), IMG_OPEN_READ_ONLY);
    });
    constexpr std::size_t page = 4096;
    std::vector<std::uint8_t> room(img_count(measured.side) * img_count(measured.side) + page);
    auto *const buffer = room.data() + -reinterpret_cast<std::uintptr_t>(room.data()) % page;
    const std::vector<position> positions = positions_anywhere(measured);
    const auto read = [&](const position &start) {
        if (img_load_buffer(handles[start.image], start.line, start.samp, measured.side,
                            measured.side, start.band, buffer, measured.side, nullptr) != 0)
            throw std::runtime_error("a window cannot be read");
    };
    std::ranges::for_each(positions, read);
    std::size_t next = 0;
    for ([[maybe_unused]] auto _ : state) read(positions[next++ % positions.size()]);
    for (const img_handle handle : handles) img_closefile(handle);
    for (const std::string &path : paths) std::filesystem::remove(path);
}

}  // namespace

void register_scaling(const image_set &images, bool small)
{
    std::vector<subject> subjects;
    for (const std::int32_t megabytes : {1, 10, 100, 1000, 1900})
        for (const std::int32_t tile : {0, 256})
            subjects.push_back(
                {label("image MB", megabytes), megabytes * 1000, 1000, 1, tile, 256, 1});
    for (const std::int32_t size : {16, 64, 256, 1024, 4096})
        for (const std::int32_t tile : {0, 256})
            subjects.push_back({label("window", size), 8192, 8192, 1, tile, size, 1});
    for (const std::int32_t tile : {16, 64, 256, 1024})
        subjects.push_back({label("tile", tile), 8192, 8192, 1, tile, 256, 1});
    for (const std::int32_t nbands : {1, 2, 3})
        for (const std::int32_t tile : {0, 256})
            subjects.push_back({label("bands", nbands), 4096, 4096, nbands, tile, 256, 1});
    for (const std::int32_t nimages : {1, 10, 60})
        subjects.push_back({label("images", nimages), 4096, 4096, 1, 0, 256, nimages});
    if (small) subjects.resize(1);
    for (const subject &each : subjects)
        benchmark::RegisterBenchmark(
            (each.what + (each.tile != 0 ? ", tiled" : "")).c_str(),
            [images, each](benchmark::State &state) { read_windows(state, images, each); })
            ->Iterations(each.side > 1000 ? 100 : 2000)
            ->Repetitions(5)
            ->Unit(benchmark::kMicrosecond)
            ->UseRealTime();
}
