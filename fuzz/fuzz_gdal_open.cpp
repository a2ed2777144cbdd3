// The input is a file in GDAL's memory. The GDAL drivers open it to read and to update, move
// samples, and copy it. A failure must be reported and leave the caller's samples alone; reading
// must leave the file as it was.
#include "support/effort.h"
#include "support/files.h"

#include <cpl_conv.h>
#include <gdal_priv.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>

extern "C" void GDALRegister_IMGFILE();  // NOLINT(readability-identifier-naming): GDAL's name

namespace {

constexpr char PATH[] = "/vsimem/input.d";
constexpr char COPY[] = "/vsimem/copy";
constexpr GByte UNTOUCHED = 0xA5;

void require(bool condition, const char *what)
{
    if (condition) return;
    std::fprintf(stderr, "not so: %s\n", what);
    std::abort();
}

// A window that begins at the place, of a few samples.
void read_window(GDALDataset &image, int line, int samp, GDALDataType type)
{
    const int nlines = std::min(9, image.GetRasterYSize() - line);
    const int nsamps = std::min(17, image.GetRasterXSize() - samp);
    const int nbands = std::min(4, image.GetRasterCount());
    bytes buffer(std::size_t{9} * 17 * 4 * 8, UNTOUCHED);
    CPLErrorReset();
    const CPLErr result = image.RasterIO(GF_Read, samp, line, nsamps, nlines, buffer.data(), nsamps,
                                         nlines, type, nbands, nullptr, 0, 0, 0, nullptr);
    if (result == CE_None) return;
    require(CPLGetLastErrorType() >= CE_Failure, "a failure is reported");
    require(std::ranges::all_of(buffer, [](GByte each) { return each == UNTOUCHED; }),
            "a failed read leaves the caller's samples alone");
}

void use(GDALDataset &image, bool updates)
{
    const int last_line = image.GetRasterYSize() - 1, last_samp = image.GetRasterXSize() - 1;
    int width = 0, height = 0;
    image.GetRasterBand(1)->GetBlockSize(&width, &height);
    // GDAL's own code makes blocks of memory for what is converted
    const bool is_small = std::int64_t{width} * height < 1 << 20;
    for (const auto &[line, samp] : {std::pair{0, 0}, {last_line, last_samp}, {last_line / 2, 0}}) {
        read_window(image, line, samp, image.GetRasterBand(1)->GetRasterDataType());
        if (is_small) read_window(image, line, samp, GDT_Float32);
        if (!updates) continue;
        std::uint16_t sample = 0x1234;
        CPLErrorReset();
        require(image.GetRasterBand(image.GetRasterCount())
                            ->RasterIO(GF_Write, samp, line, 1, 1, &sample, 1, 1,
                                       image.GetRasterBand(1)->GetRasterDataType(), 0, 0,
                                       nullptr) == CE_None ||
                    CPLGetLastErrorType() >= CE_Failure,
                "a failure is reported");
    }
}

void copy(GDALDataset &image)
{
    if (std::int64_t{image.GetRasterXSize()} * image.GetRasterYSize() * image.GetRasterCount() >
        1 << 20)
        return;
    GDALDriver *const driver = image.GetDriver();
    CPLErrorReset();
    const GDALDatasetUniquePtr made(
        driver->CreateCopy(COPY, &image, TRUE, nullptr, nullptr, nullptr));
    VSIStatBufL status;
    require(made != nullptr || CPLGetLastErrorType() >= CE_Failure, "a failed copy is reported");
    require((made != nullptr) == (VSIStatL(COPY, &status) == 0), "a failed copy leaves no file");
    VSIUnlink(COPY);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size)
{
    static const bool registered = (GDALRegister_IMGFILE(), true);
    static_cast<void>(registered);
    CPLPushErrorHandler(CPLQuietErrorHandler);
    for (const unsigned flags : {unsigned{GDAL_OF_READONLY}, unsigned{GDAL_OF_UPDATE}}) {
        bytes file(data, data + size);
        VSIFCloseL(VSIFileFromMemBuffer(PATH, file.data(), file.size(), FALSE));
        if (const GDALDatasetUniquePtr image{
                GDALDataset::Open(PATH, flags | GDAL_OF_RASTER | GDAL_OF_VERBOSE_ERROR)}) {
            use(*image, flags == GDAL_OF_UPDATE);
            if (flags == GDAL_OF_READONLY) copy(*image);
        } else {
            require(CPLGetLastErrorType() >= CE_Failure, "a failed open is reported");
        }
        vsi_l_offset length = 0;
        VSIGetMemFileBuffer(PATH, &length, FALSE);
        require(length == size, "the length of the file does not change");
        require(flags == GDAL_OF_UPDATE || std::equal(file.begin(), file.end(), data),
                "reading changes no file");
        VSIUnlink(PATH);
    }
    CPLPopErrorHandler();
    return 0;
}
