#include "checked_image.h"

#include "api/library.h"
#include "base/id_pool.h"
#include "base/image_table.h"
#include "base/img_desc.h"
#include "chain/chain_links.h"
#include "imgfile/img.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <optional>
#include <unistd.h>

namespace {

constexpr std::int64_t MOST = 1 << 14;  // samples of a buffer; for more a null pointer is passed

// A window; or tiles, as the lines of one, each of all samples of its plane.
struct transfer {
    bool writes, tiles;
    std::int32_t band, line, samp, nlines, nsamps, stride;
    std::int64_t span() const { return (std::int64_t{nlines} - 1) * stride + nsamps; }
};

std::string disk_name(const std::string &name)
{
    return name.substr(0, name.find('@'));
}

// Returns the image that a file holds, if it holds one.
std::optional<file_image> recognised(const bytes &file)
{
    for (const bool vitec : {true, false})
        for (const bool little_endian : {false, true}) {
            const auto word = [&](std::int64_t at) {
                std::uint32_t value = 0;
                for (std::int64_t i = 0; i < 4; ++i)
                    value = value << 8U |
                            file[static_cast<std::size_t>(at + (little_endian ? 3 - i : i))];
                return static_cast<std::int32_t>(value);
            };
            const std::int64_t length = std::ssize(file), trailer = length - 16;
            file_image it{};
            if (vitec) {
                const std::int64_t block = length < 48 ? length : std::int64_t{word(4)} + 4;
                if (block < 0 || block + 68 > length || word(0) != 0x005B0720 ||
                    word(block + 24) != 7 || word(block + 60) == INT32_MAX)
                    continue;
                it.image = {word(block + 40),     word(block + 36), word(block + 56),
                            word(block + 60) + 1, word(block + 44), word(block + 48)};
                if (has_tiles(it.image)) it.image.layout = IMG_LAYOUT_TILED;
                it.data_offset = block + word(block);
            } else {
                if (trailer < 0 || word(trailer + 12) != 0x48411484) continue;
                it.image = {word(trailer + 8), word(trailer + 4), word(trailer)};
            }
            it.image.swap = little_endian != (std::endian::native == std::endian::little);
            if (is_within_limits(it.image, it.data_offset)) return it;
        }
    return {};
}

transfer decoded(fuzz_input &in, const test_geometry &image, std::int32_t ntiles)
{
    transfer it{in.below(2) == 1, in.below(4) == 3, in.near(image.nbands), 0, 0, 0, 0, 0};
    it.line = in.near(it.tiles ? ntiles : image.nlines);
    it.nlines = in.near(it.tiles ? 4 : 24);
    it.samp = in.near(image.nsamps);
    it.nsamps = in.near(24);
    if (it.tiles) it.nsamps = has_tiles(image) ? image.tile_nlines * image.tile_nsamps : 1;
    const std::int32_t slack = it.tiles ? 0 : in.below(4);
    it.stride = slack < 3 ? std::min(it.nsamps, INT32_MAX - 3) + slack : in.number();
    return it;
}

// Returns -1 when the call is to be refused, 0 when it is to move nothing, and 1 else.
std::int32_t verdict(const transfer &it, const open_image &image, std::int32_t ntiles)
{
    const test_geometry &geometry = image.in_file.image;
    if (image.file.empty() || (it.writes && (image.oflags & 3) == IMG_OPEN_READ_ONLY)) return -1;
    if (it.tiles && (!has_tiles(geometry) || it.nlines < 1)) return 0;
    const std::int64_t end = std::int64_t{it.line} + it.nlines;
    const std::int64_t row = std::int64_t{it.stride} * (it.writes ? geometry.nbytes : 1);
    if (it.band < 0 || it.band >= geometry.nbands || it.nsamps > row ||
        (it.tiles && (it.line < 0 || end > ntiles)))
        return -1;
    if (it.nlines < 1 || it.nsamps < 1) return 0;
    return it.span() <= MOST ? 1 : -1;
}

std::int32_t called(const transfer &it, img_handle handle, std::uint8_t *to)
{
    if (it.tiles)
        return it.writes ? img_dump_tiles(handle, it.line, it.nlines, it.band, to)
                         : img_load_tiles(handle, it.line, it.nlines, it.band, to);
    return (it.writes ? img_dump_buffer(handle, it.line, it.samp, it.nlines, it.nsamps, it.band, to,
                                        it.stride, nullptr)
                      : img_load_buffer(handle, it.line, it.samp, it.nlines, it.nsamps, it.band, to,
                                        it.stride, &FILL));
}

// Requires that a load left in the buffer what the file holds, as far as it goes.
void check_load(const transfer &it, const file_image &file, const bytes &buffer,
                std::int32_t result)
{
    reader expected(file);
    bytes rows, all(buffer.size(), UNTOUCHED);
    if (!it.tiles) rows = expected.window(it.band, it.line, it.samp, it.nlines, it.nsamps);
    for (std::int32_t i = 0; it.tiles && i < it.nlines && !expected.fell_short(); ++i)
        std::ranges::copy(expected.tile(it.band, it.line + i), std::back_inserter(rows));
    const std::int64_t length = std::int64_t{it.nsamps} * file.image.nbytes;
    for (std::int64_t at = 0; at < std::ssize(rows); at += length)
        std::copy_n(rows.begin() + at, length, all.begin() + at / it.nsamps * it.stride);
    require(result == (expected.fell_short() ? -1 : 0), "what the file holds can be loaded");
    require(buffer == all, "a load delivers what the file holds");
}

// Requires that the file holds what a dump wrote and else what it held; after one that failed,
// each byte either.
void check_dump(const transfer &it, const file_image &old, const bytes &buffer, std::int32_t result,
                const bytes &file)
{
    const test_geometry &image = old.image;
    bytes before = old.content;
    require(file.size() >= before.size(), "a dump shortens no file");
    before.resize(file.size());
    bytes after = before;
    const auto write = [&](std::int64_t line, std::int64_t samp, std::int64_t from,
                           std::int64_t count, std::int64_t exchange) {
        const auto at =
            static_cast<std::size_t>(old.data_offset) + stored_at(image, it.band, line, samp);
        require(result == -1 || at + static_cast<std::size_t>(count) <= file.size(),
                "what is written is in the file");
        for (std::int64_t k = 0; k < count && at + static_cast<std::size_t>(k) < file.size(); ++k)
            after[at + static_cast<std::size_t>(k)] =
                buffer[static_cast<std::size_t>(from * image.nbytes + (k ^ exchange))];
    };
    const std::int64_t across =
        it.tiles ? stored_extent(image.nsamps, image.tile_nsamps) / image.tile_nsamps : 1;
    for (std::int64_t i = 0; i < it.nlines; ++i) {
        const std::int64_t line = it.line + i;
        if (it.tiles)
            write(line / across * image.tile_nlines, line % across * image.tile_nsamps,
                  i * it.nsamps, std::int64_t{it.nsamps} * image.nbytes, 0);
        for (std::int64_t j = 0; !it.tiles && j < it.nsamps; ++j)
            if (const std::int64_t samp = it.samp + j;
                line >= 0 && samp >= 0 && line < image.nlines && samp < image.nsamps)
                write(line, samp, i * it.stride + j, image.nbytes,
                      image.swap != 0 ? image.nbytes - 1 : 0);
    }
    for (std::size_t at = 0; at < file.size(); ++at)
        require(file[at] == after[at] || (result == -1 && file[at] == before[at]),
                "a file holds what was written, and else what it held");
}

// Returns the model of an image that was just opened, once it has answered as its file does.
open_image checked_image(img_handle handle, std::int32_t oflags, const std::string &file)
{
    const auto it = recognised(disk.files[file]);
    require(it.has_value(), "what is opened is an image");
    test_geometry seen = it->image;
    img_query_dimension(handle, &seen.nlines, &seen.nsamps);
    img_query_tile_size(handle, &seen.tile_nsamps, &seen.tile_nlines);
    seen.nbands = img_query_num_bands(handle);
    require(std::memcmp(&seen, &it->image, sizeof seen) == 0, "queries answer what the file says");
    std::array<std::uint8_t, 64> window;
    img_load_buffer(handle, 0, 0, 8, 8, 0, window.data(), 8, nullptr);
    img_chain_init(handle);  // from now on two-byte samples are delivered as they are
    return {handle, oflags, file, *it};
}

}  // namespace

void require(bool holds, const char *what)
{
    if (holds) return;
    dprintf(STDERR_FILENO, "Not so: %s\n", what);
    std::abort();
}

fuzz_run::fuzz_run()
{
    // The stream alone is replaced: fuzzer and sanitizers write to the descriptor.
    static std::FILE *const nowhere = stderr = std::fopen("/dev/null", "w");
    require(nowhere != nullptr, "/dev/null can be written");
    img_library_init();
    memory_disk_register();
    img_pool_free(img_handle_pool);
    img_handle_pool = img_pool_create(0, IMG_MAX_HANDLES);
    disk = {};
}

fuzz_run::~fuzz_run()
{
    disk.faults.clear();
    for (img_handle handle = 0; handle < IMG_MAX_HANDLES; ++handle) {
        img_chain_init(handle);
        img_closefile(handle);
    }
    require(disk.open_descriptors == 0, "every descriptor is closed");
}

open_image checked_open(const std::string &name, std::int32_t oflags, img_handle next, bool faulty)
{
    errno = 0;
    const img_handle handle = img_openfile(name.c_str(), oflags);
    require(handle != -1 || errno == (next == -1 ? 24 : 22),
            "a refusal leaves its number in errno");
    const auto found = disk.files.find(disk_name(name));
    const bool possible =
        (oflags & 1) == 0 && found != disk.files.end() && recognised(found->second);
    require(handle == (possible ? next : -1) || (faulty && handle == -1),
            "files that hold an image are opened, and no others");
    return handle == -1 ? open_image{} : checked_image(handle, oflags, found->first);
}

open_image checked_create(fuzz_input &in, const std::string &name, img_handle next, bool faulty)
{
    const auto tile_size = [&in] { return in.below(8) == 7 ? in.number() : in.below(5) / 2 * 8; };
    const auto is_tile_size = [](std::int32_t size) {
        return size == 0 || (size >= 8 && std::has_single_bit(static_cast<std::uint16_t>(size)));
    };
    const bool vitec = in.below(4) != 3;
    test_geometry image{in.near(40), in.near(40), in.near(4), in.near(3)};
    if (vitec) image.tile_nsamps = tile_size();
    if (vitec) image.tile_nlines = tile_size();
    bool possible = name.ends_with("@memory") && is_within_limits(image, vitec ? 244 : 0);
    if (vitec)
        possible = possible && image.nbands < 4 && is_tile_size(image.tile_nsamps) &&
                   is_tile_size(image.tile_nlines);
    else
        possible = possible && image.nbytes == 1 && stored_bytes(image) + 16 <= DISK_FILE_SIZE;
    const img_handle handle = img_createfile(name.c_str(), image.nlines, image.nsamps, image.nbands,
                                             vitec ? IMG_TYPE_VITEC : IMG_TYPE_HELAVA,
                                             image.tile_nsamps, image.tile_nlines, image.nbytes);
    require(handle == (possible ? next : -1) || (faulty && handle == -1),
            "images that can be stored are created, and no others");
    if (handle == -1) return {};
    const open_image made = checked_image(handle, IMG_OPEN_READ_WRITE, disk_name(name));
    require(std::memcmp(&made.in_file.image, &image, offsetof(test_geometry, layout)) == 0,
            "an image is created as it was asked for");
    return made;
}

void checked_transfer(fuzz_input &in, const open_image &image, bool faulty)
{
    const bytes &file = disk.files[image.file];
    file_image old = image.in_file;
    old.content = file;
    const std::int32_t ntiles = reader(old).ntiles();
    const transfer it = decoded(in, old.image, ntiles);
    const std::int32_t wanted = verdict(it, image, ntiles);
    const bool fits = it.span() > 0 && it.span() <= MOST;
    bytes buffer(fits ? static_cast<std::size_t>(it.span() * old.image.nbytes) : 0, UNTOUCHED);
    if (it.writes) {
        if (static_cast<std::size_t>(old.data_offset) + stored_bytes(old.image) > DISK_FILE_SIZE)
            return;
        const std::int32_t step = in.byte();
        for (std::size_t i = 0; i < buffer.size(); ++i)
            buffer[i] = static_cast<std::uint8_t>(i * static_cast<std::size_t>(step) + 1);
    }
    const bytes before = buffer;
    const std::int32_t result = called(it, image.handle, buffer.data());
    require(buffer == before || !it.writes, "a dump leaves the buffer as it is");
    require(file == old.content || it.writes, "a load leaves the file as it is");
    if (wanted < 1)
        return require(result == wanted && buffer == before && file == old.content,
                       "a call that moves nothing answers why");
    if (it.writes) {
        require(result == 0 || faulty, "what fits the disk can be written");
        check_dump(it, old, buffer, result, file);
    } else if (result == 0 || !faulty) {
        check_load(it, old, buffer, result);
    }
}

void checked_close(const open_image &image, bool faulty)
{
    const bytes &file = disk.files[image.file];
    bytes before = file;
    require(img_closefile(image.handle) == 0, "a close answers 0");
    std::size_t length =
        static_cast<std::size_t>(image.in_file.data_offset) + stored_bytes(image.in_file.image);
    if ((image.oflags & 2) == 0 || length > DISK_FILE_SIZE) length = 0;
    if (faulty) length = std::min(length, file.size());
    before.resize(std::max(before.size(), length));
    require(file == before, "a close completes the file, and changes no sample");
}
