// imgfile_demo OUTDIR [PICTURE...]: writes pictures, or a generated scene, as image files, opens
// them again through the library, compares them with the pictures and prints the results. Read
// comparison.h first.
#include "comparison.h"
#include "scene.h"

#include "common/grouped.h"

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <new>
#include <set>
#include <stdexcept>
#include <string>
#include <system_error>
#include <vector>

namespace {

constexpr std::int32_t tile = 256;
constexpr std::int32_t strip = 100;  // lines; a tile is completed by several strips
constexpr std::int32_t header_length =
    48 + 64 + 68 + 64;  // bytes before the pixels of a VITec file

struct image_kind {
    const char *suffix, *tiling;
    std::int32_t type, tile;
};
constexpr image_kind untiled{"_untiled.img", "none", IMG_TYPE_VITEC, 0};
constexpr image_kind tiled{"_tiled.img", "256 x 256", IMG_TYPE_VITEC, tile};
constexpr image_kind helava{".d", "none", IMG_TYPE_HELAVA, 0};

struct totals {
    int nfiles = 0, ndiffering = 0, nrefused = 0;
    std::int64_t nsamples = 0;
};

// The last part of a path, shortened to its end so that columns stay aligned.
std::string shown_name(const std::string &path)
{
    const std::string name = std::filesystem::path(path).filename();
    return name.size() <= 31 ? name : "..." + name.substr(name.size() - 28);
}

// Calls `move(band, line, nlines)` for all strips of a picture; returns MB of them per second.
template <typename Move>
double rate_of_strips(const picture &source, Move move)
{
    const auto start = std::chrono::steady_clock::now();
    for (std::int32_t band = 0; band < source.nbands; ++band)
        for (std::int32_t line = 0; line < source.nlines; line += strip)
            if (move(band, line, std::min(strip, source.nlines - line)) != 0)
                throw std::runtime_error("a strip of lines cannot be read or written");
    const std::chrono::duration<double> taken = std::chrono::steady_clock::now() - start;
    return static_cast<double>(source.bytes.size()) / 1e6 / std::max(taken.count(), 1e-6);
}

double write_image(const std::string &name, const picture &source, const image_kind &kind)
{
    const image_closer image(img_createfile(name.c_str(), source.nlines, source.nsamps,
                                            source.nbands, kind.type, kind.tile, kind.tile,
                                            source.nbytes));
    const std::uint16_t fill = 0;
    return rate_of_strips(source, [&](std::int32_t band, std::int32_t line, std::int32_t nlines) {
        return img_dump_buffer(image, line, 0, nlines, source.nsamps, band,
                               &source.bytes[source.offset(band, line, 0)], source.nsamps, &fill);
    });
}

double read_image(img_handle image, const picture &source)
{
    std::vector<std::uint8_t> rows(static_cast<std::size_t>(source.nsamps) * strip);
    const std::uint8_t fill = 0;
    return rate_of_strips(source, [&](std::int32_t band, std::int32_t line, std::int32_t nlines) {
        return img_load_buffer(image, line, 0, nlines, source.nsamps, band, rows.data(),
                               source.nsamps, &fill);
    });
}

// Writes an image file, closes it, opens it again, examines it and prints one line. `twin` names
// another file of the picture, or is empty.
void make_and_examine(const std::string &name, const picture &source, const image_kind &kind,
                      const std::string &twin, totals &all)
try {
    const double write_rate = write_image(name, source, kind);
    const image_closer image(img_openfile(name.c_str(), IMG_OPEN_READ_ONLY));
    examined file{image, source};
    check_description(file, kind.type, kind.tile);
    const double read_rate = read_image(image, source);
    if (twin.empty()) {
        check_windows(file, -1);
    } else {
        const image_closer other(img_openfile(twin.c_str(), IMG_OPEN_READ_ONLY));
        check_windows(file, other);
    }
    if (kind.tile != 0) check_tiles(file, kind.tile);

    const auto size = static_cast<double>(std::filesystem::file_size(name));
    std::printf("  %-31s %7.2f  %-9s %8s %6s %12s %7.0f %6.0f\n", shown_name(name).c_str(),
                size / 1e6, kind.tiling, grouped(file.seen.nwindows).c_str(),
                grouped(file.seen.ntiles).c_str(), grouped(file.seen.nsamples).c_str(), write_rate,
                read_rate);
    if (file.seen.nunequal != 0) {
        std::printf("    %s DIFFER, first: %s\n", grouped(file.seen.nunequal).c_str(),
                    file.seen.first_unequal.c_str());
        ++all.ndiffering;
    }
    ++all.nfiles;
    all.nsamples += file.seen.nsamples;
} catch (const std::runtime_error &problem) {
    throw std::runtime_error(shown_name(name) + ": " + problem.what());
}

void describe(const std::string &name, const picture &source)
{
    std::printf("\n%s: %d lines x %d samples x %d band%s of %d byte%s\n", shown_name(name).c_str(),
                source.nlines, source.nsamps, source.nbands, source.nbands == 1 ? "" : "s",
                source.nbytes, source.nbytes == 1 ? "" : "s");
    if (source.nbytes == 2) {
        std::int64_t beyond =
            0;  // bands are stored one after another, so their lines are counted on
        for (std::int32_t line = 0; line < source.nlines * source.nbands; ++line)
            for (std::int32_t samp = 0; samp < source.nsamps; ++samp)
                beyond += source.sample(0, line, samp) > 4095 ? 1 : 0;
        std::printf("  %s samples lie beyond 12 bits%s\n", grouped(beyond).c_str(),
                    beyond == 0 ? "" : "; windows show them as 4095, tiles keep them");
    }
    std::printf("  %-31s %7s  %-9s %8s %6s %12s %7s %6s\n", "file", "MB", "tiling", "windows",
                "tiles", "compared", "write", "read");
}

void demonstrate(const std::string &name, const std::string &stem, totals &all)
{
    const picture source = read_pnm(name);
    const auto padded = [](std::int64_t size) { return (size + tile - 1) / tile * tile; };
    if (padded(source.nlines) * padded(source.nsamps) >
        (INT32_MAX - header_length) / (source.nbands * source.nbytes))
        throw std::runtime_error("too large for an image file, which ends below 2 GiB");

    describe(name, source);
    const std::string untiled_name = stem + untiled.suffix, tiled_name = stem + tiled.suffix;
    make_and_examine(untiled_name, source, untiled, "", all);
    make_and_examine(tiled_name, source, tiled, source.nbytes == 2 ? untiled_name : "", all);
    if (source.nbytes == 1) make_and_examine(stem + helava.suffix, source, helava, "", all);
}

// Returns OUTDIR and the picture's name without folder and suffix, made unique. An "@" is replaced,
// since it would end the file name.
std::string choose_stem(const std::string &outdir, const std::string &name)
{
    static std::set<std::string> taken;
    std::string stem = std::filesystem::path(name).stem();
    std::replace(stem.begin(), stem.end(), '@', '_');
    while (!taken.insert(stem).second) stem += "_";
    return outdir + "/" + stem;
}

std::vector<std::string> write_scene(const std::string &outdir)
{
    const scene made = make_scene();
    std::vector<std::string> names{outdir + "/scene_rgb.ppm", outdir + "/scene_gray12.pgm"};
    write_pnm(names[0], made.rgb);
    write_pnm(names[1], made.gray12);
    return names;
}

int run(const std::string &outdir, std::vector<std::string> names)
{
    if (outdir.find('@') != std::string::npos)
        throw std::runtime_error(outdir + ": the name of an image cannot contain \"@\"");
    std::error_code error;
    std::filesystem::create_directories(outdir, error);
    if (error) throw std::runtime_error(outdir + ": " + error.message());
    if (names.empty()) names = write_scene(outdir);

    std::printf("Image files in %s, written in strips, closed, opened again and compared:\n"
                "windows inside, across each edge and corner, outside and over all; whole tiles.\n"
                "Rates in MB/s.\n",
                outdir.c_str());
    totals all;
    for (const std::string &name : names) {
        const auto refuse = [&](const char *why) {
            std::fflush(stdout);
            std::fprintf(stderr, "imgfile_demo: %s: %s\n", name.c_str(), why);
            ++all.nrefused;
        };
        try {
            demonstrate(name, choose_stem(outdir, name), all);
        } catch (const std::bad_alloc &) {
            refuse("too large for memory");
        } catch (const std::exception &problem) {
            refuse(problem.what());
        }
    }
    std::printf("\n%d files, %s samples checked", all.nfiles, grouped(all.nsamples).c_str());
    if (all.ndiffering != 0)
        std::printf(", %d files differ", all.ndiffering);
    else if (all.nfiles != 0)
        std::printf(", all equal");
    if (all.nrefused != 0) std::printf("; pictures that failed: %d", all.nrefused);
    std::printf("\n");
    return all.ndiffering == 0 && all.nrefused == 0 ? EXIT_SUCCESS : EXIT_FAILURE;
}

}  // namespace

int main(int argc, char **argv)
{
    if (argc < 2 || argv[1][0] == '-') {
        std::fprintf(stderr, "usage: imgfile_demo OUTDIR [PICTURE.pgm|PICTURE.ppm ...]\n");
        return 2;
    }
    int result = EXIT_FAILURE;
    try {
        result = run(argv[1], {argv + 2, argv + argc});
    } catch (const std::exception &problem) {
        std::fprintf(stderr, "imgfile_demo: %s\n", problem.what());
    }
    img_mgr_cleanup();
    return std::fflush(stdout) == 0 ? result : EXIT_FAILURE;
}
