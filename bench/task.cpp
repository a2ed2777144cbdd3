#include "task.h"

#include "img.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <random>
#include <stdexcept>
#include <thread>

namespace {

// A wave along an axis, as far as three sides reach.
std::vector<double> wave(const scene &at, double (*function)(double), double frequency)
{
    std::vector<double> values(static_cast<std::size_t>(at.side) * 3);
    for (std::size_t i = 0; i < values.size(); ++i)
        values[i] = function(static_cast<double>(i) * frequency);
    return values;
}

void make_image(const scene &at, const std::string &name, bool tiled, std::int32_t nbytes)
{
    const std::int32_t tile = tiled ? at.tile : 0, rows = at.tile;
    const img_handle image = img_createfile(at.path(name).c_str(), at.side, at.side, 1,
                                            IMG_TYPE_VITEC, tile, tile, nbytes);
    const auto width = static_cast<std::size_t>(at.side) * static_cast<std::size_t>(nbytes);
    std::vector<std::uint8_t> strip(width * static_cast<std::size_t>(rows));
    for (std::int32_t line = 0; line < at.side; line += rows) {
        auto to = strip.begin();
        for (std::int32_t i = line; i < line + rows; ++i) {
            if (nbytes == 1) {
                to = std::ranges::copy(line_of_bytes(at, i), to).out;
            } else {
                const auto words = line_of_words(at, i);
                const auto *const first = reinterpret_cast<const std::uint8_t *>(words.data());
                to = std::copy(first, first + width, to);
            }
        }
        if (img_dump_buffer(image, line, 0, rows, at.side, 0, strip.data(), at.side, nullptr) != 0)
            throw std::runtime_error("cannot write " + at.path(name));
    }
    img_closefile(image);
}

// Fewer windows do for a small scene.
std::size_t enough(const scene &at, std::size_t count)
{
    return at.side < 8192 ? 5 : count;
}

// Windows anywhere in an image, the same in every run.
std::vector<window> anywhere(const scene &at, std::size_t count, std::int32_t nlines,
                             std::int32_t nsamps)
{
    std::mt19937 random(20'061);
    const auto place = [&](std::int32_t extent) {
        return static_cast<std::int32_t>(random() %
                                         static_cast<std::uint32_t>(at.side - extent + 1));
    };
    std::vector<window> all(enough(at, count));
    for (window &each : all) {
        each = {0, 0, std::min(nlines, at.side), std::min(nsamps, at.side)};
        each.line = place(each.nlines);
        each.samp = place(each.nsamps);
    }
    return all;
}

// Strips over the whole image.
std::vector<window> strips(const scene &at, std::int32_t nlines)
{
    nlines = std::min(nlines, at.side);
    std::vector<window> all;
    for (std::int32_t line = 0; line < at.side; line += nlines)
        all.push_back({line, 0, nlines, at.side});
    return all;
}

std::vector<window> tile_runs(const scene &at, std::size_t count, std::int32_t ntiles)
{
    const std::int32_t across = at.side / at.tile;
    ntiles = std::min(ntiles, across);
    std::mt19937 random(20'061);
    std::vector<window> all(enough(at, count));
    for (window &each : all) {
        const auto first = random() % static_cast<std::uint32_t>(across * across - ntiles + 1);
        each = {static_cast<std::int32_t>(first), 0, ntiles, 0};
    }
    return all;
}

}  // namespace

// Ridges and valleys with the noise of a sensor, 260 to 3740.
std::vector<std::uint16_t> line_of_words(const scene &at, std::int32_t line)
{
    static const auto down = wave(at, std::sin, 0.0071), across = wave(at, std::cos, 0.0053),
                      slanted = wave(at, std::sin, 0.021);
    const auto row = static_cast<std::uint32_t>(line);
    std::vector<std::uint16_t> words(static_cast<std::size_t>(at.side));
    for (std::uint32_t samp = 0; samp < words.size(); ++samp) {
        const double ridges = down[row] * across[samp] + 0.4 * slanted[row + 2 * samp];
        const std::uint32_t hash = (row * 73'856'093U ^ samp * 19'349'663U) * 2'654'435'761U;
        words[samp] = static_cast<std::uint16_t>(1940.0 + 1200.0 * ridges + (hash >> 24U) * 0.47);
    }
    return words;
}

std::vector<std::uint8_t> line_of_bytes(const scene &at, std::int32_t line)
{
    std::vector<std::uint8_t> bytes;
    for (const std::uint16_t word : line_of_words(at, line))
        bytes.push_back(static_cast<std::uint8_t>(word / 16));
    return bytes;
}

void make_files(const scene &at)
{
    make_image(at, "lines8.img", false, 1);
    make_image(at, "tiles8.img", true, 1);
    make_image(at, "lines16.img", false, 2);
    make_image(at, "tiles16.img", true, 2);
    img_closefile(img_createfile(at.path("small.img").c_str(), 64, 64, 1, IMG_TYPE_VITEC, 0, 0, 1));
}

void let_files_rest()
{
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
}

std::vector<task> make_tasks(const scene &at)
{
    const auto area = [](std::size_t nlines, std::size_t nsamps) { return nlines * nsamps; };
    const auto side = static_cast<std::size_t>(at.side), tile = static_cast<std::size_t>(at.tile);
    return {
        {"T1", "untiled, 512 x 512", 1.4, anywhere(at, 300, 512, 512), area(512, 512), {}},
        {"T2", "untiled, 64 x 64", 1.7, anywhere(at, 6000, 64, 64), area(64, 64), {}},
        {"T3", "untiled, 64 lines", 1.15, anywhere(at, 200, 64, at.side), area(64, side), {}},
        {"T4", "tiled, 512 x 512", 1.2, anywhere(at, 300, 512, 512), area(512, 512), {}},
        {"T5", "tiled, 64 x 64", 1.6, anywhere(at, 6000, 64, 64), area(64, 64), {}},
        {"T6", "tiled two-byte, 512 x 512", 1.2, anywhere(at, 80, 512, 512), area(512, 512), {}},
        {"T7", "untiled two-byte, 512 x 512", 1.3, anywhere(at, 80, 512, 512), area(512, 512), {}},
        {"T8", "write untiled, 512 lines", 1.2, strips(at, 512), area(512, side), {}},
        {"T9", "write tiled, 256 lines", 1.25, strips(at, at.tile), area(tile, side), {}},
        {"T10", "write tiled, 200 x 200", 1.3, anywhere(at, 300, 200, 200), area(200, 200), {}},
        {"T11", "whole tiles, runs of 32", 1.1, tile_runs(at, 60, 32), 32 * area(tile, tile), {}},
        {"T12", "open, query, close", 1.6, std::vector<window>(1000), 5 * sizeof(std::int32_t), {}},
    };
}
