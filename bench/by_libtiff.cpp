// libtiff, where whole strips and tiles move; it keeps none that windows could be cut from.
#include "task.h"

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
image create(const scene &at, const std::string &path, std::int32_t tile, std::int32_t strip_lines)
{
    image out = open(path, "w");
    TIFFSetField(out.get(), TIFFTAG_IMAGEWIDTH, at.side);
    TIFFSetField(out.get(), TIFFTAG_IMAGELENGTH, at.side);
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

std::size_t count_of(std::int32_t extent)
{
    return static_cast<std::size_t>(extent);
}

// Writes a strip of the image, in the tiles that it fills or as the strip that it is.
void write(const image &out, const scene &at, bool tiled, const window &each, std::uint8_t *buffer)
{
    if (!tiled) {
        const auto size = static_cast<tmsize_t>(count_of(each.nlines) * count_of(each.nsamps));
        TIFFWriteRawStrip(out.get(), static_cast<std::uint32_t>(each.line / each.nlines), buffer,
                          size);
        return;
    }
    const std::size_t width = count_of(at.tile);
    static std::vector<std::uint8_t> tile;
    tile.resize(width * width);
    for (std::size_t samp = 0; samp < count_of(at.side); samp += width) {
        for (std::size_t i = 0; i < width; ++i)
            std::memcpy(&tile[i * width], buffer + i * count_of(at.side) + samp, width);
        const std::uint32_t number = TIFFComputeTile(out.get(), static_cast<std::uint32_t>(samp),
                                                     static_cast<std::uint32_t>(each.line), 0, 0);
        TIFFWriteRawTile(out.get(), number, tile.data(), static_cast<tmsize_t>(tile.size()));
    }
}

candidate creating(const scene &at, bool tiled)
{
    const std::string path = at.path("libtiff.tif");
    const auto out = std::make_shared<image>();
    return {.name = "libtiff",
            .move = [=](const window &each,
                        std::uint8_t *buffer) { write(*out, at, tiled, each, buffer); },
            .begin =
                [=] {
                    std::filesystem::remove(path);
                    *out = create(at, path, tiled ? at.tile : 0, std::min(at.side, 512));
                },
            .end = [=] { out->reset(); },
            .written = path,
            .skipped = 8,  // its directory comes last
            .samples = count_of(at.side) * count_of(at.side)};
}

std::string make_tiles(const scene &at)
{
    const std::string path = at.path("tiles.tif");
    const image out = create(at, path, at.tile, 0);
    std::vector<std::uint8_t> strip;
    for (std::int32_t line = 0; line < at.side; line += at.tile) {
        strip.clear();
        for (std::int32_t i = 0; i < at.tile; ++i) {
            const auto samples = line_of_bytes(at, line + i);
            strip.insert(strip.end(), samples.begin(), samples.end());
        }
        write(out, at, true, {line, 0, at.tile, at.side}, strip.data());
    }
    return path;
}

}  // namespace

void add_libtiff(const scene &at, std::vector<task> &tasks)
{
    tasks[7].candidates.push_back(creating(at, false));
    tasks[8].candidates.push_back(creating(at, true));
    tasks[10].candidates.push_back(
        {.name = "libtiff",
         .move = [tiles = open(make_tiles(at), "r"), size = count_of(at.tile) * count_of(at.tile)](
                     const window &run, std::uint8_t *buffer) {
             for (std::int32_t i = 0; i < run.nlines; ++i)
                 TIFFReadRawTile(tiles.get(), static_cast<std::uint32_t>(run.line + i),
                                 buffer + count_of(i) * size, static_cast<tmsize_t>(size));
         }});
}
