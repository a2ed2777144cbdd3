// libtiff, for tasks that move whole strips or tiles: it has no cache to cut windows from. Read
// task.h first.
#include "task.h"

#include "base/count.h"

#include <algorithm>
#include <cstring>
#include <stdexcept>
#include <tiffio.h>

namespace {

using image = std::shared_ptr<TIFF>;

image open(const std::string &path, const char *mode)
{
    TIFF *const opened = TIFFOpen(path.c_str(), mode);
    if (opened == nullptr) throw std::runtime_error("cannot open " + path);
    return {opened, TIFFClose};
}

// Begins an image of one-byte samples; `tile` 0: in strips.
image create(const image_set &images, const std::string &path, std::int32_t tile,
             std::int32_t strip_lines)
{
    image out = open(path, "w");
    TIFFSetField(out.get(), TIFFTAG_IMAGEWIDTH, images.side);
    TIFFSetField(out.get(), TIFFTAG_IMAGELENGTH, images.side);
    TIFFSetField(out.get(), TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(out.get(), TIFFTAG_SAMPLESPERPIXEL, 1);
    TIFFSetField(out.get(), TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_MINISBLACK);
    if (tile != 0) {
        TIFFSetField(out.get(), TIFFTAG_TILEWIDTH, tile);
        TIFFSetField(out.get(), TIFFTAG_TILELENGTH, tile);
    } else {
        TIFFSetField(out.get(), TIFFTAG_ROWSPERSTRIP, strip_lines);
    }
    return out;
}

// Writes a strip of the image, as tiles or as one strip.
void write(const image &out, const image_set &images, bool tiled, const request &strip,
           std::uint8_t *buffer)
{
    if (!tiled) {
        const auto size = static_cast<tmsize_t>(img_count(strip.nlines) * img_count(strip.nsamps));
        TIFFWriteRawStrip(out.get(), static_cast<std::uint32_t>(strip.line / strip.nlines), buffer,
                          size);
        return;
    }
    const std::size_t width = img_count(images.tile);
    static std::vector<std::uint8_t> tile;
    tile.resize(width * width);
    for (std::size_t samp = 0; samp < img_count(images.side); samp += width) {
        for (std::size_t i = 0; i < width; ++i)
            std::memcpy(&tile[i * width], buffer + i * img_count(images.side) + samp, width);
        const std::uint32_t number = TIFFComputeTile(out.get(), static_cast<std::uint32_t>(samp),
                                                     static_cast<std::uint32_t>(strip.line), 0, 0);
        TIFFWriteRawTile(out.get(), number, tile.data(), static_cast<tmsize_t>(tile.size()));
    }
}

candidate creating(const image_set &images, bool tiled)
{
    const std::string path = images.path("libtiff.tif");
    const auto out = std::make_shared<image>();
    return {.name = "libtiff",
            .move = [=](const request &strip,
                        std::uint8_t *buffer) { write(*out, images, tiled, strip, buffer); },
            .begin =
                [=] {
                    std::filesystem::remove(path);
                    *out = create(images, path, tiled ? images.tile : 0,
                                  std::min(images.side, STRIP_LINES));
                },
            .end = [=] { out->reset(); },
            .written = path,
            .skipped = 8,  // its directory comes last
            .samples = img_count(images.side) * img_count(images.side)};
}

std::string make_tiles(const image_set &images)
{
    std::string path = images.path("tiles.tif");
    const image out = create(images, path, images.tile, 0);
    std::vector<std::uint8_t> strip;
    for (std::int32_t line = 0; line < images.side; line += images.tile) {
        strip.clear();
        for (std::int32_t i = 0; i < images.tile; ++i) {
            const auto samples = line_of_bytes(images, line + i);
            strip.insert(strip.end(), samples.begin(), samples.end());
        }
        write(out, images, true, {line, 0, images.tile, images.side}, strip.data());
    }
    return path;
}

}  // namespace

void add_libtiff(const image_set &images, std::vector<task> &tasks)
{
    add_candidate(tasks, "T8", creating(images, false));
    add_candidate(tasks, "T9", creating(images, true));
    add_candidate(tasks, "T11",
                  {.name = "libtiff",
                   .move = [tiles = open(make_tiles(images), "r"),
                            size = img_count(images.tile) * img_count(images.tile)](
                               const request &run, std::uint8_t *buffer) {
                       for (std::int32_t i = 0; i < run.nlines; ++i)
                           TIFFReadRawTile(tiles.get(), static_cast<std::uint32_t>(run.line + i),
                                           buffer + img_count(i) * size,
                                           static_cast<tmsize_t>(size));
                   }});
}
