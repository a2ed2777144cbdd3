// imgfile_gdal_bench: the drivers of the GDAL plugin beside GDAL's own drivers of uncompressed
// files, with the same samples and the same calls.
//
// imgfile_gdal_bench [--small] [--dir=FOLDER] [--rounds=COUNT] [TASK...]
//   TASK      a part of the names of tasks, or of pairs of files; without one, all
//   --small   tiny images and two rounds, to check that everything works and all samples agree
//   --dir     folder for the images, 0.8 GB. They are removed at the end. Default: the folder for
//             temporary files
//   --rounds  per task; default: 31
// GDAL finds the plugin by GDAL_DRIVER_PATH. The drivers of a pair take turns, and the ratio is the
// median of the ratios of all rounds. Exit status: 1 if samples differ or if anything fails; 2 for
// an unknown argument.
#include "bench_folder.h"

#include <algorithm>
#include <chrono>
#include <cpl_vsi.h>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <gdal.h>
#include <memory>
#include <random>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <unistd.h>

namespace {

constexpr GIntBig CACHE_SIZE = 64 << 20;  // of GDAL's blocks, bytes

// --- GDAL's calls, which throw here ---

struct close_dataset {
    void operator()(void *dataset) const { GDALClose(dataset); }
};
using dataset = std::unique_ptr<void, close_dataset>;

void check(CPLErr result)
{
    if (result != CE_None) throw std::runtime_error(CPLGetLastErrorMsg());
}

dataset owned(GDALDatasetH made)
{
    if (made == nullptr) throw std::runtime_error(CPLGetLastErrorMsg());
    return dataset(made);
}

dataset open(const std::string &path, GDALAccess access = GA_ReadOnly)
{
    return owned(GDALOpen(path.c_str(), access));
}

using option_list = std::vector<const char *>;  // KEY=VALUE

void copy(const dataset &source, const char *driver, const std::string &path, option_list options)
{
    auto *const found = GDALGetDriverByName(driver);
    if (found == nullptr) throw std::runtime_error(std::string("no driver ") + driver);
    options.push_back(nullptr);
    owned(GDALCreateCopy(found, path.c_str(), source.get(), TRUE,
                         const_cast<char **>(options.data()), nullptr, nullptr));
}

// Removes an image with its side files, if it is there.
void remove_image(const std::string &path)
{
    VSIStatBufL status;
    if (VSIStatL(path.c_str(), &status) == 0) GDALDeleteDataset(nullptr, path.c_str());
}

// --- The files ---

// One image in a file of ours and in one of theirs.
struct image_pair {
    const char *name;
    int side, nbands;
    GDALDataType type;
    const char *drivers[2], *extensions[2];
    option_list options[2];  // of the creation
    std::string paths[2];    // without extension until the files are made
    std::string source;      // the same samples as a GeoTIFF file
};

image_pair make_pair(const char *name, int side, int nbands, GDALDataType type, const char *ours)
{
    image_pair made{.name = name,
                    .side = side,
                    .nbands = nbands,
                    .type = type,
                    .drivers = {ours, "ENVI"},
                    .extensions = {EQUAL(ours, "Helava") ? ".d" : ".img", ".raw"},
                    .options = {},
                    .paths = {},
                    .source = {}};
    return made;
}

image_pair make_tiled_pair(const char *name, int side, int nbands, GDALDataType type)
{
    image_pair made = make_pair(name, side, nbands, type, "VITec");
    made.drivers[1] = "GTiff";
    made.extensions[1] = ".tif";
    for (option_list &options : made.options)
        options = {"TILED=YES", "BLOCKXSIZE=256", "BLOCKYSIZE=256"};
    made.options[1].push_back("INTERLEAVE=BAND");  // as VITec images have it
    return made;
}

// Images that do not fit GDAL's cache, and a pair that does.
std::vector<image_pair> make_pairs(bool small)
{
    const int large = small ? 256 : 8192, medium = small ? 256 : 4096, little = small ? 256 : 2048;
    return {make_pair("VITec lines", large, 1, GDT_Byte, "VITec"),
            make_pair("VITec lines, 3 bands", little, 3, GDT_Byte, "VITec"),
            make_pair("VITec lines, 16 bits", medium, 1, GDT_UInt16, "VITec"),
            make_tiled_pair("VITec tiles", large, 1, GDT_Byte),
            make_tiled_pair("VITec tiles, 3 bands", little, 3, GDT_Byte),
            make_tiled_pair("VITec tiles, 16 bits", medium, 1, GDT_UInt16),
            make_pair("Helava", large, 1, GDT_Byte, "Helava"),
            make_pair("Helava, 3 bands", little, 3, GDT_Byte, "Helava")};
}

// Ridges under the noise of a sensor.
dataset make_samples(const image_pair &images)
{
    dataset source = owned(GDALCreate(GDALGetDriverByName("MEM"), "", images.side, images.side,
                                      images.nbands, images.type, nullptr));
    std::mt19937 random(11);
    std::vector<std::uint16_t> samples(static_cast<std::size_t>(images.side));
    const unsigned divisor = images.type == GDT_Byte ? 16 : 1;
    for (int band = 1; band <= images.nbands; ++band)
        for (int line = 0; line < images.side; ++line) {
            for (std::size_t i = 0; i < samples.size(); ++i) {
                const std::size_t ridge = (static_cast<std::size_t>(line * band) + i / 2) % 2048;
                samples[i] = static_cast<std::uint16_t>((1500 + ridge + random() % 128) / divisor);
            }
            check(GDALRasterIO(GDALGetRasterBand(source.get(), band), GF_Write, 0, line,
                               images.side, 1, samples.data(), images.side, 1, GDT_UInt16, 0, 0));
        }
    return source;
}

void make_files(image_pair *images, const std::filesystem::path &folder)
{
    const dataset samples = make_samples(*images);
    images->source = folder / "source.tif";
    copy(samples, "GTiff", images->source, {});
    for (int i = 0; i < 2; ++i) {
        images->paths[i] = folder / (std::string("image") + images->extensions[i]);
        copy(samples, images->drivers[i], images->paths[i], images->options[i]);
    }
}

// --- Requests ---

struct window {
    int line, samp, side;
};

// The same in every run.
std::vector<window> windows_anywhere(const image_pair &images, int side, int count)
{
    side = std::min(side, images.side);
    std::mt19937 random(7);
    const auto places = static_cast<unsigned>(images.side - side + 1);
    std::vector<window> all(static_cast<std::size_t>(count));
    for (window &each : all)
        each = {static_cast<int>(random() % places), static_cast<int>(random() % places), side};
    return all;
}

std::size_t size_of(const image_pair &images, int side)
{
    return static_cast<std::size_t>(side) * static_cast<std::size_t>(side) *
           static_cast<std::size_t>(images.nbands) *
           static_cast<std::size_t>(GDALGetDataTypeSizeBytes(images.type));
}

void move(GDALRWFlag direction, const dataset &image, const image_pair &images, const window &part,
          GByte *buffer)
{
    check(GDALDatasetRasterIO(image.get(), direction, part.samp, part.line, part.side, part.side,
                              buffer, part.side, part.side, images.type, images.nbands, nullptr, 0,
                              0, 0));
}

void read(const dataset &image, const image_pair &images, const window &part, GByte *buffer)
{
    move(GF_Read, image, images, part, buffer);
}

bool agree(const image_pair &images)
{
    std::vector<GByte> first(size_of(images, images.side)), second(first.size());
    read(open(images.paths[0]), images, {0, 0, images.side}, first.data());
    read(open(images.paths[1]), images, {0, 0, images.side}, second.data());
    return first == second;
}

// --- Tasks ---

// What one driver does in a round; only `run` is timed.
struct candidate {
    std::function<void()> prepare, run, finish;
};

void nothing() {}

struct task {
    const char *name;
    int requests;  // of a round; times are of one
    std::function<candidate(const image_pair &, int which)> make;
};

// Windows of a data set with an empty block cache. `again`: that has read them all before. All
// candidates share one buffer, because the speed of a copy depends on its place.
candidate reads(const image_pair &images, int which, const std::vector<window> &windows, bool again)
{
    static std::vector<GByte> buffer;
    buffer.resize(std::max(buffer.size(), size_of(images, windows.front().side)));
    const auto image = std::make_shared<dataset>();
    const auto run = [=, &images] {
        for (const window &each : windows) read(*image, images, each, buffer.data());
    };
    const auto prepare = [=, &images] {
        *image = open(images.paths[which]);
        if (again) run();
    };
    return {prepare, run, [=] { image->reset(); }};
}

std::function<candidate(const image_pair &, int)> reads_windows(int side, int count, bool again)
{
    return [=](const image_pair &images, int which) {
        return reads(images, which, windows_anywhere(images, side, count), again);
    };
}

std::function<candidate(const image_pair &, int)> reads_bands(bool again)
{
    return [=](const image_pair &images, int which) {
        return reads(images, which, {{0, 0, images.side}}, again);
    };
}

// Writes windows and stores them. `reads_first`: each is read, changed and written back. The writes
// of one round are the same for both drivers, so that their files stay equal.
std::function<candidate(const image_pair &, int)> updates_windows(int side, int count,
                                                                  bool reads_first)
{
    return [=](const image_pair &images, int which) -> candidate {
        static std::vector<GByte> buffer;
        const std::vector<window> windows = windows_anywhere(images, side, count);
        buffer.resize(std::max(buffer.size(), size_of(images, windows.front().side)));
        const auto image = std::make_shared<dataset>();
        const auto prepare = [=, &images] {
            *image = open(images.paths[which], GA_Update);
            std::ranges::fill(buffer, GByte{1});
        };
        const auto run = [=, &images] {
            for (const window &each : windows) {
                if (reads_first) read(*image, images, each, buffer.data());
                ++buffer.front();
                move(GF_Write, *image, images, each, buffer.data());
            }
            image->reset();
        };
        return {prepare, run, nothing};
    };
}

candidate computes_statistics(const image_pair &images, int which)
{
    const std::string &path = images.paths[which];
    const auto run = [&] {
        const dataset image = open(path);
        for (int band = 1; band <= images.nbands; ++band) {
            double numbers[4];
            check(GDALComputeRasterStatistics(GDALGetRasterBand(image.get(), band), FALSE,
                                              &numbers[0], &numbers[1], &numbers[2], &numbers[3],
                                              nullptr, nullptr));
        }
    };
    return {nothing, run, [&path] { VSIUnlink((path + ".aux.xml").c_str()); }};
}

candidate copies(const std::string &from, const char *driver, const option_list &options,
                 const std::string &to)
{
    return {nothing, [=, &options] { copy(open(from), driver, to, options); },
            [=] { remove_image(to); }};
}

candidate copies_to_tiff(const image_pair &images, int which)
{
    static const option_list none;
    return copies(images.paths[which], "GTiff", none, "/vsimem/bench_copy.tif");
}

std::function<candidate(const image_pair &, int)> copies_from_tiff(const std::string &folder)
{
    return [=](const image_pair &images, int which) {
        return copies(images.source, images.drivers[which], images.options[which],
                      folder + "/bench_copy" + images.extensions[which]);
    };
}

candidate opens(const image_pair &images, int which, int count)
{
    const std::string &path = images.paths[which];
    const auto run = [=, &path] {
        for (int i = 0; i < count; ++i) open(path);
    };
    return {nothing, run, nothing};
}

void forget_pages(const std::filesystem::path &path)
{
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd == -1) return;
    ::fdatasync(fd);
    ::posix_fadvise(fd, 0, 0, POSIX_FADV_DONTNEED);
    ::close(fd);
}

// The pages of the files are no longer in memory; the folder and the programs are.
candidate opens_cold(const image_pair &images, int which)
{
    const std::filesystem::path path = images.paths[which];
    const auto prepare = [=] {
        forget_pages(path);
        forget_pages(std::filesystem::path(path).replace_extension(".hdr"));
    };
    return {prepare, [=] { open(path); }, nothing};
}

std::vector<task> make_tasks(const std::string &memory_folder, bool small)
{
    const int many = small ? 20 : 2000, some = small ? 2 : 100, nopens = small ? 10 : 1000;
    return {{"windows of 64", many, reads_windows(64, many, false)},
            {"windows of 64, again", many, reads_windows(64, many, true)},
            {"windows of 512", some, reads_windows(512, some, false)},
            {"windows of 512, again", some, reads_windows(512, some, true)},
            {"whole bands", 1, reads_bands(false)},
            {"whole bands, again", 1, reads_bands(true)},
            {"updates of 64", many, updates_windows(64, many, true)},
            {"writes of 64", many, updates_windows(64, many, false)},
            {"updates of 512", some, updates_windows(512, some, true)},
            {"writes of 512", some, updates_windows(512, some, false)},
            {"statistics", 1, computes_statistics},
            {"to GTiff in /vsimem/", 1, copies_to_tiff},
            {"from GTiff to a file", 1, copies_from_tiff(memory_folder)},
            {"from GTiff to /vsimem/", 1, copies_from_tiff("/vsimem")},
            {"opens", nopens,
             [=](const image_pair &images, int which) { return opens(images, which, nopens); }},
            {"opens, cold", 1, opens_cold}};
}

// --- Measuring ---

double microseconds(const candidate &worker, int requests)
{
    using clock = std::chrono::steady_clock;
    worker.prepare();
    const auto start = clock::now();
    worker.run();
    const std::chrono::duration<double, std::micro> taken = clock::now() - start;
    worker.finish();
    return taken.count() / requests;
}

double median(std::vector<double> numbers)
{
    const auto middle = numbers.begin() + static_cast<std::ptrdiff_t>(numbers.size() / 2);
    std::nth_element(numbers.begin(), middle, numbers.end());
    return *middle;
}

// Prints a row: the medians of both, and the median, the smallest and the largest of their ratios.
void measure(const task &work, const image_pair &images, int rounds)
{
    const candidate workers[2] = {work.make(images, 0), work.make(images, 1)};
    for (const candidate &each : workers) microseconds(each, 1);
    std::vector<double> times[2], ratios;
    for (int round = 0; round < rounds; ++round) {
        const int first = round % 2;  // it alternates
        double now[2];
        for (const int which : {first, 1 - first})
            now[which] = microseconds(workers[which], work.requests);
        times[0].push_back(now[0]);
        times[1].push_back(now[1]);
        ratios.push_back(now[0] / now[1]);
    }
    const auto [least, most] = std::minmax_element(ratios.begin(), ratios.end());
    std::printf("%-22s %-24s %-6s%12.2f%12.2f%8.2f%8.2f%8.2f\n", images.name, work.name,
                images.drivers[1], median(times[0]), median(times[1]), median(ratios), *least,
                *most);
    std::fflush(stdout);
}

struct arguments {
    bool small = false;
    int rounds = 31;
    std::filesystem::path folder = std::filesystem::temp_directory_path();
    std::vector<std::string> names = {};

    bool asks_for(const task &work, const image_pair &images) const
    {
        return names.empty() || std::ranges::any_of(names, [&](const std::string &name) {
                   return std::string(work.name).find(name) != std::string::npos ||
                          std::string(images.name).find(name) != std::string::npos;
               });
    }
};

// Returns false for an unknown argument.
bool take_argument(const std::string &argument, arguments *asked)
{
    if (argument == "--small") {
        asked->small = true;
        asked->rounds = 2;
    } else if (take_folder(argument, &asked->folder)) {
        return true;
    } else if (argument.starts_with("--rounds=")) {
        asked->rounds = static_cast<int>(
            std::clamp(std::strtol(argument.c_str() + 9, nullptr, 10), 1L, 10000L));
    } else if (argument.starts_with("-")) {
        return false;
    } else {
        asked->names.push_back(argument);
    }
    return true;
}

void run(const arguments &asked)
{
    GDALAllRegister();
    GDALSetCacheMax64(CACHE_SIZE);
    const bench_folder folder(asked.folder);
    // A disk would be measured instead of what writes to it.
    const std::filesystem::path memory = "/dev/shm";
    const bench_folder outputs(std::filesystem::is_directory(memory) ? memory : asked.folder);
    std::printf("%-22s %-24s %-6s%12s%12s%8s%8s%8s\n", "microseconds", "task", "beside", "ours",
                "theirs", "ratio", "least", "most");
    for (image_pair &images : make_pairs(asked.small)) {
        make_files(&images, folder.path());
        if (!agree(images)) throw std::runtime_error(std::string(images.name) + ": samples differ");
        // The library maps files once their timestamps are old enough.
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        for (const task &work : make_tasks(outputs.path(), asked.small))
            if (asked.asks_for(work, images)) measure(work, images, asked.rounds);
        if (!agree(images))
            throw std::runtime_error(std::string(images.name) + ": samples differ after updates");
        for (const std::string &path : images.paths) remove_image(path);
    }
}

}  // namespace

int main(int argc, char **argv)
{
    arguments asked;
    for (int i = 1; i < argc; ++i) {
        if (take_argument(argv[i], &asked)) continue;
        std::fprintf(stderr,
                     "imgfile_gdal_bench: unknown argument %s\nusage: imgfile_gdal_bench [--small] "
                     "[--dir=FOLDER] [--rounds=COUNT] [TASK...]\n",
                     argv[i]);
        return 2;
    }
    try {
        run(asked);
    } catch (const std::exception &error) {
        std::fprintf(stderr, "imgfile_gdal_bench: %s\n", error.what());
        return 1;
    }
    return 0;
}
