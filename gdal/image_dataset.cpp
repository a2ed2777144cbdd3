// Moving samples between GDAL and an image. A request that neither resamples nor converts goes
// straight to where the bytes lie, past GDAL's block cache; all others are GDAL's own, made of
// blocks. Read image_dataset.h and api/open.h first.
#include "image_dataset.h"

#include "storage.h"

#include "base/img_desc.h"
#include "base/report.h"
#include "formats/helava.h"
#include "std/std.h"
#include "std/std_bytes.h"
#include "std/std_offset.h"
#include "std/std_samples.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <system_error>
#include <utility>

namespace {

// A window of so many bytes is read into memory of the call first, so that a failure leaves the
// caller's alone. Larger ones ask for the length of the file first: that takes less time then.
constexpr std::size_t SMALL_WINDOW = 16384;
// Working memory of requests whose samples are spaced in the caller's buffer.
constexpr std::size_t PIECE = std::size_t{1} << 20;
// An update of a window of so many bytes is left to GDAL's blocks.
constexpr std::int64_t LARGEST_UPDATE = std::int64_t{1} << 20;
// Longer blocks are not read for a window that touches a part of them.
constexpr std::int64_t LARGEST_BLOCK = std::int64_t{1} << 20;
// Lines that wait are written together up to so many, of so many bytes.
constexpr int MOST_LINES = 64;
constexpr std::size_t WRITTEN_TOGETHER = std::size_t{1} << 17;
// Bytes of lines that are read at a time for a reader of one line after the other.
constexpr std::size_t READ_AHEAD = std::size_t{1} << 17;

struct drop_block {
    void operator()(GDALRasterBlock *block) const { block->DropLock(); }
};
using locked_block = std::unique_ptr<GDALRasterBlock, drop_block>;

// Returns the system's text for the error that the library reported last; empty without one.
std::string last_reason()
{
    const int error = img_message_keeper::last_error();
    return error != 0 ? std::generic_category().message(error) : "";
}

// True for a request that does not resample.
bool is_exact(const GDALRasterIOExtraArg *extra, int samp, int line, int nsamps, int nlines,
              int buffer_nsamps, int buffer_nlines)
{
    if (buffer_nsamps != nsamps || buffer_nlines != nlines) return false;
    if (extra == nullptr || extra->bFloatingPointWindowValidity == FALSE) return true;
    return extra->dfXOff == samp && extra->dfYOff == line && extra->dfXSize == nsamps &&
           extra->dfYSize == nlines;
}

}  // namespace

sample_buffer new_samples(int nlines, int nsamps, int nbytes)
{
    return sample_buffer(static_cast<GByte *>(
        VSI_MALLOC3_VERBOSE(static_cast<std::size_t>(nlines), static_cast<std::size_t>(nsamps),
                            static_cast<std::size_t>(nbytes))));
}

std::int64_t whole_length(const img_desc &desc)
{
    const img_std_file &file = *desc.std_file;
    const std::int64_t trailer = desc.type == IMG_TYPE_HELAVA ? IMG_HELAVA_TRAILER_LENGTH : 0;
    return file.data_offset + std::int64_t{file.band_size} * desc.nbands + trailer;
}

image_dataset::image_dataset(const char *driver_name, std::string filename, img_raw_image image,
                             GDALAccess access)
    : m_driver_name(driver_name), m_filename(std::move(filename)), m_image(std::move(image)),
      m_is_remote(!VSIIsLocal(m_filename.c_str()))
{
    eAccess = access;
    nRasterXSize = m_image->nsamps;
    nRasterYSize = m_image->nlines;
    // The last one first: GDAL's table then has room for all at once.
    for (int band = m_image->nbands; band > 0; --band) SetBand(band, new image_band(this, band));
    if (m_image->nbands > 1) load_item("INTERLEAVE", "BAND", "IMAGE_STRUCTURE");
}

void image_dataset::load_item(const char *name, const char *value, const char *domain)
{
    // NOLINTNEXTLINE(bugprone-parent-virtual-call): not through GDALPamDataset, which would save it
    GDALDataset::SetMetadataItem(name, value, domain);
}

void image_dataset::start_side_files()
{
    SetDescription(m_filename.c_str());
    oOvManager.Initialize(this, m_filename.c_str());
}

void image_dataset::load_side_files(GDALOpenInfo *info)
{
    SetDescription(info->pszFilename);
    char **const siblings = info->GetSiblingFiles();
    // A server that lists no folder is asked for one side file, and not for each of the old names
    // that GDAL would try.
    CPLStringList likely;
    if (siblings == nullptr && !VSIIsLocal(info->pszFilename))
        likely.AddString((std::string(CPLGetFilename(info->pszFilename)) + ".aux.xml").c_str());
    TryLoadXML(likely.empty() ? siblings : likely.List());
    oOvManager.Initialize(this, info->pszFilename, siblings);
}

// Several bands, or blocks of GDAL's cache, are read one after the other. What is missing is seen
// before the first of them reaches the caller's buffer.
CPLErr image_dataset::check_there(const int *bands, int nbands, int line, int samp, int nlines,
                                  int nsamps, bool is_direct)
{
    if (!is_direct && !img_is_tiled(m_image.get())) {  // blocks are whole lines
        samp = 0;
        nsamps = nRasterXSize;
    }
    const img_message_keeper messages;
    // A local file may have been truncated since; the length of others may take a request.
    if (m_image->io_method->lend != nullptr) img_std_update_veof(m_image.get());
    if (m_image->std_file->veof >= whole_length(*m_image)) return CE_None;
    for (int i = 0; i < nbands; ++i) {
        if (is_there(bands[i] - 1, line, samp, nlines, nsamps) ||
            GetRasterBand(bands[i])->GetOverviewCount() > 0)
            continue;
        report_missing(bands[i] - 1, line, samp, nlines, nsamps);
        return CE_Failure;
    }
    return CE_None;
}

CPLErr image_dataset::IRasterIO(GDALRWFlag direction, int samp, int line, int nsamps, int nlines,
                                void *buffer, int buffer_nsamps, int buffer_nlines,
                                GDALDataType buffer_type, int nbands, int *bands,
                                GSpacing pixel_space, GSpacing line_space, GSpacing band_space,
                                GDALRasterIOExtraArg *extra)
{
    const bool is_direct =
        buffer_type == GetRasterBand(1)->GetRasterDataType() &&
        is_exact(extra, samp, line, nsamps, nlines, buffer_nsamps, buffer_nlines);
    if (direction == GF_Read &&
        check_there(bands, nbands, line, samp, nlines, nsamps, is_direct) != CE_None)
        return CE_Failure;
    return GDALPamDataset::IRasterIO(direction, samp, line, nsamps, nlines, buffer, buffer_nsamps,
                                     buffer_nlines, buffer_type, nbands, bands, pixel_space,
                                     line_space, band_space, extra);
}

image_dataset::~image_dataset()
{
    close_image();
}

CPLErr image_dataset::close_image()
{
    if (!m_image) return CE_None;
    FlushCache(true);
    take_close_error();
    m_image.reset();
    const int error = take_close_error();
    if (error == 0 || eAccess == GA_ReadOnly) return CE_None;
    CPLError(CE_Failure, CPLE_FileIO, "%s: %s: not all samples could be stored: %s",
             m_driver_name.c_str(), m_filename.c_str(),
             std::generic_category().message(error).c_str());
    return CE_Failure;
}

#if GDAL_VERSION_NUM >= GDAL_COMPUTE_VERSION(3, 7, 0)
CPLErr image_dataset::Close()
{
    const CPLErr flushed = FlushCache(true), ended = close_image();
    const CPLErr closed = GDALPamDataset::Close();
    return std::max({flushed, ended, closed});
}
#endif

// True when the file holds all that a read of the region needs, by its length as last seen.
bool image_dataset::is_there(int band, int line, int samp, int nlines, int nsamps) const
{
    const img_desc *const image = m_image.get();
    const img_std_file &file = *image->std_file;
    if (file.veof >= whole_length(*image)) return true;
    const int last_line = line + nlines - 1, last_samp = samp + nsamps - 1;
    if (!img_is_tiled(image))
        return img_std_line_offset(image, last_line, last_samp, band) + image->nbytes <= file.veof;
    const std::int64_t last_tile =
        std::int64_t{last_line / image->tile_nlines} * file.tiles_across +
        last_samp / image->tile_nsamps;
    return img_std_tile_offset(image, last_tile, band) + file.tile_size <= file.veof;
}

// Reports the first line of a region that the file does not hold, or why it cannot be read.
void image_dataset::report_missing(int band, int line, int samp, int nlines, int nsamps)
{
    const std::string reason = last_reason();
    int first = line, last = line + nlines - 1;
    if (is_there(band, line, samp, nlines, nsamps)) {
        CPLError(CE_Failure, CPLE_FileIO, "%s: %s: lines %d to %d of band %d cannot be read%s%s",
                 m_driver_name.c_str(), m_filename.c_str(), first, last, band + 1,
                 reason.empty() ? "" : ": ", reason.c_str());
        return;
    }
    while (first < last) {
        const int middle = first + (last - first) / 2;
        if (is_there(band, middle, samp, 1, nsamps))
            first = middle + 1;
        else
            last = middle;
    }
    CPLError(CE_Failure, CPLE_FileIO, "%s: %s: truncated: line %d of band %d is missing",
             m_driver_name.c_str(), m_filename.c_str(), first, band + 1);
}

CPLErr image_dataset::read(int band, int line, int samp, int nlines, int nsamps, GByte *buffer,
                           int stride)
{
    const img_message_keeper messages;
    img_desc *const image = m_image.get();
    const std::size_t row =
        static_cast<std::size_t>(nsamps) * static_cast<std::size_t>(image->nbytes);
    const std::size_t pitch =
        static_cast<std::size_t>(stride) * static_cast<std::size_t>(image->nbytes);
    const bool is_small = row * static_cast<std::size_t>(nlines) <= SMALL_WINDOW;
    bool done = is_small && is_there(band, line, samp, nlines, nsamps);
    if (!done) {
        img_std_update_veof(image);  // the file may have grown, too
        done = is_there(band, line, samp, nlines, nsamps);
    }
    if (done && read_by_runs(band, line, samp, nlines, nsamps, buffer, pitch)) return CE_None;
    if (done && is_small) {
        std::array<GByte, SMALL_WINDOW> samples;
        done = img_read_raw(image, line, samp, nlines, nsamps, band, samples.data(), nsamps) == 0;
        for (std::size_t i = 0; done && i < static_cast<std::size_t>(nlines); ++i)
            std::memcpy(buffer + i * pitch, samples.data() + i * row, row);
    } else if (done) {
        done = img_read_raw(image, line, samp, nlines, nsamps, band, buffer, stride) == 0;
    }
    if (done) return CE_None;
    img_std_update_veof(image);
    report_missing(band, line, samp, nlines, nsamps);
    return CE_Failure;
}

// Reads lines from a server with the bytes between them, where these are few: that takes fewer
// requests. Returns false, with `buffer` partly written, when the lines must be read one by one.
bool image_dataset::read_by_runs(int band, int line, int samp, int nlines, int nsamps,
                                 GByte *buffer, std::size_t pitch)
{
    constexpr int most_between = 1 << 14, most_at_once = 1 << 22;  // bytes
    img_desc *const image = m_image.get();
    const int padded = image->std_file->padded_nsamps;
    if (!m_is_remote || img_is_tiled(image) || nlines < 2 ||
        (padded - nsamps) * image->nbytes > most_between)
        return false;
    const int height = std::clamp(most_at_once / (padded * image->nbytes), 1, nlines);
    const sample_buffer run = new_samples(height, padded, image->nbytes);
    if (!run) return false;
    const auto size = static_cast<std::size_t>(image->nbytes);
    for (int first = 0; first < nlines; first += height) {
        const int count = std::min(height, nlines - first);
        if (img_read_raw_run(image, img_std_line_offset(image, line + first, samp, band),
                             (count - 1) * padded + nsamps, run.get()) != 0)
            return false;
        img_std_copy_rows({run.get(), static_cast<std::size_t>(padded) * size, size},
                          buffer + static_cast<std::size_t>(first) * pitch, pitch,
                          static_cast<std::size_t>(count), static_cast<std::size_t>(nsamps),
                          image->nbytes, false);
    }
    return true;
}

bool image_dataset::read_lines(int band, int line, int nlines, GByte *buffer)
{
    img_desc *const image = m_image.get();
    // Lines may lie apart in files that other programs have made.
    return (image->std_file->padded_nsamps == image->nsamps || nlines == 1) &&
           img_read_raw_run(image, img_std_line_offset(image, line, 0, band),
                            nlines * image->nsamps, buffer) == 0;
}

bool image_dataset::read_tile(int band, int tile_down, int tile_across, GByte *buffer)
{
    img_desc *const image = m_image.get();
    const std::int64_t tile = std::int64_t{tile_down} * image->std_file->tiles_across + tile_across;
    return img_read_raw_run(image, img_std_tile_offset(image, tile, band),
                            image->tile_nlines * image->tile_nsamps, buffer) == 0;
}

CPLErr image_dataset::write(int band, int line, int samp, int nlines, int nsamps,
                            const GByte *buffer, int stride)
{
    const img_message_keeper messages;
    if (img_write_raw(m_image.get(), line, samp, nlines, nsamps, band, buffer, stride) == 0)
        return CE_None;
    const std::string reason = last_reason();
    CPLError(CE_Failure, CPLE_FileIO, "%s: %s: lines %d to %d of band %d cannot be written%s%s",
             m_driver_name.c_str(), m_filename.c_str(), line, line + nlines - 1, band + 1,
             reason.empty() ? "" : ": ", reason.c_str());
    return CE_Failure;
}

image_band::image_band(image_dataset *dataset, int band)
{
    const img_desc &image = dataset->desc();
    poDS = dataset;
    nBand = band;
    m_ahead.end = image.nlines;
    eAccess = dataset->GetAccess();
    eDataType = image.nbytes == 2 ? GDT_UInt16 : GDT_Byte;
    nBlockXSize = img_is_tiled(&image) ? image.tile_nsamps : image.nsamps;
    nBlockYSize = img_is_tiled(&image) ? image.tile_nlines : 1;
}

GDALColorInterp image_band::GetColorInterpretation()
{
    const GDALColorInterp stated = GDALPamRasterBand::GetColorInterpretation();
    if (stated != GCI_Undefined) return stated;
    const img_desc &image = images().desc();
    if (image.nbands == 1) return GCI_GrayIndex;
    if (image.nbands == 3 && image.nbytes == 1)
        return static_cast<GDALColorInterp>(GCI_RedBand + nBand - 1);
    return GCI_Undefined;
}

CPLErr image_band::FlushCache(bool is_closing)
{
    m_ahead.samples.reset();
    return GDALPamRasterBand::FlushCache(is_closing);
}

// Reads a short line, and those behind it where the lines are asked for in turn: one call of the
// library costs as much as the copy of many short lines. Returns false when the line must be read
// alone.
bool image_band::read_ahead(int line, GByte *buffer)
{
    const bool follows = line == m_ahead.expected;
    m_ahead.expected = line + 1;
    const int nbytes = images().desc().nbytes;
    const std::size_t row =
        static_cast<std::size_t>(nBlockXSize) * static_cast<std::size_t>(nbytes);
    const bool is_read =
        m_ahead.samples && line >= m_ahead.first && line - m_ahead.first < m_ahead.count;
    if (!is_read) {
        m_ahead.samples.reset();
        if (!follows || line >= m_ahead.end - 1 || row > READ_AHEAD / 4) return false;
        m_ahead.first = line;
        m_ahead.count = std::min(static_cast<int>(READ_AHEAD / row), m_ahead.end - line);
        m_ahead.samples = new_samples(m_ahead.count, nBlockXSize, nbytes);
        if (m_ahead.samples &&
            !images().read_lines(nBand - 1, line, m_ahead.count, m_ahead.samples.get()))
            m_ahead.samples.reset();
        if (!m_ahead.samples) return false;
    }
    const int index = line - m_ahead.first;
    std::memcpy(buffer, m_ahead.samples.get() + static_cast<std::size_t>(index) * row, row);
    if (line == m_ahead.end - 1) m_ahead.samples.reset();
    return true;
}

CPLErr image_band::IReadBlock(int block_x, int block_y, void *buffer)
{
    auto *const samples = static_cast<GByte *>(buffer);
    const bool is_tiled = img_is_tiled(&images().desc());
    if (is_tiled
            ? images().read_tile(nBand - 1, block_y, block_x, samples)
            : read_ahead(block_y, samples) ||
                  (eAccess == GA_Update && images().read_lines(nBand - 1, block_y, 1, samples)))
        return CE_None;
    const int samp = block_x * nBlockXSize, line = block_y * nBlockYSize;
    const int nsamps = std::min(nBlockXSize, nRasterXSize - samp);
    const int nlines = std::min(nBlockYSize, nRasterYSize - line);
    return images().read(nBand - 1, line, samp, nlines, nsamps, samples, nBlockXSize);
}

CPLErr image_band::write(int line, int samp, int nlines, int nsamps, const GByte *buffer,
                         int stride)
{
    if (line < m_ahead.first + m_ahead.count && line + nlines > m_ahead.first)
        m_ahead.samples.reset();
    return images().write(nBand - 1, line, samp, nlines, nsamps, buffer, stride);
}

// Writes a line, and with it the lines behind it that wait in GDAL's cache: one long write takes
// less time than several short ones.
CPLErr image_band::write_waiting_lines(int line, const GByte *samples)
{
    const int nbytes = images().desc().nbytes;
    const std::size_t row =
        static_cast<std::size_t>(nBlockXSize) * static_cast<std::size_t>(nbytes);
    const int most = static_cast<int>(std::min<std::size_t>(
        WRITTEN_TOGETHER / row, static_cast<std::size_t>(nRasterYSize - line)));
    std::array<locked_block, MOST_LINES> waiting;
    int count = 1;
    for (; count < std::min(most, MOST_LINES); ++count) {
        locked_block &block = waiting[static_cast<std::size_t>(count)];
        block.reset(TryGetLockedBlockRef(0, line + count));
        if (!block || block->GetDirty() == 0) break;
    }
    if (count > 1 && !m_together)
        m_together.reset(static_cast<GByte *>(VSI_MALLOC_VERBOSE(WRITTEN_TOGETHER)));
    if (count == 1 || !m_together) return write(line, 0, 1, nBlockXSize, samples, nBlockXSize);
    for (int i = 0; i < count; ++i)
        std::memcpy(m_together.get() + static_cast<std::size_t>(i) * row,
                    i == 0 ? samples : waiting[static_cast<std::size_t>(i)]->GetDataRef(), row);
    const CPLErr result = write(line, 0, count, nBlockXSize, m_together.get(), nBlockXSize);
    if (result == CE_None)
        for (int i = 1; i < count; ++i) waiting[static_cast<std::size_t>(i)]->MarkClean();
    return result;
}

CPLErr image_band::IWriteBlock(int block_x, int block_y, void *buffer)
{
    if (!img_is_tiled(&images().desc()))
        return write_waiting_lines(block_y, static_cast<const GByte *>(buffer));
    const int samp = block_x * nBlockXSize, line = block_y * nBlockYSize;
    return write(line, samp, std::min(nBlockYSize, nRasterYSize - line),
                 std::min(nBlockXSize, nRasterXSize - samp), static_cast<const GByte *>(buffer),
                 nBlockXSize);
}

// True for an update that GDAL's blocks take: parts of blocks, which are often changed again before
// they are written. Whole blocks go to the file at once.
bool image_band::updates_blocks(int samp, int line, int nsamps, int nlines) const
{
    const int nbytes = images().desc().nbytes;
    const auto covers = [](int first, int count, int block, int end) {
        return first % block == 0 && (count % block == 0 || first + count == end);
    };
    return eAccess == GA_Update && std::int64_t{nsamps} * nlines * nbytes <= LARGEST_UPDATE &&
           std::int64_t{nBlockXSize} * nBlockYSize * nbytes <= LARGEST_BLOCK &&
           !(covers(samp, nsamps, nBlockXSize, nRasterXSize) &&
             covers(line, nlines, nBlockYSize, nRasterYSize));
}

// Ends the blocks of a window that GDAL keeps, so that it can be moved past them: those that were
// not written yet, and all that a write would make old.
CPLErr image_band::flush_blocks(GDALRWFlag direction, int samp, int line, int nsamps, int nlines)
{
    const int right = (samp + nsamps - 1) / nBlockXSize, bottom = (line + nlines - 1) / nBlockYSize;
    for (int y = line / nBlockYSize; y <= bottom; ++y)
        for (int x = samp / nBlockXSize; x <= right; ++x) {
            locked_block block(TryGetLockedBlockRef(x, y));
            if (!block || (direction == GF_Read && block->GetDirty() == 0)) continue;
            block.reset();
            if (FlushBlock(x, y) != CE_None) return CE_Failure;
        }
    return CE_None;
}

// Counts a small window. True when GDAL's cache should answer it: no copy from a file is as quick
// as one from a block in memory. A block is worth its reading where the windows have touched each
// tile about once, so that more will follow, and the cache keeps all tiles.
bool image_band::has_cached_blocks(int nsamps, int nlines)
{
    constexpr std::int64_t smallest_image = 1 << 18;  // bytes
    const img_desc &image = images().desc();
    const img_std_file &file = *image.std_file;
    const std::int64_t size = std::int64_t{file.band_size} * image.nbands;
    if (!img_is_tiled(&image) || eAccess != GA_ReadOnly || size < smallest_image ||
        std::int64_t{nsamps} * nlines * image.nbytes > static_cast<std::int64_t>(SMALL_WINDOW) ||
        file.veof < whole_length(image) || size > GDALGetCacheMax64())
        return false;
    constexpr int tiles_per_window = 8;  // of the windows that show that more follow
    return ++m_small_windows > std::int64_t{file.tiles_across} * file.tiles_down / tiles_per_window;
}

// Copies a small window from GDAL's blocks. Returns false, with the caller's memory as it was, when
// the window must be read otherwise.
bool image_band::read_from_blocks(int samp, int line, int nsamps, int nlines, GByte *buffer,
                                  GSpacing line_space)
{
    const auto size = static_cast<std::size_t>(images().desc().nbytes);
    const int left = samp / nBlockXSize, right = (samp + nsamps - 1) / nBlockXSize;
    const int top = line / nBlockYSize, bottom = (line + nlines - 1) / nBlockYSize;
    if (right - left > 1 || bottom - top > 1 || line_space < 0) return false;
    std::array<locked_block, 4> blocks;  // all, before the first is copied
    for (int y = top; y <= bottom; ++y)
        for (int x = left; x <= right; ++x) {
            locked_block &block = blocks[static_cast<std::size_t>((y - top) * 2 + x - left)];
            block.reset(GetLockedBlockRef(x, y));
            if (!block) return false;
        }
    for (int y = top; y <= bottom; ++y)
        for (int x = left; x <= right; ++x) {
            const int first_line = std::max(line - y * nBlockYSize, 0);
            const int first_samp = std::max(samp - x * nBlockXSize, 0);
            const int end_line = std::min(line + nlines - y * nBlockYSize, nBlockYSize);
            const int end_samp = std::min(samp + nsamps - x * nBlockXSize, nBlockXSize);
            const auto *const rows = static_cast<const GByte *>(
                blocks[static_cast<std::size_t>((y - top) * 2 + x - left)]->GetDataRef());
            const auto start =
                static_cast<std::size_t>(first_line) * static_cast<std::size_t>(nBlockXSize) +
                static_cast<std::size_t>(first_samp);
            img_std_copy_rows(
                {rows + start * size, static_cast<std::size_t>(nBlockXSize) * size, size},
                buffer + (y * nBlockYSize + first_line - line) * line_space +
                    static_cast<std::size_t>(x * nBlockXSize + first_samp - samp) * size,
                static_cast<std::size_t>(line_space),
                static_cast<std::size_t>(end_line - first_line),
                static_cast<std::size_t>(end_samp - first_samp), images().desc().nbytes, false);
        }
    return true;
}

CPLErr image_band::IRasterIO(GDALRWFlag direction, int samp, int line, int nsamps, int nlines,
                             void *buffer, int buffer_nsamps, int buffer_nlines,
                             GDALDataType buffer_type, GSpacing pixel_space, GSpacing line_space,
                             GDALRasterIOExtraArg *extra)
{
    const bool updates = updates_blocks(samp, line, nsamps, nlines);
    if (updates || buffer_type != eDataType || pixel_space != static_cast<int>(pixel_space) ||
        !is_exact(extra, samp, line, nsamps, nlines, buffer_nsamps, buffer_nlines)) {
        if (direction == GF_Read &&
            images().check_there(&nBand, 1, line, samp, nlines, nsamps, false) != CE_None)
            return CE_Failure;
        if (eAccess == GA_Update) m_ahead.end = line + nlines;
        if (updates) m_ahead.expected = line;
        return GDALPamRasterBand::IRasterIO(direction, samp, line, nsamps, nlines, buffer,
                                            buffer_nsamps, buffer_nlines, buffer_type, pixel_space,
                                            line_space, extra);
    }
    if (eAccess == GA_Update && flush_blocks(direction, samp, line, nsamps, nlines) != CE_None)
        return CE_Failure;
    const int nbytes = images().desc().nbytes;
    const GSpacing stride = line_space / nbytes;
    auto *const samples = static_cast<GByte *>(buffer);
    const bool is_packed = pixel_space == nbytes && line_space % nbytes == 0 && stride >= nsamps &&
                           stride <= INT32_MAX / nbytes / nlines;
    CPLErr result = CE_None;
    if (direction == GF_Read && pixel_space == nbytes && has_cached_blocks(nsamps, nlines) &&
        read_from_blocks(samp, line, nsamps, nlines, samples, line_space))
        result = CE_None;
    else if (!is_packed)
        result =
            move_spaced(direction, samp, line, nsamps, nlines, samples, pixel_space, line_space);
    else if (direction == GF_Read)
        result =
            images().read(nBand - 1, line, samp, nlines, nsamps, samples, static_cast<int>(stride));
    else
        result = write(line, samp, nlines, nsamps, samples, static_cast<int>(stride));
    if (result == CE_None && extra != nullptr && extra->pfnProgress != nullptr &&
        extra->pfnProgress(1.0, "", extra->pProgressData) == FALSE) {
        CPLError(CE_Failure, CPLE_UserInterrupt, "User terminated");
        return CE_Failure;
    }
    return result;
}

// Moves samples that are spaced in `buffer` by way of rows in which they are not.
CPLErr image_band::move_spaced(GDALRWFlag direction, int samp, int line, int nsamps, int nlines,
                               GByte *buffer, GSpacing pixel_space, GSpacing line_space)
{
    const int nbytes = images().desc().nbytes;
    const std::size_t row = static_cast<std::size_t>(nsamps) * static_cast<std::size_t>(nbytes);
    const int height =
        static_cast<int>(std::clamp<std::size_t>(PIECE / row, 1, static_cast<std::size_t>(nlines)));
    const sample_buffer rows = new_samples(height, nsamps, nbytes);
    if (!rows) return CE_Failure;
    for (int first = 0; first < nlines; first += height) {
        const int count = std::min(height, nlines - first);
        if (direction == GF_Read && images().read(nBand - 1, line + first, samp, count, nsamps,
                                                  rows.get(), nsamps) != CE_None)
            return CE_Failure;
        for (int i = 0; i < count; ++i) {
            GByte *const spaced = buffer + (first + i) * line_space;
            GByte *const packed = rows.get() + static_cast<std::size_t>(i) * row;
            if (direction == GF_Read)
                GDALCopyWords64(packed, eDataType, nbytes, spaced, eDataType,
                                static_cast<int>(pixel_space), nsamps);
            else
                GDALCopyWords64(spaced, eDataType, static_cast<int>(pixel_space), packed, eDataType,
                                nbytes, nsamps);
        }
        if (direction == GF_Write &&
            write(line + first, samp, count, nsamps, rows.get(), nsamps) != CE_None)
            return CE_Failure;
    }
    return CE_None;
}
