// GDAL, with the same samples in GeoTIFF files and a block cache that holds whole files. Read
// task.h first.
#include "stretch_by_hand.h"
#include "task.h"

#include "base/count.h"

#include <algorithm>
#include <gdal.h>
#include <stdexcept>

#include <cpl_string.h>

namespace {

using dataset = std::shared_ptr<void>;

dataset owned(GDALDatasetH opened, const std::string &path)
{
    if (opened == nullptr) throw std::runtime_error("GDAL refuses " + path);
    return {opened, GDALClose};
}

void move(const dataset &image, GDALRWFlag way, GDALDataType type, const request &window,
          void *buffer)
{
    if (GDALRasterIO(GDALGetRasterBand(image.get(), 1), way, window.samp, window.line,
                     window.nsamps, window.nlines, buffer, window.nsamps, window.nlines, type, 0,
                     0) != CE_None)
        throw std::runtime_error("GDAL cannot move a window");
}

// Creates a file, in tiles or in strips with as many lines as a tile.
dataset create(const image_set &images, const std::string &path, bool tiled, GDALDataType type)
{
    const std::string size = std::to_string(images.tile);
    char **options = nullptr;
    options = CSLSetNameValue(options, "TILED", tiled ? "YES" : "NO");
    options = CSLSetNameValue(options, "BLOCKYSIZE", size.c_str());
    if (tiled) options = CSLSetNameValue(options, "BLOCKXSIZE", size.c_str());
    if (type == GDT_UInt16) options = CSLSetNameValue(options, "ENDIANNESS", "BIG");
    GDALDatasetH made = GDALCreate(GDALGetDriverByName("GTiff"), path.c_str(), images.side,
                                   images.side, 1, type, options);
    CSLDestroy(options);
    return owned(made, path);
}

dataset make_file(const image_set &images, const std::string &name, bool tiled, GDALDataType type)
{
    const std::string path = images.path(name);
    {
        const dataset out = create(images, path, tiled, type);
        for (std::int32_t line = 0; line < images.side; ++line) {
            auto bytes = line_of_bytes(images, line);
            auto words = line_of_words(images, line);
            move(out, GF_Write, type, {line, 0, 1, images.side},
                 type == GDT_Byte ? static_cast<void *>(bytes.data()) : words.data());
        }
    }
    return owned(GDALOpen(path.c_str(), GA_ReadOnly), path);
}

candidate reading(const dataset &image)
{
    return {.name = "gdal", .move = [=](const request &window, std::uint8_t *buffer) {
                move(image, GF_Read, GDT_Byte, window, buffer);
            }};
}

candidate stretching(const dataset &image)
{
    return {.name = "gdal", .move = [=](const request &window, std::uint8_t *buffer) {
                const std::size_t width = img_count(window.nsamps), pitch = width * 2;
                static std::vector<std::uint8_t> samples;
                samples.resize(img_count(window.nlines) * pitch);
                move(image, GF_Read, GDT_UInt16, window, samples.data());
                sample_counts &counts = new_counts();
                for (std::size_t i = 0; i < samples.size(); i += pitch)
                    count_by_hand(&samples[i], 0, width, std::endian::native, counts);
                look_up(samples.data(), samples.size() / 2, std::endian::native,
                        stretch_table(counts), buffer);
            }};
}

}  // namespace

void add_gdal(const image_set &images, std::vector<task> &tasks)
{
    GDALAllRegister();
    GDALSetCacheMax64(std::int64_t{1} << 30);
    const dataset strips = make_file(images, "gdal_strips.tif", false, GDT_Byte);
    const dataset tiles = make_file(images, "gdal_tiles.tif", true, GDT_Byte);
    for (const char *const name : {"T1", "T2", "T3"}) add_candidate(tasks, name, reading(strips));
    for (const char *const name : {"T4", "T5"}) add_candidate(tasks, name, reading(tiles));
    add_candidate(tasks, "T6", stretching(make_file(images, "gdal_tiles16.tif", true, GDT_UInt16)));
    add_candidate(tasks, "T7",
                  stretching(make_file(images, "gdal_strips16.tif", false, GDT_UInt16)));
}
