// What a window costs while the image around it, the window itself, its tiles, the bands and the
// images that are open become more.
#include "task.h"

#include "img.h"

#include <algorithm>
#include <benchmark/benchmark.h>
#include <random>
#include <stdexcept>

namespace {

struct subject {
    std::string what;
    std::int32_t nlines, nsamps, nbands, tile;  // of the image, which is sparse
    std::int32_t window, images;
};

// In columns, so that names sort as their numbers do.
std::string label(const char *what, std::int32_t number)
{
    const std::string digits = std::to_string(number);
    return std::string(what) + std::string(5 - digits.size(), ' ') + digits;
}

std::string make_image(const scene &at, const subject &of, std::int32_t number)
{
    const std::string path = at.path("scaling" + std::to_string(number) + ".img");
    const img_handle image = img_createfile(path.c_str(), of.nlines, of.nsamps, of.nbands,
                                            IMG_TYPE_VITEC, of.tile, of.tile, 1);
    if (image == -1) throw std::runtime_error("cannot create " + path);
    img_closefile(image);
    return path;
}

// The time of one window, at places all over the images.
void read_windows(benchmark::State &state, const scene &at, const subject &of)
{
    std::vector<std::string> paths;
    for (std::int32_t i = 0; i < of.images; ++i) paths.push_back(make_image(at, of, i));
    let_files_rest();
    std::vector<img_handle> images;
    for (const std::string &path : paths)
        images.push_back(img_openfile(path.c_str(), IMG_OPEN_READ_ONLY));
    const auto size = static_cast<std::size_t>(of.window) * static_cast<std::size_t>(of.window);
    std::vector<std::uint8_t> room(size + 4096);
    auto *const buffer = room.data() + -reinterpret_cast<std::uintptr_t>(room.data()) % 4096;
    std::mt19937 random(7);
    // So few places that pages which hold nothing are asked for once, before the timed part.
    std::vector<window> places(64);
    for (window &place : places)
        place = {
            static_cast<std::int32_t>(random() % static_cast<std::uint32_t>(of.nlines - of.window)),
            static_cast<std::int32_t>(random() % static_cast<std::uint32_t>(of.nsamps - of.window)),
            static_cast<std::int32_t>(random() % static_cast<std::uint32_t>(of.images)),
            static_cast<std::int32_t>(random() % static_cast<std::uint32_t>(of.nbands))};
    const auto read = [&](const window &place) {
        if (img_load_buffer(images[static_cast<std::size_t>(place.nlines)], place.line, place.samp,
                            of.window, of.window, place.nsamps, buffer, of.window, nullptr) != 0)
            throw std::runtime_error("a window cannot be read");
    };
    std::ranges::for_each(places, read);
    std::size_t next = 0;
    for ([[maybe_unused]] auto _ : state) read(places[next++ % places.size()]);
    for (std::size_t i = 0; i < images.size(); ++i) {
        img_closefile(images[i]);
        std::filesystem::remove(paths[i]);
    }
}

}  // namespace

void register_scaling(const scene &at, bool small)
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
    for (const std::int32_t images : {1, 10, 60})
        subjects.push_back({label("images", images), 4096, 4096, 1, 0, 256, images});
    if (small) subjects.resize(1);
    for (const subject &each : subjects)
        benchmark::RegisterBenchmark(
            (each.what + (each.tile != 0 ? ", tiled" : "")).c_str(),
            [at, each](benchmark::State &state) { read_windows(state, at, each); })
            ->Iterations(each.window > 1000 ? 100 : 2000)
            ->Repetitions(5)
            ->Unit(benchmark::kMicrosecond)
            ->UseRealTime();
}
