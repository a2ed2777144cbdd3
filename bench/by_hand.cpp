// What the hardware asks: each task written by hand, with plain calls and on mappings of the files.
#include "stretch_by_hand.h"
#include "task.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <stdexcept>

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

constexpr std::size_t PAGE = 4096;

// A file that stays open, and mapped, as long as someone uses it.
struct file {
    int fd;
    std::uint8_t *bytes = nullptr;
    std::size_t size = 0;

    // `flags` as for open(); with `new_size` the file is made that large before it is mapped.
    file(const std::string &path, int flags, bool mapped, std::size_t new_size = 0)
        : fd(::open(path.c_str(), flags | O_CLOEXEC, 0666)), size(new_size)
    {
        if (fd == -1) throw std::runtime_error("cannot open " + path);
        if (!mapped) return;
        struct stat status;
        if (size != 0 ? ::ftruncate(fd, static_cast<off_t>(size)) != 0 : ::fstat(fd, &status) != 0)
            throw std::runtime_error("cannot size " + path);
        if (size == 0) size = static_cast<std::size_t>(status.st_size);
        const int rights = flags == O_RDONLY ? PROT_READ : PROT_READ | PROT_WRITE;
        void *const place = ::mmap(nullptr, size, rights, MAP_SHARED, fd, 0);
        if (place == MAP_FAILED) throw std::runtime_error("cannot map " + path);
        bytes = static_cast<std::uint8_t *>(place);
    }
    ~file()
    {
        if (bytes != nullptr) ::munmap(bytes, size);
        ::close(fd);
    }
    file(const file &) = delete;
    file &operator=(const file &) = delete;

    void read(void *to, std::size_t count, std::size_t at) const
    {
        if (::pread(fd, to, count, static_cast<off_t>(at)) != static_cast<ssize_t>(count))
            throw std::runtime_error("a read fell short");
    }
    void write(const void *from, std::size_t count, std::size_t at) const
    {
        if (::pwrite(fd, from, count, static_cast<off_t>(at)) != static_cast<ssize_t>(count))
            throw std::runtime_error("a write fell short");
    }
};

// Working memory on whole pages, kept between windows.
template <typename Sample>
Sample *kept(std::size_t count)
{
    struct deleter {
        void operator()(void *memory) const { ::operator delete (memory, std::align_val_t{PAGE}); }
    };
    static std::unique_ptr<void, deleter> memory;
    static std::size_t room = 0;
    if (room < count * sizeof(Sample)) {
        room = count * sizeof(Sample);
        memory.reset(::operator new (room, std::align_val_t{PAGE}));
    }
    return static_cast<Sample *>(memory.get());
}

std::size_t count_of(std::int32_t extent)
{
    return static_cast<std::size_t>(extent);
}

// --- Where the parts of a window lie ---

struct geometry {
    std::size_t side, tile, width;  // of the image and of a tile, in samples; bytes per sample

    std::size_t line_at(std::int32_t line, std::int32_t samp) const
    {
        return scene::data_offset + (count_of(line) * side + count_of(samp)) * width;
    }
    std::size_t tile_bytes() const { return tile * tile * width; }
    std::size_t tile_at(std::size_t row, std::size_t col) const
    {
        return scene::data_offset + (row * (side / tile) + col) * tile_bytes();
    }
};

// Calls `visit(row, col, in_tile, in_window, nlines, nsamps)` for each tile that a window touches:
// the first sample in either, and how many the part has.
template <typename Visit>
void for_each_tile(const geometry &of, const window &at, Visit visit)
{
    const std::size_t top = count_of(at.line), left = count_of(at.samp);
    const std::size_t bottom = top + count_of(at.nlines), right = left + count_of(at.nsamps);
    for (std::size_t row = top / of.tile; row * of.tile < bottom; ++row)
        for (std::size_t col = left / of.tile; col * of.tile < right; ++col) {
            const std::size_t line = std::max(top, row * of.tile),
                              samp = std::max(left, col * of.tile);
            visit(row, col, (line - row * of.tile) * of.tile + samp - col * of.tile,
                  (line - top) * count_of(at.nsamps) + samp - left,
                  std::min(bottom, (row + 1) * of.tile) - line,
                  std::min(right, (col + 1) * of.tile) - samp);
        }
}

// Copies rows; the next ones are asked for meanwhile, since each lies on a page of its own.
template <typename Copy>
void for_each_row(const std::uint8_t *from, std::size_t pitch, std::size_t nrows,
                  std::size_t length, Copy copy)
{
    const std::size_t ahead = length < 1024 ? 8 : 4;  // more would drive each other out
    for (std::size_t i = 0; i < nrows; ++i) {
        if (i + ahead < nrows)
            for (std::size_t at = 0; at < std::min<std::size_t>(length, 2048); at += 64)
                __builtin_prefetch(from + (i + ahead) * pitch + at);
        copy(i, from + i * pitch);
    }
}

// --- Reading ---

void read_lines(const file &in, const geometry &of, const window &at, std::uint8_t *to)
{
    const std::size_t length = count_of(at.nsamps) * of.width;
    if (at.nsamps == static_cast<std::int32_t>(of.side))
        return in.read(to, length * count_of(at.nlines), of.line_at(at.line, 0));
    for (std::int32_t i = 0; i < at.nlines; ++i)
        in.read(to + count_of(i) * length, length, of.line_at(at.line + i, at.samp));
}

void copy_lines(const file &in, const geometry &of, const window &at, std::uint8_t *to)
{
    const std::size_t length = count_of(at.nsamps);
    const std::uint8_t *const from = in.bytes + of.line_at(at.line, at.samp);
    if (length == of.side) {  // in one piece the processor needs no help
        std::memcpy(to, from, length * count_of(at.nlines));
        return;
    }
    for_each_row(from, of.side, count_of(at.nlines), length, [=](std::size_t i, const auto *row) {
        std::memcpy(to + i * length, row, length);
    });
}

void read_tiles(const file &in, const geometry &of, const window &at, std::uint8_t *to)
{
    auto *const lines = kept<std::uint8_t>(of.tile_bytes());
    const std::size_t pitch = of.tile * of.width;
    for_each_tile(
        of, at, [&](auto row, auto col, auto in_tile, auto in_window, auto nlines, auto nsamps) {
            const std::size_t first = in_tile / of.tile * pitch;  // of the lines that are needed
            in.read(lines, nlines * pitch, of.tile_at(row, col) + first);
            for (std::size_t i = 0; i < nlines; ++i)
                std::memcpy(to + (in_window + i * count_of(at.nsamps)) * of.width,
                            lines + i * pitch + (in_tile % of.tile) * of.width, nsamps * of.width);
        });
}

void copy_tiles(const file &in, const geometry &of, const window &at, std::uint8_t *to)
{
    for_each_tile(
        of, at, [&](auto row, auto col, auto in_tile, auto in_window, auto nlines, auto nsamps) {
            for_each_row(in.bytes + of.tile_at(row, col) + in_tile, of.tile, nlines, nsamps,
                         [&, length = nsamps](std::size_t i, const auto *from) {
                             std::memcpy(to + in_window + i * count_of(at.nsamps), from, length);
                         });
        });
}

void stretch_tiles(const file &in, const geometry &of, const window &at, std::uint8_t *to)
{
    const std::size_t width = count_of(at.nsamps), size = count_of(at.nlines) * width;
    auto *const samples = kept<std::uint16_t>(size);
    sample_counts &counts = new_counts();
    for_each_tile(
        of, at, [&](auto row, auto col, auto in_tile, auto in_window, auto nlines, auto nsamps) {
            for_each_row(in.bytes + of.tile_at(row, col) + in_tile * 2, of.tile * 2, nlines,
                         nsamps * 2, [&, count = nsamps](std::size_t i, const auto *from) {
                             auto *const line = samples + in_window + i * width;
                             exchange_by_hand(from, line, count);
                             count_by_hand(line, in_window % width, count, counts);
                         });
        });
    stretch_by_hand(samples, size, counts, to);
}

void stretch_lines(const file &in, const geometry &of, const window &at, std::uint8_t *to)
{
    const std::size_t width = count_of(at.nsamps), size = count_of(at.nlines) * width;
    auto *const samples = kept<std::uint16_t>(size);
    sample_counts &counts = new_counts();
    for_each_row(in.bytes + of.line_at(at.line, at.samp), of.side * 2, count_of(at.nlines),
                 width * 2, [&](std::size_t i, const auto *from) {
                     exchange_by_hand(from, samples + i * width, width);
                     count_by_hand(samples + i * width, 0, width, counts);
                 });
    stretch_by_hand(samples, size, counts, to);
}

// Reads the samples as they are and exchanges their bytes in place.
template <typename Read>
void read_and_stretch(const file &in, const geometry &of, const window &at, std::uint8_t *to,
                      Read read)
{
    const std::size_t width = count_of(at.nsamps);
    static std::vector<std::uint16_t> samples;
    samples.resize(count_of(at.nlines) * width);
    auto *const bytes = reinterpret_cast<std::uint8_t *>(samples.data());
    read(in, of, at, bytes);
    sample_counts &counts = new_counts();
    for (std::size_t i = 0; i < samples.size(); i += width) {
        exchange_by_hand(bytes + i * 2, &samples[i], width);
        count_by_hand(&samples[i], 0, width, counts);
    }
    stretch_by_hand(samples.data(), samples.size(), counts, to);
}

// --- Writing ---

// Writes a strip of whole tiles, gathered in a run: one long write makes larger pages of the file
// than several short ones.
void write_tile_strip(const file &out, const geometry &of, const window &at,
                      const std::uint8_t *from)
{
    auto *const run = kept<std::uint8_t>(of.side * of.tile);
    for_each_tile(of, at, [&](auto, auto col, auto, auto in_window, auto nlines, auto nsamps) {
        for (std::size_t i = 0; i < nlines; ++i)
            std::memcpy(run + col * of.tile_bytes() + i * of.tile, from + in_window + i * of.side,
                        nsamps);
    });
    out.write(run, of.side * of.tile, of.tile_at(count_of(at.line) / of.tile, 0));
}

// Overlays those lines of tiles that a window touches.
void overlay_tiles(const file &in_out, const geometry &of, const window &at,
                   const std::uint8_t *from)
{
    auto *const lines = kept<std::uint8_t>(of.tile_bytes());
    for_each_tile(of, at,
                  [&](auto row, auto col, auto in_tile, auto in_window, auto nlines, auto nsamps) {
                      const std::size_t first = of.tile_at(row, col) + in_tile / of.tile * of.tile;
                      if (nsamps < of.tile) in_out.read(lines, nlines * of.tile, first);
                      for (std::size_t i = 0; i < nlines; ++i)
                          std::memcpy(lines + i * of.tile + in_tile % of.tile,
                                      from + in_window + i * count_of(at.nsamps), nsamps);
                      in_out.write(lines, nlines * of.tile, first);
                  });
}

void store_tiles(const file &out, const geometry &of, const window &at, const std::uint8_t *from)
{
    for_each_tile(of, at,
                  [&](auto row, auto col, auto in_tile, auto in_window, auto nlines, auto nsamps) {
                      for (std::size_t i = 0; i < nlines; ++i)
                          std::memcpy(out.bytes + of.tile_at(row, col) + in_tile + i * of.tile,
                                      from + in_window + i * count_of(at.nsamps), nsamps);
                  });
}

void write_lines(const file &out, const geometry &of, const window &at, const std::uint8_t *from)
{
    out.write(from, of.side * count_of(at.nlines), of.line_at(at.line, 0));
}

void store_lines(const file &out, const geometry &of, const window &at, const std::uint8_t *from)
{
    std::memcpy(out.bytes + of.line_at(at.line, 0), from, of.side * count_of(at.nlines));
}

// --- The candidates ---

using transfer = void (*)(const file &in, const geometry &of, const window &at,
                          std::uint8_t *buffer);
using storing = void (*)(const file &out, const geometry &of, const window &at,
                         const std::uint8_t *buffer);

candidate reading(const char *name, const std::string &path, const geometry &of, transfer move)
{
    const auto in = std::make_shared<file>(path, O_RDONLY, true);
    return {.name = name, .is_limit = true, .move = [=](const window &at, std::uint8_t *buffer) {
                move(*in, of, at, buffer);
            }};
}

candidate creating(const char *name, const std::string &path, const geometry &of, bool mapped,
                   storing move)
{
    const auto out = std::make_shared<std::unique_ptr<file>>();
    const std::size_t size = scene::data_offset + of.side * of.side;
    return {.name = name,
            .is_limit = true,
            .move = [=](const window &at, std::uint8_t *buffer) { move(**out, of, at, buffer); },
            .begin =
                [=] {
                    std::filesystem::remove(path);
                    *out = std::make_unique<file>(path, O_RDWR | O_CREAT | O_TRUNC, mapped, size);
                },
            .end = [=] { out->reset(); },
            .written = path};
}

// The file is opened for each round, and with it the mapping made: pages that were stored through
// it before, and not since written to the disk, would take what is not to be had for long.
candidate changing(const char *name, const std::string &path, const std::string &from,
                   const geometry &of, bool mapped, storing move)
{
    std::filesystem::copy_file(from, path);
    const auto out = std::make_shared<std::unique_ptr<file>>();
    return {.name = name,
            .is_limit = true,
            .move = [=](const window &at, std::uint8_t *buffer) { move(**out, of, at, buffer); },
            .begin = [=] { *out = std::make_unique<file>(path, O_RDWR, mapped); },
            .end = [=] { out->reset(); },
            .written = path};
}

// Takes the geometry out of a header.
void store_geometry(const std::uint8_t *header, std::uint8_t *buffer)
{
    const auto word_at = [=](std::size_t at) {
        std::uint32_t word;
        std::memcpy(&word, header + at, sizeof word);
        return static_cast<std::int32_t>(__builtin_bswap32(word));
    };
    const std::array geometry{word_at(152), word_at(148), word_at(156), word_at(160), word_at(168)};
    std::memcpy(buffer, geometry.data(), sizeof geometry);
}

void read_header(const std::string &path, std::uint8_t *buffer)
{
    std::array<std::uint8_t, scene::data_offset> header;
    const file in(path, O_RDONLY, false);
    in.read(header.data(), header.size(), 0);
    store_geometry(header.data(), buffer);
}

}  // namespace

void add_limits(const scene &at, std::vector<task> &tasks)
{
    const geometry bytes{count_of(at.side), count_of(at.tile), 1}, words{bytes.side, bytes.tile, 2};
    const auto add = [&tasks](std::size_t number, candidate &&each) {
        tasks[number - 1].candidates.push_back(std::move(each));
    };
    for (const std::size_t number : {1U, 2U, 3U}) {
        add(number, reading("plain", at.path("lines8.img"), bytes, read_lines));
        add(number, reading("mapped", at.path("lines8.img"), bytes, copy_lines));
    }
    for (const std::size_t number : {4U, 5U}) {
        add(number, reading("plain", at.path("tiles8.img"), bytes, read_tiles));
        add(number, reading("mapped", at.path("tiles8.img"), bytes, copy_tiles));
    }
    add(6, reading("plain", at.path("tiles16.img"), words,
                   [](const file &in, const geometry &of, const window &each, std::uint8_t *to) {
                       read_and_stretch(in, of, each, to, read_tiles);
                   }));
    add(6, reading("mapped", at.path("tiles16.img"), words, stretch_tiles));
    add(7, reading("plain", at.path("lines16.img"), words,
                   [](const file &in, const geometry &of, const window &each, std::uint8_t *to) {
                       read_and_stretch(in, of, each, to, read_lines);
                   }));
    add(7, reading("mapped", at.path("lines16.img"), words, stretch_lines));
    add(8, creating("plain", at.path("plain.img"), bytes, false, write_lines));
    add(8, creating("mapped", at.path("mapped.img"), bytes, true, store_lines));
    add(9, creating("plain", at.path("plain.img"), bytes, false, write_tile_strip));
    add(9, creating("mapped", at.path("mapped.img"), bytes, true, store_tiles));
    const std::string tiles = at.path("tiles8.img");
    add(10, changing("plain", at.path("plain_changed.img"), tiles, bytes, false, overlay_tiles));
    add(10, changing("mapped", at.path("mapped_changed.img"), tiles, bytes, true, store_tiles));
    add(11, reading("plain", tiles, bytes,
                    [](const file &in, const geometry &of, const window &run, std::uint8_t *to) {
                        in.read(to, count_of(run.nlines) * of.tile_bytes(),
                                of.tile_at(0, count_of(run.line)));
                    }));
    add(11, reading("mapped", tiles, bytes,
                    [](const file &in, const geometry &of, const window &run, std::uint8_t *to) {
                        std::memcpy(to, in.bytes + of.tile_at(0, count_of(run.line)),
                                    count_of(run.nlines) * of.tile_bytes());
                    }));
    const std::string small = at.path("small.img");
    add(12, {.name = "plain", .is_limit = true, .move = [=](const window &, std::uint8_t *buffer) {
                 read_header(small, buffer);
             }});
    add(12, {.name = "mapped", .is_limit = true, .move = [=](const window &, std::uint8_t *buffer) {
                 store_geometry(file(small, O_RDONLY, true).bytes, buffer);
             }});
}
