// libtiff, with the files of the scene as TIFF: strips and tiles as the tasks have them, read whole
// and cut to the window, for it keeps none.
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

std::string make_file(const scene &at, bool tiled)
{
    const std::string path = at.path(tiled ? "tiles.tif" : "strips.tif");
    const image out = create(at, path, tiled ? at.tile : 0, at.tile);
    std::vector<std::uint8_t> strip;
    for (std::int32_t line = 0; line < at.side; line += at.tile) {
        strip.clear();
        for (std::int32_t i = 0; i < at.tile; ++i) {
            const auto samples = line_of_bytes(at, line + i);
            strip.insert(strip.end(), samples.begin(), samples.end());
        }
        write(out, at, tiled, {line, 0, at.tile, at.side}, strip.data());
    }
    return path;
}

// Reads all tiles that a window touches, and copies what it needs of them.
void read_tiles(const image &in, const scene &at, const window &each, std::uint8_t *to)
{
    const std::int32_t width = at.tile;
    static std::vector<std::uint8_t> tile;
    tile.resize(count_of(width) * count_of(width));
    for (std::int32_t top = each.line / width * width; top < each.line + each.nlines; top += width)
        for (std::int32_t left = each.samp / width * width; left < each.samp + each.nsamps;
             left += width) {
            TIFFReadTile(in.get(), tile.data(), static_cast<std::uint32_t>(left),
                         static_cast<std::uint32_t>(top), 0, 0);
            const std::int32_t first = std::max(left, each.samp);
            const std::int32_t count = std::min(left + width, each.samp + each.nsamps) - first;
            for (std::int32_t line = std::max(top, each.line);
                 line < std::min(top + width, each.line + each.nlines); ++line)
                std::memcpy(to + count_of(line - each.line) * count_of(each.nsamps) +
                                count_of(first - each.samp),
                            &tile[count_of(line - top) * count_of(width) + count_of(first - left)],
                            count_of(count));
        }
}

void read_lines(const image &in, const window &each, std::uint8_t *to)
{
    for (std::int32_t i = 0; i < each.nlines; ++i)
        TIFFReadScanline(in.get(), to + count_of(i) * count_of(each.nsamps),
                         static_cast<std::uint32_t>(each.line + i), 0);
}

}  // namespace

void add_libtiff(const scene &at, std::vector<task> &tasks)
{
    const image strips = open(make_file(at, false), "r"), tiles = open(make_file(at, true), "r");
    tasks[2].candidates.push_back(
        {.name = "libtiff", .move = [=](const window &each, std::uint8_t *buffer) {
             read_lines(strips, each, buffer);
         }});
    for (const std::size_t i : {3U, 4U})
        tasks[i].candidates.push_back(
            {.name = "libtiff", .move = [=](const window &each, std::uint8_t *buffer) {
                 read_tiles(tiles, at, each, buffer);
             }});
    tasks[7].candidates.push_back(creating(at, false));
    tasks[8].candidates.push_back(creating(at, true));
    tasks[10].candidates.push_back(
        {.name = "libtiff", .move = [=](const window &run, std::uint8_t *buffer) {
             const std::size_t size = count_of(at.tile) * count_of(at.tile);
             for (std::int32_t i = 0; i < run.nlines; ++i)
                 TIFFReadRawTile(tiles.get(), static_cast<std::uint32_t>(run.line + i),
                                 buffer + count_of(i) * size, static_cast<tmsize_t>(size));
         }});
}
