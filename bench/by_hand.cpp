// The limits: each task written by hand, once with plain system calls and once on mappings of the
// files. Read task.h first.
#include "stretch_by_hand.h"
#include "task.h"

#include "base/count.h"

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

// An open file, mapped on request; closed with the object.
struct file {
    int fd;
    std::uint8_t *bytes = nullptr;
    std::size_t size = 0;

    // `flags` as for open(). A `new_size` other than 0 sets the file's length before it is mapped.
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
        void *const mapping = ::mmap(nullptr, size, rights, MAP_SHARED, fd, 0);
        if (mapping == MAP_FAILED) throw std::runtime_error("cannot map " + path);
        bytes = static_cast<std::uint8_t *>(mapping);
    }
    ~file()
    {
        if (bytes != nullptr) ::munmap(bytes, size);
        ::close(fd);
    }
    file(const file &) = delete;
    file &operator=(const file &) = delete;

    void read(void *buffer, std::size_t count, std::size_t offset) const
    {
        if (::pread(fd, buffer, count, static_cast<off_t>(offset)) != static_cast<ssize_t>(count))
            throw std::runtime_error("a read was short");
    }
    void write(const void *buffer, std::size_t count, std::size_t offset) const
    {
        if (::pwrite(fd, buffer, count, static_cast<off_t>(offset)) != static_cast<ssize_t>(count))
            throw std::runtime_error("a write was short");
    }
};

// Working memory at the start of a page, kept between windows.
std::uint8_t *kept(std::size_t size)
{
    struct deleter {
        void operator()(void *memory) const { ::operator delete (memory, std::align_val_t{PAGE}); }
    };
    static std::unique_ptr<void, deleter> memory;
    static std::size_t room = 0;
    if (room < size) {
        room = size;
        memory.reset(::operator new (room, std::align_val_t{PAGE}));
    }
    return static_cast<std::uint8_t *>(memory.get());
}

// --- Offsets of the parts of a window ---

struct geometry {
    std::size_t side, tile, width;  // of the image and of a tile, in samples; bytes per sample

    std::size_t line_offset(std::int32_t line, std::int32_t samp) const
    {
        return IMG_VITEC_DATA_OFFSET + (img_count(line) * side + img_count(samp)) * width;
    }
    std::size_t tile_bytes() const { return tile * tile * width; }
    std::size_t tile_offset(std::size_t row, std::size_t col) const
    {
        return IMG_VITEC_DATA_OFFSET + (row * (side / tile) + col) * tile_bytes();
    }
};

// The part of a window that lies in one tile.
struct tile_part {
    std::size_t row, col;            // of the tile
    std::size_t in_tile, in_window;  // index of the first sample in the tile and in the window
    std::size_t nlines, nsamps;
};

// Calls `visit` with each part of a window.
template <typename Visit>
void for_each_tile(const geometry &image, const request &window, Visit visit)
{
    const std::size_t top = img_count(window.line), left = img_count(window.samp);
    const std::size_t bottom = top + img_count(window.nlines),
                      right = left + img_count(window.nsamps);
    for (std::size_t row = top / image.tile; row * image.tile < bottom; ++row)
        for (std::size_t col = left / image.tile; col * image.tile < right; ++col) {
            const std::size_t line = std::max(top, row * image.tile),
                              samp = std::max(left, col * image.tile);
            visit(tile_part{.row = row,
                            .col = col,
                            .in_tile =
                                (line - row * image.tile) * image.tile + samp - col * image.tile,
                            .in_window = (line - top) * img_count(window.nsamps) + samp - left,
                            .nlines = std::min(bottom, (row + 1) * image.tile) - line,
                            .nsamps = std::min(right, (col + 1) * image.tile) - samp});
        }
}

// Calls `visit(i, row)` for each of `nrows` rows, `pitch` bytes apart. Prefetches the rows after
// it, because each lies on a page of its own.
template <typename Visit>
void for_each_row(const std::uint8_t *first, std::size_t pitch, std::size_t nrows,
                  std::size_t length, Visit visit)
{
    const std::size_t ahead = length < 1024 ? 8 : 4;  // more would evict each other
    for (std::size_t i = 0; i < nrows; ++i) {
        if (i + ahead < nrows)
            for (std::size_t k = 0; k < std::min<std::size_t>(length, 2048); k += 64)
                __builtin_prefetch(first + (i + ahead) * pitch + k);
        visit(i, first + i * pitch);
    }
}

// --- Reading ---

void read_lines(const file &in, const geometry &image, const request &window, std::uint8_t *buffer)
{
    const std::size_t length = img_count(window.nsamps) * image.width;
    if (window.nsamps == static_cast<std::int32_t>(image.side))
        return in.read(buffer, length * img_count(window.nlines),
                       image.line_offset(window.line, 0));
    for (std::int32_t i = 0; i < window.nlines; ++i)
        in.read(buffer + img_count(i) * length, length,
                image.line_offset(window.line + i, window.samp));
}

void copy_lines(const file &in, const geometry &image, const request &window, std::uint8_t *buffer)
{
    const std::size_t length = img_count(window.nsamps);
    const std::uint8_t *const first = in.bytes + image.line_offset(window.line, window.samp);
    if (length == image.side) {  // one piece needs no prefetch
        std::memcpy(buffer, first, length * img_count(window.nlines));
        return;
    }
    for_each_row(
        first, image.side, img_count(window.nlines), length,
        [=](std::size_t i, const auto *row) { std::memcpy(buffer + i * length, row, length); });
}

void read_tiles(const file &in, const geometry &image, const request &window, std::uint8_t *buffer)
{
    auto *const lines = kept(image.tile_bytes());
    const std::size_t pitch = image.tile * image.width;
    for_each_tile(image, window, [&](const tile_part &part) {
        const std::size_t skipped = part.in_tile / image.tile * pitch;  // lines above the window
        in.read(lines, part.nlines * pitch, image.tile_offset(part.row, part.col) + skipped);
        for (std::size_t i = 0; i < part.nlines; ++i)
            std::memcpy(buffer + (part.in_window + i * img_count(window.nsamps)) * image.width,
                        lines + i * pitch + (part.in_tile % image.tile) * image.width,
                        part.nsamps * image.width);
    });
}

void copy_tiles(const file &in, const geometry &image, const request &window, std::uint8_t *buffer)
{
    for_each_tile(image, window, [&](const tile_part &part) {
        for_each_row(in.bytes + image.tile_offset(part.row, part.col) + part.in_tile, image.tile,
                     part.nlines, part.nsamps, [&](std::size_t i, const auto *line) {
                         std::memcpy(buffer + part.in_window + i * img_count(window.nsamps), line,
                                     part.nsamps);
                     });
    });
}

// A stretch goes over the samples twice: the first time it counts them, the second time, now from
// the processor's caches, it looks them up.
void stretch_tiles(const file &in, const geometry &image, const request &window,
                   std::uint8_t *buffer)
{
    const std::size_t width = img_count(window.nsamps), pitch = image.tile * 2;
    sample_counts &counts = new_counts();
    for_each_tile(image, window, [&](const tile_part &part) {
        for_each_row(in.bytes + image.tile_offset(part.row, part.col) + part.in_tile * 2, pitch,
                     part.nlines, part.nsamps * 2, [&](std::size_t /*i*/, const auto *line) {
                         count_by_hand(line, part.in_window % width, part.nsamps, std::endian::big,
                                       counts);
                     });
    });
    const value_table &table = stretch_table(counts);
    for_each_tile(image, window, [&](const tile_part &part) {
        const std::uint8_t *const first =
            in.bytes + image.tile_offset(part.row, part.col) + part.in_tile * 2;
        for (std::size_t i = 0; i < part.nlines; ++i)
            look_up(first + i * pitch, part.nsamps, std::endian::big, table,
                    buffer + part.in_window + i * width);
    });
}

void stretch_lines(const file &in, const geometry &image, const request &window,
                   std::uint8_t *buffer)
{
    const std::size_t width = img_count(window.nsamps), pitch = image.side * 2;
    const std::uint8_t *const first = in.bytes + image.line_offset(window.line, window.samp);
    sample_counts &counts = new_counts();
    for_each_row(first, pitch, img_count(window.nlines), width * 2,
                 [&](std::size_t /*i*/, const auto *line) {
                     count_by_hand(line, 0, width, std::endian::big, counts);
                 });
    const value_table &table = stretch_table(counts);
    for (std::size_t i = 0; i < img_count(window.nlines); ++i)
        look_up(first + i * pitch, width, std::endian::big, table, buffer + i * width);
}

using transfer = void (*)(const file &in, const geometry &image, const request &asked,
                          std::uint8_t *buffer);

// Reads the samples as stored, and then stretches them.
template <transfer read>
void read_and_stretch(const file &in, const geometry &image, const request &window,
                      std::uint8_t *buffer)
{
    const std::size_t width = img_count(window.nsamps), pitch = width * 2;
    static std::vector<std::uint8_t> samples;
    samples.resize(img_count(window.nlines) * pitch);
    read(in, image, window, samples.data());
    sample_counts &counts = new_counts();
    for (std::size_t i = 0; i < samples.size(); i += pitch)
        count_by_hand(&samples[i], 0, width, std::endian::big, counts);
    look_up(samples.data(), samples.size() / 2, std::endian::big, stretch_table(counts), buffer);
}

void read_tile_run(const file &in, const geometry &image, const request &run, std::uint8_t *buffer)
{
    in.read(buffer, img_count(run.nlines) * image.tile_bytes(),
            image.tile_offset(0, img_count(run.line)));
}

void copy_tile_run(const file &in, const geometry &image, const request &run, std::uint8_t *buffer)
{
    std::memcpy(buffer, in.bytes + image.tile_offset(0, img_count(run.line)),
                img_count(run.nlines) * image.tile_bytes());
}

// --- Writing ---

// Writes a strip of whole tiles with one call, which gives the file larger pages than several short
// calls would.
void write_tile_strip(const file &out, const geometry &image, const request &window,
                      const std::uint8_t *buffer)
{
    auto *const run = kept(image.side * image.tile);
    for_each_tile(image, window, [&](const tile_part &part) {
        for (std::size_t i = 0; i < part.nlines; ++i)
            std::memcpy(run + part.col * image.tile_bytes() + i * image.tile,
                        buffer + part.in_window + i * image.side, part.nsamps);
    });
    out.write(run, image.side * image.tile,
              image.tile_offset(img_count(window.line) / image.tile, 0));
}

// Writes the lines of tiles that a window touches; reads them first where it covers them in part.
void overlay_tiles(const file &in_out, const geometry &image, const request &window,
                   const std::uint8_t *buffer)
{
    auto *const lines = kept(image.tile_bytes());
    for_each_tile(image, window, [&](const tile_part &part) {
        const std::size_t first =
            image.tile_offset(part.row, part.col) + part.in_tile / image.tile * image.tile;
        if (part.nsamps < image.tile) in_out.read(lines, part.nlines * image.tile, first);
        for (std::size_t i = 0; i < part.nlines; ++i)
            std::memcpy(lines + i * image.tile + part.in_tile % image.tile,
                        buffer + part.in_window + i * img_count(window.nsamps), part.nsamps);
        in_out.write(lines, part.nlines * image.tile, first);
    });
}

void store_tiles(const file &out, const geometry &image, const request &window,
                 const std::uint8_t *buffer)
{
    for_each_tile(image, window, [&](const tile_part &part) {
        for (std::size_t i = 0; i < part.nlines; ++i)
            std::memcpy(out.bytes + image.tile_offset(part.row, part.col) + part.in_tile +
                            i * image.tile,
                        buffer + part.in_window + i * img_count(window.nsamps), part.nsamps);
    });
}

void write_lines(const file &out, const geometry &image, const request &window,
                 const std::uint8_t *buffer)
{
    out.write(buffer, image.side * img_count(window.nlines), image.line_offset(window.line, 0));
}

void store_lines(const file &out, const geometry &image, const request &window,
                 const std::uint8_t *buffer)
{
    std::memcpy(out.bytes + image.line_offset(window.line, 0), buffer,
                image.side * img_count(window.nlines));
}

// --- The candidates ---

using storing = void (*)(const file &out, const geometry &image, const request &window,
                         const std::uint8_t *buffer);

candidate reading(const char *name, const std::string &path, const geometry &image, transfer move)
{
    const auto in = std::make_shared<file>(path, O_RDONLY, true);
    return {
        .name = name, .is_limit = true, .move = [=](const request &window, std::uint8_t *buffer) {
            move(*in, image, window, buffer);
        }};
}

candidate creating(const char *name, const std::string &path, const geometry &image, bool mapped,
                   storing move)
{
    const auto out = std::make_shared<std::unique_ptr<file>>();
    const std::size_t size = IMG_VITEC_DATA_OFFSET + image.side * image.side;
    return {.name = name,
            .is_limit = true,
            .move = [=](const request &window,
                        std::uint8_t *buffer) { move(**out, image, window, buffer); },
            .begin =
                [=] {
                    std::filesystem::remove(path);
                    *out = std::make_unique<file>(path, O_RDWR | O_CREAT | O_TRUNC, mapped, size);
                },
            .end = [=] { out->reset(); },
            .written = path};
}

// Opens and maps the file for each round: pages that an earlier round changed through a mapping,
// and that are still dirty, would be faster than a host can expect.
candidate changing(const char *name, const std::string &path, const std::string &original,
                   const geometry &image, bool mapped, storing move)
{
    std::filesystem::copy_file(original, path);
    const auto out = std::make_shared<std::unique_ptr<file>>();
    return {.name = name,
            .is_limit = true,
            .move = [=](const request &window,
                        std::uint8_t *buffer) { move(**out, image, window, buffer); },
            .begin = [=] { *out = std::make_unique<file>(path, O_RDWR, mapped); },
            .end = [=] { out->reset(); },
            .written = path};
}

// Stores the image's size, tile size and number of bands in the buffer, as the library's queries
// give them.
void store_facts(const std::uint8_t *header, std::uint8_t *buffer)
{
    const auto word = [=](std::size_t offset) {  // in the image block, which is big-endian
        std::uint32_t value;
        std::memcpy(&value, header + sizeof(img_vitec_file_block) + IMG_VITEC_RESERVED + offset,
                    sizeof value);
        return static_cast<std::int32_t>(__builtin_bswap32(value));
    };
    const std::array facts{word(IMG_VITEC_AT_NLINES), word(IMG_VITEC_AT_NSAMPS),
                           word(IMG_VITEC_AT_TILE_NSAMPS), word(IMG_VITEC_AT_TILE_NLINES),
                           word(IMG_VITEC_AT_NBANDS)};
    std::memcpy(buffer, facts.data(), sizeof facts);
}

void read_header(const std::string &path, std::uint8_t *buffer)
{
    std::array<std::uint8_t, IMG_VITEC_DATA_OFFSET> header;
    const file in(path, O_RDONLY, false);
    in.read(header.data(), header.size(), 0);
    store_facts(header.data(), buffer);
}

}  // namespace

void add_limits(const image_set &images, std::vector<task> &tasks)
{
    const geometry bytes{img_count(images.side), img_count(images.tile), 1};
    const geometry words{bytes.side, bytes.tile, 2};
    const std::string lines8 = images.path("lines8.img"), tiles8 = images.path("tiles8.img"),
                      lines16 = images.path("lines16.img"), tiles16 = images.path("tiles16.img");
    for (const char *const name : {"T1", "T2", "T3"}) {
        add_candidate(tasks, name, reading("plain", lines8, bytes, read_lines));
        add_candidate(tasks, name, reading("mapped", lines8, bytes, copy_lines));
    }
    for (const char *const name : {"T4", "T5"}) {
        add_candidate(tasks, name, reading("plain", tiles8, bytes, read_tiles));
        add_candidate(tasks, name, reading("mapped", tiles8, bytes, copy_tiles));
    }
    add_candidate(tasks, "T6", reading("plain", tiles16, words, read_and_stretch<read_tiles>));
    add_candidate(tasks, "T6", reading("mapped", tiles16, words, stretch_tiles));
    add_candidate(tasks, "T7", reading("plain", lines16, words, read_and_stretch<read_lines>));
    add_candidate(tasks, "T7", reading("mapped", lines16, words, stretch_lines));
    const std::string plain = images.path("plain.img"), mapped = images.path("mapped.img");
    add_candidate(tasks, "T8", creating("plain", plain, bytes, false, write_lines));
    add_candidate(tasks, "T8", creating("mapped", mapped, bytes, true, store_lines));
    add_candidate(tasks, "T9", creating("plain", plain, bytes, false, write_tile_strip));
    add_candidate(tasks, "T9", creating("mapped", mapped, bytes, true, store_tiles));
    add_candidate(
        tasks, "T10",
        changing("plain", images.path("plain_changed.img"), tiles8, bytes, false, overlay_tiles));
    add_candidate(
        tasks, "T10",
        changing("mapped", images.path("mapped_changed.img"), tiles8, bytes, true, store_tiles));
    add_candidate(tasks, "T11", reading("plain", tiles8, bytes, read_tile_run));
    add_candidate(tasks, "T11", reading("mapped", tiles8, bytes, copy_tile_run));
    const std::string small = images.path("small.img");
    add_candidate(tasks, "T12",
                  {.name = "plain",
                   .is_limit = true,
                   .move = [=](const request & /*none*/, std::uint8_t *buffer) {
                       read_header(small, buffer);
                   }});
    add_candidate(tasks, "T12",
                  {.name = "mapped",
                   .is_limit = true,
                   .move = [=](const request & /*none*/, std::uint8_t *buffer) {
                       store_facts(file(small, O_RDONLY, true).bytes, buffer);
                   }});
}
