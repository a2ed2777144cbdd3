// GDAL, with GeoTIFF files of the scene and a block cache that holds them whole.
#include "stretch_by_hand.h"
#include "task.h"

#include <algorithm>
#include <gdal.h>
#include <stdexcept>

#include <cpl_string.h>

namespace {

using dataset = std::shared_ptr<void>;

dataset keep(GDALDatasetH opened, const std::string &path)
{
    if (opened == nullptr) throw std::runtime_error("GDAL refuses " + path);
    return {opened, GDALClose};
}

void move(const dataset &image, GDALRWFlag way, GDALDataType type, const window &at, void *buffer)
{
    if (GDALRasterIO(GDALGetRasterBand(image.get(), 1), way, at.samp, at.line, at.nsamps, at.nlines,
                     buffer, at.nsamps, at.nlines, type, 0, 0) != CE_None)
        throw std::runtime_error("GDAL cannot move a window");
}

// Creates a file; `tile` 0: in strips of as many lines as a tile has.
dataset create(const scene &at, const std::string &path, bool tiled, GDALDataType type)
{
    const std::string size = std::to_string(at.tile);
    char **options = nullptr;
    options = CSLSetNameValue(options, "TILED", tiled ? "YES" : "NO");
    options = CSLSetNameValue(options, "BLOCKYSIZE", size.c_str());
    if (tiled) options = CSLSetNameValue(options, "BLOCKXSIZE", size.c_str());
    if (type == GDT_UInt16) options = CSLSetNameValue(options, "ENDIANNESS", "BIG");
    GDALDatasetH made =
        GDALCreate(GDALGetDriverByName("GTiff"), path.c_str(), at.side, at.side, 1, type, options);
    CSLDestroy(options);
    return keep(made, path);
}

dataset make_file(const scene &at, const std::string &name, bool tiled, GDALDataType type)
{
    const std::string path = at.path(name);
    {
        const dataset out = create(at, path, tiled, type);
        for (std::int32_t line = 0; line < at.side; ++line) {
            auto bytes = line_of_bytes(at, line);
            auto words = line_of_words(at, line);
            move(out, GF_Write, type, {line, 0, 1, at.side},
                 type == GDT_Byte ? static_cast<void *>(bytes.data()) : words.data());
        }
    }
    return keep(GDALOpen(path.c_str(), GA_ReadOnly), path);
}

candidate reading(const dataset &image)
{
    return {.name = "gdal", .move = [=](const window &at, std::uint8_t *buffer) {
                move(image, GF_Read, GDT_Byte, at, buffer);
            }};
}

candidate stretching(const dataset &image)
{
    return {.name = "gdal", .move = [=](const window &at, std::uint8_t *buffer) {
                const auto nlines = static_cast<std::size_t>(at.nlines);
                const auto nsamps = static_cast<std::size_t>(at.nsamps);
                static std::vector<std::uint16_t> samples;
                samples.resize(nlines * nsamps);
                move(image, GF_Read, GDT_UInt16, at, samples.data());
                sample_counts &counts = new_counts();
                for (std::size_t i = 0; i < samples.size(); i += nsamps)
                    count_by_hand(&samples[i], 0, nsamps, counts);
                stretch_by_hand(samples.data(), samples.size(), counts, buffer);
            }};
}

}  // namespace

void add_gdal(const scene &at, std::vector<task> &tasks)
{
    GDALAllRegister();
    GDALSetCacheMax64(std::int64_t{1} << 30);
    const dataset strips = make_file(at, "gdal_strips.tif", false, GDT_Byte);
    const dataset tiles = make_file(at, "gdal_tiles.tif", true, GDT_Byte);
    for (const std::size_t i : {0U, 1U, 2U}) tasks[i].candidates.push_back(reading(strips));
    for (const std::size_t i : {3U, 4U}) tasks[i].candidates.push_back(reading(tiles));
    tasks[5].candidates.push_back(stretching(make_file(at, "gdal_tiles16.tif", true, GDT_UInt16)));
    tasks[6].candidates.push_back(
        stretching(make_file(at, "gdal_strips16.tif", false, GDT_UInt16)));
}
