// The library, through its exported functions. Read task.h first.
#include "task.h"

#include "imgfile/img.h"

#include <array>
#include <cstring>
#include <stdexcept>

namespace {

void check(std::int32_t result)
{
    if (result == -1) throw std::runtime_error("a call of the library failed");
}

// An open image, closed with the last copy of the pointer.
std::shared_ptr<const img_handle> opened(const std::string &path, std::int32_t flags)
{
    const img_handle image = img_openfile(path.c_str(), flags);
    check(image);
    return {new img_handle(image), [](const img_handle *handle) {
                img_closefile(*handle);
                delete handle;
            }};
}

candidate reading(const std::string &path)
{
    return {.name = "imgfile",
            .move = [image = opened(path, IMG_OPEN_READ_ONLY)](const request &window,
                                                               std::uint8_t *buffer) {
                check(img_load_buffer(*image, window.line, window.samp, window.nlines,
                                      window.nsamps, 0, buffer, window.nsamps, nullptr));
            }};
}

void dump(img_handle image, const request &window, const std::uint8_t *buffer)
{
    check(img_dump_buffer(image, window.line, window.samp, window.nlines, window.nsamps, 0, buffer,
                          window.nsamps, nullptr));
}

// Creates an image before the requests and closes it afterwards.
candidate creating(const image_set &images, std::int32_t tile)
{
    const std::string path = images.path("imgfile.img");
    const auto image = std::make_shared<img_handle>(-1);
    return {
        .name = "imgfile",
        .move = [=](const request &window, std::uint8_t *buffer) { dump(*image, window, buffer); },
        .begin =
            [=, side = images.side] {
                std::filesystem::remove(path);
                check(*image = img_createfile(path.c_str(), side, side, 1, IMG_TYPE_VITEC, tile,
                                              tile, 1));
            },
        .end = [=] { img_closefile(*image); },
        .written = path};
}

// Opens the image for each round.
candidate changing(const std::string &path)
{
    const auto image = std::make_shared<img_handle>(-1);
    return {
        .name = "imgfile",
        .move = [=](const request &window, std::uint8_t *buffer) { dump(*image, window, buffer); },
        .begin = [=] { check(*image = img_openfile(path.c_str(), IMG_OPEN_READ_WRITE)); },
        .end = [=] { img_closefile(*image); },
        .written = path};
}

}  // namespace

void add_imgfile(const image_set &images, std::vector<task> &tasks)
{
    const std::string lines8 = images.path("lines8.img"), tiles8 = images.path("tiles8.img");
    for (const char *const name : {"T1", "T2", "T3"}) add_candidate(tasks, name, reading(lines8));
    for (const char *const name : {"T4", "T5"}) add_candidate(tasks, name, reading(tiles8));
    add_candidate(tasks, "T6", reading(images.path("tiles16.img")));
    add_candidate(tasks, "T7", reading(images.path("lines16.img")));
    add_candidate(tasks, "T8", creating(images, 0));
    add_candidate(tasks, "T9", creating(images, images.tile));

    const std::string changed = images.path("imgfile_changed.img");
    std::filesystem::copy_file(tiles8, changed);
    add_candidate(tasks, "T10", changing(changed));
    add_candidate(tasks, "T11",
                  {.name = "imgfile",
                   .move = [image = opened(tiles8, IMG_OPEN_READ_ONLY)](const request &run,
                                                                        std::uint8_t *buffer) {
                       check(img_load_tiles(*image, run.line, run.nlines, 0, buffer));
                   }});
    add_candidate(
        tasks, "T12",
        {.name = "imgfile",
         .move = [path = images.path("small.img")](const request & /*none*/, std::uint8_t *buffer) {
             std::array<std::int32_t, 5> facts{};
             const img_handle image = img_openfile(path.c_str(), IMG_OPEN_READ_ONLY);
             check(image);
             auto &[nlines, nsamps, tile_nsamps, tile_nlines, nbands] = facts;
             img_query_dimension(image, &nlines, &nsamps);
             img_query_tile_size(image, &tile_nsamps, &tile_nlines);
             nbands = img_query_num_bands(image);
             std::memcpy(buffer, facts.data(), sizeof facts);
             img_closefile(image);
         }});
}
