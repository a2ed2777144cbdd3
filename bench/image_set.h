// The images of a run, and their samples.
#ifndef BENCH_IMAGE_SET_H
#define BENCH_IMAGE_SET_H

#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

inline constexpr std::int32_t FULL_SIDE = 8192, FULL_TILE = 256;  // samples
inline constexpr std::int32_t SMALL_SIDE = 256, SMALL_TILE = 32;  // with --small

// Squares of `side` samples a side, in one folder; tiles have `tile` samples a side.
struct image_set {
    std::filesystem::path folder;
    std::int32_t side, tile;

    std::string path(const std::string &name) const { return folder / name; }
};

// Writes the files lines8.img, tiles8.img, lines16.img, tiles16.img and small.img.
void make_files(const image_set &images);
// Waits until the files are old enough for every candidate to keep bytes of them.
void let_files_rest();
// The samples of a line, 8 or 12 bits deep; the same in all files.
std::vector<std::uint8_t> line_of_bytes(const image_set &images, std::int32_t line);
std::vector<std::uint16_t> line_of_words(const image_set &images, std::int32_t line);

#endif
