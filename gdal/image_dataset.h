// A VITec or Helava image as a GDAL data set. Samples are passed as they are stored: Byte or
// UInt16.
#ifndef GDAL_IMGFILE_IMAGE_DATASET_H
#define GDAL_IMGFILE_IMAGE_DATASET_H

#include "api/open.h"

#include <gdal_pam.h>

#include <memory>
#include <string>

// Memory for samples.
struct sample_free {
    void operator()(GByte *samples) const { VSIFree(samples); }
};
using sample_buffer = std::unique_ptr<GByte[], sample_free>;
// Null after an error: memory is short.
sample_buffer new_samples(int nlines, int nsamps, int nbytes);

class image_dataset final : public GDALPamDataset {
public:
    // `driver_name` opens the messages of this data set.
    image_dataset(const char *driver_name, std::string filename, img_raw_image image,
                  GDALAccess access);
    ~image_dataset() override;

    // A new file has no side files yet; metadata, overviews and masks may make them.
    void start_side_files();
    // Takes up an item of metadata that the file holds; GDAL does not write it to a side file.
    void load_item(const char *name, const char *value, const char *domain);
    // Takes up the side files of a file that is opened: metadata, overviews, masks.
    void load_side_files(GDALOpenInfo *info);
    // Writes what waits in GDAL's cache, ends the image, and reports what could not be stored.
    CPLErr close_image();
#if GDAL_VERSION_NUM >= GDAL_COMPUTE_VERSION(3, 7, 0)
    CPLErr Close() override;
#endif

    // Reads, or writes, a region inside the image. `buffer` has rows `stride` samples apart. A read
    // that fails leaves `buffer` alone, unless the file was cut during the read.
    CPLErr read(int band, int line, int samp, int nlines, int nsamps, GByte *buffer, int stride);
    // Read whole lines, or a tile with what lies behind the image's edges, at once and without a
    // message; `buffer` may be partly written after a failure.
    bool read_lines(int band, int line, int nlines, GByte *buffer);
    bool read_tile(int band, int tile_down, int tile_across, GByte *buffer);
    CPLErr write(int band, int line, int samp, int nlines, int nsamps, const GByte *buffer,
                 int stride);

    // Reports the first line of a region that the file does not hold in one of the bands, counted
    // from 1. `is_direct` false: the region is read by whole blocks.
    CPLErr check_there(const int *bands, int nbands, int line, int samp, int nlines, int nsamps,
                       bool is_direct);

    const img_desc &desc() const
    {
        return *m_image;
    }

protected:
    CPLErr IRasterIO(GDALRWFlag direction, int samp, int line, int nsamps, int nlines, void *buffer,
                     int buffer_nsamps, int buffer_nlines, GDALDataType buffer_type, int nbands,
                     int *bands, GSpacing pixel_space, GSpacing line_space, GSpacing band_space,
                     GDALRasterIOExtraArg *extra) override;

private:
    bool is_there(int band, int line, int samp, int nlines, int nsamps) const;
    bool read_by_runs(int band, int line, int samp, int nlines, int nsamps, GByte *buffer,
                      std::size_t pitch);
    void report_missing(int band, int line, int samp, int nlines, int nsamps);

    std::string m_driver_name, m_filename;
    img_raw_image m_image;
    bool m_is_remote;  // each read is a request
};

class image_band final : public GDALPamRasterBand {
public:
    image_band(image_dataset *dataset, int band);

    GDALColorInterp GetColorInterpretation() override;
    CPLErr FlushCache(bool is_closing) override;

protected:
    CPLErr IReadBlock(int block_x, int block_y, void *buffer) override;
    CPLErr IWriteBlock(int block_x, int block_y, void *buffer) override;
    CPLErr IRasterIO(GDALRWFlag direction, int samp, int line, int nsamps, int nlines, void *buffer,
                     int buffer_nsamps, int buffer_nlines, GDALDataType buffer_type,
                     GSpacing pixel_space, GSpacing line_space,
                     GDALRasterIOExtraArg *extra) override;

private:
    image_dataset &images() const { return *static_cast<image_dataset *>(poDS); }
    CPLErr move_spaced(GDALRWFlag direction, int samp, int line, int nsamps, int nlines,
                       GByte *buffer, GSpacing pixel_space, GSpacing line_space);
    bool read_ahead(int line, GByte *buffer);
    CPLErr write(int line, int samp, int nlines, int nsamps, const GByte *buffer, int stride);
    CPLErr write_waiting_lines(int line, const GByte *samples);
    bool updates_blocks(int samp, int line, int nsamps, int nlines) const;
    CPLErr flush_blocks(GDALRWFlag direction, int samp, int line, int nsamps, int nlines);
    bool has_cached_blocks(int nsamps, int nlines);
    bool read_from_blocks(int samp, int line, int nsamps, int nlines, GByte *buffer,
                          GSpacing line_space);

    std::int64_t m_small_windows = 0;  // that were read
    sample_buffer m_together;          // room for lines that are written together; null: not yet
    // Lines that follow the last one that GDAL asked for as a block.
    struct {
        sample_buffer samples;  // null: none
        int first = 0, count = 0;
        int expected = -1;  // the line that a reader of all lines asks for next
        int end = 0;        // of the lines that are worth reading: of the image, or of an update
    } m_ahead;
};

// Returns the bytes that a file of this geometry has.
std::int64_t whole_length(const img_desc &desc);

#endif
