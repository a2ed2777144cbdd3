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

std::string disk_name(const std::string &name)
{
    return name.substr(0, name.find('@'));
}

transfer decoded(fuzz_input &in, const test_geometry &image)
{
    const tile_grid grid = tiles_of(image);
    transfer it{.writes = in.below(2) == 1};
    it.tiles = in.below(4) == 3;
    it.band = in.near(image.nbands);
    it.line = in.near(it.tiles ? static_cast<std::int32_t>(grid.across * grid.down) : image.nlines);
    it.nlines = in.near(it.tiles ? 4 : 24);
    it.samp = in.near(image.nsamps);
    it.nsamps = in.near(24);
    const std::int32_t slack = it.tiles ? 0 : in.below(4);
    it.stride = slack < 3 ? std::min(it.nsamps, INT32_MAX - 3) + slack : in.number();
    return it;
}

// Samples of the caller's buffer from the first to the last.
std::int64_t span_of(const transfer &request, const test_geometry &image)
{
    const tile_grid grid = tiles_of(image);
    if (request.tiles) return request.nlines * (grid.height != 0 ? grid.height * grid.width : 1);
    return (std::int64_t{request.nlines} - 1) * request.pitch() + request.nsamps;
}

// Returns -1 when the call is to be refused, 0 when it is to move nothing, and 1 else.
std::int32_t verdict(const transfer &request, const open_image &image)
{
    if (image.file.empty() || (request.writes && (image.oflags & 3) == IMG_OPEN_READ_ONLY))
        return -1;
    const std::int32_t wanted = verdict_on(request, image.in_file.image);
    return wanted == 1 && span_of(request, image.in_file.image) > MOST ? -1 : wanted;
}

// Requires that a load left in the buffer what the file holds, as far as it goes.
void check_load(const transfer &request, file_model expected, const bytes &buffer,
                std::int32_t result)
{
    bytes all(buffer.size(), UNTOUCHED);
    require(result == expected.load(request, all.begin()), "what the file holds can be loaded");
    require(buffer == all, "a load delivers what the file holds");
}

// Requires that the file holds what a dump wrote and else what it held; after one that failed,
// each byte either.
void check_dump(const transfer &request, const file_model &old, const bytes &buffer,
                std::int32_t result, const bytes &file)
{
    file_model expected = old;
    expected.dump(request, buffer.data(), {0, 0});
    bytes before = old.content;
    require(file.size() >= before.size(), "a dump shortens no file");
    before.resize(file.size());
    require(result == -1 || file.size() == expected.content.size(),
            "what is written is in the file, and no more");
    expected.content.resize(file.size());
    for (std::size_t at = 0; at < file.size(); ++at)
        require(file[at] == expected.content[at] || (result == -1 && file[at] == before[at]),
                "a file holds what was written, and else its old bytes");
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
    const bool vitec = in.below(4) != 3;
    test_geometry image{
        .nlines = in.near(40), .nsamps = in.near(40), .nbands = in.near(4), .nbytes = in.near(3)};
    if (vitec) image.tile_nsamps = tile_size();
    if (vitec) image.tile_nlines = tile_size();
    const std::int32_t type = vitec ? IMG_TYPE_VITEC : IMG_TYPE_HELAVA;
    const bool possible = name.ends_with("@memory") &&
                          can_be_created(image, type, vitec ? VITEC_HEADER : 0) &&
                          (vitec || stored_bytes(image) + HELAVA_TRAILER <= DISK_FILE_SIZE);
    const img_handle handle =
        img_createfile(name.c_str(), image.nlines, image.nsamps, image.nbands, type,
                       image.tile_nsamps, image.tile_nlines, image.nbytes);
    require(handle == (possible ? next : -1) || (faulty && handle == -1),
            "images that can be stored are created, and no others");
    if (handle == -1) return {};
    open_image made = checked_image(handle, IMG_OPEN_READ_WRITE, disk_name(name));
    require(std::memcmp(&made.in_file.image, &image, offsetof(test_geometry, layout)) == 0,
            "an image is created as it was asked for");
    return made;
}

void checked_transfer(fuzz_input &in, const open_image &image, bool faulty)
{
    const bytes &file = disk.files[image.file];
    file_model old = image.in_file;
    old.content = file;
    const transfer it = decoded(in, old.image);
    const std::int32_t wanted = verdict(it, image);
    const std::int64_t span = span_of(it, old.image);
    const bool fits = span > 0 && span <= MOST;
    bytes buffer(fits ? static_cast<std::size_t>(span * old.image.nbytes) : 0, UNTOUCHED);
    if (it.writes) {
        if (static_cast<std::size_t>(old.data_offset) + stored_bytes(old.image) > DISK_FILE_SIZE)
            return;
        const std::int32_t step = in.byte();
        for (std::size_t i = 0; i < buffer.size(); ++i)
            buffer[i] = static_cast<std::uint8_t>(i * static_cast<std::size_t>(step) + 1);
    }
    const bytes before = buffer;
    const std::int32_t result =
        carry_out(image.handle, it, buffer.data(), it.writes ? nullptr : &FILL);
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
