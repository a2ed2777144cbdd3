// Opening, creating and copying images for GDAL. Read drivers.h and image_dataset.h first.
#include "drivers.h"

#include "image_dataset.h"
#include "storage.h"

#include "base/img_desc.h"
#include "base/report.h"
#include "formats/helava.h"
#include "formats/vitec.h"
#include "std/std.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstring>
#include <memory>
#include <span>
#include <string>
#include <system_error>

namespace {

constexpr int DEFAULT_TILE = 256;
constexpr int MOST_BANDS = 65536;        // that GDAL's own drivers open
constexpr int ROWS_OF_A_COPY = 1 << 22;  // bytes of untiled lines that are copied at a time

// Ends `filename` on request, so that work that failed leaves no file.
class unfinished_file {
public:
    explicit unfinished_file(std::string filename) : m_filename(std::move(filename)) {}
    ~unfinished_file()
    {
        if (!m_filename.empty()) VSIUnlink(m_filename.c_str());
    }
    unfinished_file(const unfinished_file &) = delete;
    unfinished_file &operator=(const unfinished_file &) = delete;

    void keep() { m_filename.clear(); }

private:
    std::string m_filename;
};

std::nullptr_t fail(const image_format &format, const char *filename, CPLErrorNum number,
                    const std::string &text)
{
    CPLError(CE_Failure, number, "%s: %s: %s", format.name, filename, text.c_str());
    return nullptr;
}

// --- Text of VITec headers: the items DESCRIPTION and CREATION_DATE of the domain VITEC ---

constexpr char HEADER_DOMAIN[] = "VITEC";
constexpr char DATE_FORMAT[] = "%d-%d-%dT%d:%d:%d";
constexpr std::size_t DESCRIPTION_SIZE = IMG_VITEC_AT_VERSION - IMG_VITEC_AT_DESCRIPTION;

// Reads the text where GDAL has read the header: in the files of nearly all writers.
void load_header_text(GDALOpenInfo *info, image_dataset *image)
{
    const std::span header(info->pabyHeader, static_cast<std::size_t>(info->nHeaderBytes));
    const std::uint32_t link = img_get_word(header, IMG_VITEC_AT_IMAGE_BLOCK_LINK);
    const std::size_t image_block =
        std::size_t{image->desc().swap != 0 ? img_swapped_word(link) : link} + IMG_VITEC_LINK_BASE;
    if (image_block + IMG_VITEC_IMAGE_BLOCK_SIZE > header.size()) return;
    std::string text(
        reinterpret_cast<const char *>(&header[image_block + IMG_VITEC_AT_DESCRIPTION]),
        DESCRIPTION_SIZE);
    text.resize(std::strlen(text.c_str()));
    if (!text.empty() && CPLIsUTF8(text.c_str(), -1) != FALSE)
        image->load_item("DESCRIPTION", text.c_str(), HEADER_DOMAIN);
    const std::uint8_t *const date = &header[IMG_VITEC_AT_CREATE_DATE];
    if (date[1] > 11 || date[2] < 1 || date[2] > 31) return;  // not stated
    image->load_item("CREATION_DATE",
                     CPLSPrintf("%04d-%02d-%02dT%02d:%02d:%02d", date[0] + 1900, date[1] + 1,
                                date[2], date[3], date[4], date[5]),
                     HEADER_DOMAIN);
}

// Writes the text of the source into the header of a copy. Returns false after an error.
bool copy_header_text(GDALDataset *source, const char *filename)
{
    const char *const text = source->GetMetadataItem("DESCRIPTION", HEADER_DOMAIN);
    const char *const stated = source->GetMetadataItem("CREATION_DATE", HEADER_DOMAIN);
    std::array<int, IMG_VITEC_CREATE_DATE_SIZE> date{};
    const bool has_date =
        stated != nullptr &&
        std::sscanf(stated, DATE_FORMAT, date.data(), &date[1], &date[2], &date[3], &date[4],
                    &date[5]) == int{IMG_VITEC_CREATE_DATE_SIZE};
    if (text == nullptr && !has_date) return true;
    VSILFILE *const file = VSIFOpenL(filename, "rb+");
    bool done = file != nullptr;
    const auto put = [&](std::size_t offset, const void *bytes, std::size_t size) {
        done = done && VSIFSeekL(file, offset, SEEK_SET) == 0 &&
               VSIFWriteL(bytes, 1, size, file) == size;
    };
    if (text != nullptr) {
        std::array<char, DESCRIPTION_SIZE> padded{};
        std::memcpy(padded.data(), text, std::min(std::strlen(text), padded.size()));
        put(IMG_VITEC_IMAGE_BLOCK_OFFSET + IMG_VITEC_AT_DESCRIPTION, padded.data(), padded.size());
    }
    if (has_date) {
        date[0] -= 1900;
        date[1] -= 1;
        std::array<std::uint8_t, IMG_VITEC_CREATE_DATE_SIZE> bytes;
        std::ranges::transform(date, bytes.begin(), [](int part) {
            return static_cast<std::uint8_t>(std::clamp(part, 0, 255));
        });
        put(IMG_VITEC_AT_CREATE_DATE, bytes.data(), bytes.size());
    }
    if (file != nullptr && VSIFCloseL(file) != 0) done = false;
    if (!done)
        fail(vitec_format, filename, CPLE_FileIO, "the text of the header cannot be written");
    return done;
}

// --- Opening ---

std::unique_ptr<image_dataset> open_image(const image_format &format, const char *filename,
                                          GDALAccess access)
{
    const img_message_keeper messages;
    const bool updates = access == GA_Update;
    // A file opened for writing is completed when it is closed: look at it before.
    img_raw_image image = img_open_raw(filename, storage_of(filename), IMG_OPEN_READ_ONLY);
    if (!image && errno != EINVAL)
        return fail(format, filename, CPLE_OpenFailed,
                    "cannot be opened: " + std::generic_category().message(errno));
    if (!image || image->type != format.type)
        return fail(format, filename, CPLE_OpenFailed,
                    "has a header that describes no readable image");
    if (image->nlines == 0 || image->nsamps == 0 || image->nbands == 0)
        return fail(format, filename, CPLE_OpenFailed, "is an image without samples");
    if (image->nbands > MOST_BANDS)
        return fail(format, filename, CPLE_OpenFailed,
                    "states " + std::to_string(image->nbands) + " bands, more than GDAL opens");
    if (updates) {
        if (image->std_file->veof < whole_length(*image))
            return fail(format, filename, CPLE_OpenFailed,
                        "is truncated, and cannot be opened for update");
        errno = 0;
        image = img_open_raw(filename, storage_of(filename), IMG_OPEN_READ_WRITE);
        if (!image) return fail(format, filename, CPLE_OpenFailed, "cannot be opened for update");
    }
    return std::make_unique<image_dataset>(format.name, filename, std::move(image), access);
}

GDALDataset *open_format(const image_format &format, GDALOpenInfo *info)
{
    if (info->fpL == nullptr || format.identify(info) == FALSE) return nullptr;
    std::unique_ptr<image_dataset> dataset = open_image(format, info->pszFilename, info->eAccess);
    if (!dataset) return nullptr;
    if (format.type == IMG_TYPE_VITEC) load_header_text(info, dataset.get());
    dataset->load_side_files(info);
    return dataset.release();
}

GDALDataset *open_vitec(GDALOpenInfo *info)
{
    return open_format(vitec_format, info);
}

GDALDataset *open_helava(GDALOpenInfo *info)
{
    return open_format(helava_format, info);
}

// --- Creating ---

// Width and height of tiles; 0: none.
struct tiling {
    int width = 0, height = 0;
};

bool read_side(const image_format &format, const char *filename, char **options, const char *key,
               int *side)
{
    const char *const stated = CSLFetchNameValue(options, key);
    if (stated == nullptr) return true;
    const char *const end = stated + std::strlen(stated);
    if (const auto [next, error] = std::from_chars(stated, end, *side);
        error == std::errc{} && next == end && img_vitec_is_tile_size(*side))
        return true;
    fail(format, filename, CPLE_IllegalArg,
         std::string(key) + "=" + stated + ": tiles have powers of two from " +
             std::to_string(IMG_VITEC_MIN_TILE) + " to " + std::to_string(IMG_VITEC_MAX_TILE));
    return false;
}

// Reads the creation options. Returns false after an error.
bool read_options(const image_format &format, const char *filename, char **options, int nsamps,
                  tiling *tiles)
{
    if (!format.has_tiles) return true;
    // Programs hand on the blocks of an untiled image: lines of its whole width.
    const char *const width = CSLFetchNameValue(options, "BLOCKXSIZE");
    const bool has_width = width != nullptr && width != std::to_string(nsamps);
    if (!CPLFetchBool(options, "TILED", has_width)) return true;
    *tiles = {DEFAULT_TILE, DEFAULT_TILE};
    return read_side(format, filename, options, "BLOCKXSIZE", &tiles->width) &&
           read_side(format, filename, options, "BLOCKYSIZE", &tiles->height);
}

// Returns what the format cannot hold; empty if it holds the image.
std::string refusal(const image_format &format, int nbands, GDALDataType type)
{
    if (nbands < 1) return "holds at least one band";
    if (nbands > format.most_bands)
        return "holds at most " + std::to_string(format.most_bands) + " bands, not " +
               std::to_string(nbands);
    if (type == GDT_Byte || (type == GDT_UInt16 && format.has_two_bytes)) return "";
    return std::string("holds samples of type ") +
           (format.has_two_bytes ? "Byte and UInt16" : "Byte") + ", not " +
           GDALGetDataTypeName(type);
}

// Creates a file of zeros in its full length. Returns false after an error; no file is left then.
bool create_file(const image_format &format, const char *filename, int nsamps, int nlines,
                 int nbands, GDALDataType type, char **options)
{
    if (const std::string reason = refusal(format, nbands, type); !reason.empty())
        return fail(format, filename, CPLE_NotSupported, "the format " + reason) != nullptr;
    tiling tiles;
    if (!read_options(format, filename, options, nsamps, &tiles)) return false;
    const int nbytes = GDALGetDataTypeSizeBytes(type);
    const auto padded = [](std::int64_t extent, int side) {
        return side == 0 ? extent : (extent + side - 1) / side * side;
    };
    const int header =
        format.type == IMG_TYPE_VITEC ? int{IMG_VITEC_DATA_OFFSET} : int{IMG_HELAVA_TRAILER_LENGTH};
    if (padded(nlines, tiles.height) * padded(nsamps, tiles.width) >
        (INT32_MAX - header) / nbytes / nbands)
        return fail(format, filename, CPLE_NotSupported, "the file would have 2 GiB or more") !=
               nullptr;

    // An archive would be left with nothing in it.
    if (!VSISupportsRandomWrite(filename, true))
        return fail(format, filename, CPLE_NotSupported,
                    "cannot be created: its storage takes no changes") != nullptr;
    const img_message_keeper messages;
    unfinished_file file(filename);
    errno = 0;
    img_raw_image image = img_create_raw(filename, storage_of(filename), nlines, nsamps, nbands,
                                         format.type, tiles.width, tiles.height, nbytes);
    if (!image) {
        const int error = errno;
        // The file was there before, and stays.
        if (error == EACCES || error == EPERM || error == EROFS || error == EISDIR) file.keep();
        return fail(format, filename, CPLE_OpenFailed,
                    "cannot be created: " + std::generic_category().message(error)) != nullptr;
    }
    const std::int64_t expected = whole_length(*image);
    take_close_error();
    image.reset();  // completes the file
    VSIStatBufL status;
    if (take_close_error() != 0 || VSIStatL(filename, &status) != 0 || status.st_size != expected)
        return fail(format, filename, CPLE_FileIO, "cannot be created: not enough room") != nullptr;
    file.keep();
    return true;
}

std::unique_ptr<image_dataset> create_image(const image_format &format, const char *filename,
                                            int nsamps, int nlines, int nbands, GDALDataType type,
                                            char **options)
{
    if (!create_file(format, filename, nsamps, nlines, nbands, type, options)) return nullptr;
    std::unique_ptr<image_dataset> dataset = open_image(format, filename, GA_Update);
    if (dataset) dataset->start_side_files();
    return dataset;
}

GDALDataset *create_vitec(const char *filename, int nsamps, int nlines, int nbands,
                          GDALDataType type, char **options)
{
    return create_image(vitec_format, filename, nsamps, nlines, nbands, type, options).release();
}

GDALDataset *create_helava(const char *filename, int nsamps, int nlines, int nbands,
                           GDALDataType type, char **options)
{
    return create_image(helava_format, filename, nsamps, nlines, nbands, type, options).release();
}

// --- Copying ---

// Returns the type in which the source is stored: another than its own is an error where the caller
// is strict, else a warning. GDT_Unknown after an error.
GDALDataType stored_type(const image_format &format, const char *filename, GDALDataset *source,
                         bool is_strict)
{
    GDALDataType type = source->GetRasterBand(1)->GetRasterDataType();
    for (int band = 2; band <= source->GetRasterCount(); ++band)
        type = GDALDataTypeUnion(type, source->GetRasterBand(band)->GetRasterDataType());
    const std::string reason = refusal(format, 1, type);
    if (reason.empty()) return type;
    if (is_strict) {
        fail(format, filename, CPLE_NotSupported, "the format " + reason);
        return GDT_Unknown;
    }
    const GDALDataType nearest = format.has_two_bytes ? GDT_UInt16 : GDT_Byte;
    CPLError(CE_Warning, CPLE_NotSupported, "%s: %s: samples of type %s are stored as %s",
             format.name, filename, GDALGetDataTypeName(type), GDALGetDataTypeName(nearest));
    return nearest;
}

// Returns false after an error: the caller cancels.
bool report_progress(double done, GDALProgressFunc progress, void *progress_data)
{
    if (progress(done, "", progress_data) != FALSE) return true;
    CPLError(CE_Failure, CPLE_UserInterrupt, "User terminated");
    return false;
}

// Copies all samples, one row of blocks at a time. Returns false after an error or a cancel.
bool copy_samples(GDALDataset *source, image_dataset *copy, GDALDataType type,
                  GDALProgressFunc progress, void *progress_data)
{
    const img_desc &image = copy->desc();
    const std::int64_t line = std::int64_t{image.nsamps} * image.nbytes;
    const int height =
        img_is_tiled(&image)
            ? image.tile_nlines
            : static_cast<int>(std::clamp<std::int64_t>(ROWS_OF_A_COPY / line, 1, image.nlines));
    const sample_buffer rows =
        new_samples(std::min(height, image.nlines), image.nsamps, image.nbytes);
    if (!rows) return false;
    for (int first = 0; first < image.nlines; first += height) {
        const int count = std::min(height, image.nlines - first);
        for (int band = 0; band < image.nbands; ++band)
            if (source->GetRasterBand(band + 1)->RasterIO(GF_Read, 0, first, image.nsamps, count,
                                                          rows.get(), image.nsamps, count, type, 0,
                                                          0, nullptr) != CE_None ||
                copy->write(band, first, 0, count, image.nsamps, rows.get(), image.nsamps) !=
                    CE_None)
                return false;
        if (!report_progress(static_cast<double>(first + count) / image.nlines, progress,
                             progress_data))
            return false;
    }
    return true;
}

// Copies the metadata that GDALPamDataset::CloneInfo leaves out, but for what describes the file.
void copy_domains(GDALMajorObject *source, GDALMajorObject *copy, bool to_vitec)
{
    const CPLStringList domains(source->GetMetadataDomainList());
    for (int i = 0; i < domains.size(); ++i) {
        const char *const domain = domains[i];
        if (!EQUAL(domain, "") && !EQUAL(domain, "IMAGE_STRUCTURE") &&
            !(to_vitec && EQUAL(domain, HEADER_DOMAIN)) && !EQUAL(domain, "SUBDATASETS") &&
            !EQUAL(domain, "DERIVED_SUBDATASETS"))
            copy->SetMetadata(source->GetMetadata(domain), domain);
    }
}

GDALDataset *copy_image(const image_format &format, const char *filename, GDALDataset *source,
                        int strict, char **options, GDALProgressFunc progress, void *progress_data)
{
    const bool is_strict = strict != FALSE;
    const int nbands = source->GetRasterCount();
    if (progress == nullptr) progress = GDALDummyProgress;
    if (const std::string reason = refusal(format, nbands, GDT_Byte); !reason.empty())
        return fail(format, filename, CPLE_NotSupported, "the format " + reason);
    const GDALDataType type = stored_type(format, filename, source, is_strict);
    if (type == GDT_Unknown || !report_progress(0.0, progress, progress_data)) return nullptr;
    std::unique_ptr<image_dataset> copy =
        create_image(format, filename, source->GetRasterXSize(), source->GetRasterYSize(), nbands,
                     type, options);
    if (!copy) return nullptr;
    unfinished_file file(filename);
    const bool to_vitec = format.type == IMG_TYPE_VITEC;
    if (!copy_samples(source, copy.get(), type, progress, progress_data) ||
        (to_vitec && !copy_header_text(source, filename))) {
        copy.reset();
        return nullptr;
    }
    file.keep();
    copy_domains(source, copy.get(), to_vitec);
    for (int band = 1; band <= nbands; ++band)
        copy_domains(source->GetRasterBand(band), copy->GetRasterBand(band), to_vitec);
    if (copy->CloneInfo(source, GCIF_PAM_DEFAULT) == CE_None) return copy.release();
    copy.reset();
    GDALDriver::QuietDelete(filename);
    return nullptr;
}

GDALDataset *copy_to_vitec(const char *filename, GDALDataset *source, int strict, char **options,
                           GDALProgressFunc progress, void *progress_data)
{
    return copy_image(vitec_format, filename, source, strict, options, progress, progress_data);
}

GDALDataset *copy_to_helava(const char *filename, GDALDataset *source, int strict, char **options,
                            GDALProgressFunc progress, void *progress_data)
{
    return copy_image(helava_format, filename, source, strict, options, progress, progress_data);
}

constexpr char NO_OPTIONS[] = "<CreationOptionList/>";
constexpr char VITEC_OPTIONS[] =
    "<CreationOptionList>"
    "  <Option name='TILED' type='boolean' default='NO' description='Store the image in tiles'/>"
    "  <Option name='BLOCKXSIZE' type='int' default='256' description='Width of a tile, a power of "
    "two from 8 to 32768; sets TILED'/>"
    "  <Option name='BLOCKYSIZE' type='int' default='256' description='Height of a tile, a power "
    "of "
    "two from 8 to 32768; sets TILED'/>"
    "</CreationOptionList>";

}  // namespace

void register_format(const image_format &format)
{
    if (GDALGetDriverByName(format.name) != nullptr) return;
    const bool is_vitec = &format == &vitec_format;
    auto driver = std::make_unique<GDALDriver>();
    driver->SetDescription(format.name);
    driver->SetMetadataItem(GDAL_DMD_LONGNAME, format.long_name);
    driver->SetMetadataItem(GDAL_DCAP_RASTER, "YES");
    driver->SetMetadataItem(GDAL_DCAP_VIRTUALIO, "YES");
    driver->SetMetadataItem(GDAL_DMD_CREATIONDATATYPES, is_vitec ? "Byte UInt16" : "Byte");
    // Other formats have files of the name .img: theirs is the ending of an output file.
    if (!is_vitec) driver->SetMetadataItem(GDAL_DMD_EXTENSION, "d");
    driver->SetMetadataItem(GDAL_DMD_CREATIONOPTIONLIST, is_vitec ? VITEC_OPTIONS : NO_OPTIONS);
#ifdef GDAL_DCAP_UPDATE
    driver->SetMetadataItem(GDAL_DCAP_UPDATE, "YES");
#endif
#ifdef GDAL_DMD_UPDATE_ITEMS
    driver->SetMetadataItem(GDAL_DMD_UPDATE_ITEMS,
                            "GeoTransform SRS GCPs NoData ColorInterpretation RasterValues "
                            "DatasetMetadata BandMetadata");
#endif
    driver->pfnIdentify = format.identify;
    driver->pfnOpen = is_vitec ? open_vitec : open_helava;
    driver->pfnCreate = is_vitec ? create_vitec : create_helava;
    driver->pfnCreateCopy = is_vitec ? copy_to_vitec : copy_to_helava;
    GetGDALDriverManager()->RegisterDriver(driver.release());
}
