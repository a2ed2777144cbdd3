// The library, by the functions that hosts call.
#include "task.h"

#include "img.h"

#include <array>
#include <cstring>
#include <stdexcept>

namespace {

void check(std::int32_t result)
{
    if (result == -1) throw std::runtime_error("a call of the library failed");
}

// An image that stays open as long as someone uses it.
std::shared_ptr<const img_handle> open_image(const std::string &path, std::int32_t flags)
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
            .move = [image = open_image(path, IMG_OPEN_READ_ONLY)](const window &at,
                                                                   std::uint8_t *buffer) {
                check(img_load_buffer(*image, at.line, at.samp, at.nlines, at.nsamps, 0, buffer,
                                      at.nsamps, nullptr));
            }};
}

void dump(img_handle image, const window &at, const std::uint8_t *buffer)
{
    check(img_dump_buffer(image, at.line, at.samp, at.nlines, at.nsamps, 0, buffer, at.nsamps,
                          nullptr));
}

// Creates an image before the windows and closes it afterwards.
candidate creating(const scene &at, std::int32_t tile)
{
    const std::string path = at.path("imgfile.img");
    const auto image = std::make_shared<img_handle>(-1);
    return {.name = "imgfile",
            .move = [=](const window &each, std::uint8_t *buffer) { dump(*image, each, buffer); },
            .begin =
                [=, side = at.side] {
                    std::filesystem::remove(path);
                    check(*image = img_createfile(path.c_str(), side, side, 1, IMG_TYPE_VITEC, tile,
                                                  tile, 1));
                },
            .end = [=] { img_closefile(*image); },
            .written = path};
}

// Opens an image anew for each round.
candidate changing(const std::string &path)
{
    const auto image = std::make_shared<img_handle>(-1);
    return {.name = "imgfile",
            .move = [=](const window &each, std::uint8_t *buffer) { dump(*image, each, buffer); },
            .begin = [=] { check(*image = img_openfile(path.c_str(), IMG_OPEN_READ_WRITE)); },
            .end = [=] { img_closefile(*image); },
            .written = path};
}

}  // namespace

void add_imgfile(const scene &at, std::vector<task> &tasks)
{
    const std::string lines8 = at.path("lines8.img"), tiles8 = at.path("tiles8.img");
    for (const std::size_t i : {0U, 1U, 2U}) tasks[i].candidates.push_back(reading(lines8));
    for (const std::size_t i : {3U, 4U}) tasks[i].candidates.push_back(reading(tiles8));
    tasks[5].candidates.push_back(reading(at.path("tiles16.img")));
    tasks[6].candidates.push_back(reading(at.path("lines16.img")));
    tasks[7].candidates.push_back(creating(at, 0));
    tasks[8].candidates.push_back(creating(at, at.tile));

    const std::string changed = at.path("imgfile_changed.img");
    std::filesystem::copy_file(tiles8, changed);
    tasks[9].candidates.push_back(changing(changed));
    tasks[10].candidates.push_back(
        {.name = "imgfile",
         .move = [image = open_image(tiles8, IMG_OPEN_READ_ONLY)](const window &run,
                                                                  std::uint8_t *buffer) {
             check(img_load_tiles(*image, run.line, run.nlines, 0, buffer));
         }});
    tasks[11].candidates.push_back(
        {.name = "imgfile",
         .move = [path = at.path("small.img")](const window &, std::uint8_t *buffer) {
             std::array<std::int32_t, 5> geometry{};
             const img_handle image = img_openfile(path.c_str(), IMG_OPEN_READ_ONLY);
             check(image);
             img_query_dimension(image, &geometry[0], &geometry[1]);
             img_query_tile_size(image, &geometry[2], &geometry[3]);
             geometry[4] = img_query_num_bands(image);
             std::memcpy(buffer, geometry.data(), sizeof geometry);
             img_closefile(image);
         }});
}
