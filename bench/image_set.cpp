// Makes the images of a run through the library. Read image_set.h first.
#include "image_set.h"

#include "base/count.h"
#include "imgfile/img.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <stdexcept>
#include <thread>

namespace {

// A wave along an axis, for three sides.
std::vector<double> wave(const image_set &images, double (*function)(double), double frequency)
{
    std::vector<double> values(img_count(images.side) * 3);
    for (std::size_t i = 0; i < values.size(); ++i)
        values[i] = function(static_cast<double>(i) * frequency);
    return values;
}

void make_image(const image_set &images, const std::string &name, bool tiled, std::int32_t nbytes)
{
    const std::int32_t tile = tiled ? images.tile : 0, rows = images.tile;
    const img_handle image = img_createfile(images.path(name).c_str(), images.side, images.side, 1,
                                            IMG_TYPE_VITEC, tile, tile, nbytes);
    const std::size_t width = img_count(images.side) * img_count(nbytes);
    std::vector<std::uint8_t> strip(width * img_count(rows));
    for (std::int32_t line = 0; line < images.side; line += rows) {
        auto end = strip.begin();
        for (std::int32_t i = line; i < line + rows; ++i) {
            if (nbytes == 1) {
                end = std::ranges::copy(line_of_bytes(images, i), end).out;
            } else {
                const auto words = line_of_words(images, i);
                const auto *const first = reinterpret_cast<const std::uint8_t *>(words.data());
                end = std::copy(first, first + width, end);
            }
        }
        if (img_dump_buffer(image, line, 0, rows, images.side, 0, strip.data(), images.side,
                            nullptr) != 0)
            throw std::runtime_error("cannot write " + images.path(name));
    }
    img_closefile(image);
}

}  // namespace

// Ridges and valleys with the noise of a sensor, 260 to 3740.
std::vector<std::uint16_t> line_of_words(const image_set &images, std::int32_t line)
{
    static const auto down = wave(images, std::sin, 0.0071),
                      across = wave(images, std::cos, 0.0053),
                      slanted = wave(images, std::sin, 0.021);
    const auto row = static_cast<std::uint32_t>(line);
    std::vector<std::uint16_t> words(img_count(images.side));
    for (std::uint32_t samp = 0; samp < words.size(); ++samp) {
        const double ridges = down[row] * across[samp] + 0.4 * slanted[row + 2 * samp];
        const std::uint32_t hash = (row * 73'856'093U ^ samp * 19'349'663U) * 2'654'435'761U;
        words[samp] = static_cast<std::uint16_t>(1940.0 + 1200.0 * ridges + (hash >> 24U) * 0.47);
    }
    return words;
}

std::vector<std::uint8_t> line_of_bytes(const image_set &images, std::int32_t line)
{
    const auto words = line_of_words(images, line);
    std::vector<std::uint8_t> bytes(words.size());
    std::ranges::transform(words, bytes.begin(),
                           [](std::uint16_t word) { return static_cast<std::uint8_t>(word / 16); });
    return bytes;
}

void make_files(const image_set &images)
{
    make_image(images, "lines8.img", false, 1);
    make_image(images, "tiles8.img", true, 1);
    make_image(images, "lines16.img", false, 2);
    make_image(images, "tiles16.img", true, 2);
    img_closefile(
        img_createfile(images.path("small.img").c_str(), 64, 64, 1, IMG_TYPE_VITEC, 0, 0, 1));
}

void let_files_rest()
{
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
}
