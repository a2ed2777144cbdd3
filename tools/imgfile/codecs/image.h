// Images of all formats that the tool knows: one interface to read them, one to write them.
#ifndef TOOL_IMAGE_H
#define TOOL_IMAGE_H

#include "input_file.h"

#include "common/image_window.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

enum class file_format { vitec, helava, pgm, ppm, pnm, png, tiff };  // pnm: PGM or PPM

// "VITec", "Helava", "PGM", "PPM", "PNM", "PNG", "TIFF".
const char *name_of(file_format format);

struct tile_size {
    std::int32_t nlines = 0, nsamps = 0;  // 0 and 0: untiled
};

struct shape {
    std::int32_t nlines, nsamps, nbands;
    std::int32_t nbytes;  // of a sample, 1 or 2
    std::int32_t nbits;   // stated for a sample: 8, 12 in VITec files of 2 bytes, up to 16
    std::int64_t nsamples() const { return std::int64_t{nlines} * nsamps * nbands; }
    std::int64_t bytes() const { return nsamples() * nbytes; }
    std::size_t pixel_size() const  // in bytes
    {
        return static_cast<std::size_t>(nbands) * static_cast<std::size_t>(nbytes);
    }
    std::int32_t highest() const { return (1 << nbits) - 1; }
    window whole() const { return {0, 0, nlines, nsamps}; }
};

// Samples of a window in memory, in the host's byte order: band after band, line after line.
class block {
public:
    block(std::int32_t lines, std::int32_t samps, std::int32_t bands, std::int32_t width)
        : nlines{lines}, nsamps{samps}, nbands{bands}, nbytes{width}, bytes(offset(bands, 0))
    {
    }
    std::uint8_t *row(std::int32_t band, std::int32_t line) { return &bytes[offset(band, line)]; }
    const std::uint8_t *row(std::int32_t band, std::int32_t line) const
    {
        return &bytes[offset(band, line)];
    }
    // Calls `use(samples)` with a row as a pointer to std::uint8_t or std::uint16_t.
    template <typename Use>
    void use_row(std::int32_t band, std::int32_t line, Use use) const
    {
        if (nbytes == 1)
            use(row(band, line));
        else
            use(reinterpret_cast<const std::uint16_t *>(row(band, line)));
    }
    // Calls `use(band, line, samples)` for each row.
    template <typename Use>
    void for_each_row(Use use) const
    {
        for (std::int32_t band = 0; band < nbands; ++band)
            for (std::int32_t line = 0; line < nlines; ++line)
                use_row(band, line, [&](const auto *samples) { use(band, line, samples); });
    }

    std::int32_t nlines, nsamps, nbands, nbytes;
    std::vector<std::uint8_t> bytes;  // from operator new: aligned for two-byte samples

private:
    std::size_t offset(std::int32_t band, std::int32_t line) const
    {
        return (static_cast<std::size_t>(band) * static_cast<std::size_t>(nlines) +
                static_cast<std::size_t>(line)) *
               static_cast<std::size_t>(nsamps) * static_cast<std::size_t>(nbytes);
    }
};

using band_list = std::vector<std::int32_t>;

// The windows in which a format is read or written.
struct access_needs {
    tile_size tiles{};         // windows of whole tiles are fastest
    bool whole_tiles = false;  // true: only windows that begin and end at edges of tiles
    bool in_order = false;     // true: only whole lines, each window below the one before
};

// What only VITec and Helava files state.
struct native_facts {
    bool big_endian;
    const char *layout;
    std::int32_t tiles_down, tiles_across;  // 0 and 0: untiled
    std::int32_t data_offset;               // of the first sample, in bytes
    std::string created;                    // empty: the file has no date
};

// An image file that is open for reading. All functions throw `failure`.
class image_reader : public access_needs {
public:
    image_reader(const input_file &file, file_format file_kind)
        : name(file.name()), identity(file.identity()), file_length(file.length()),
          format(file_kind)
    {
    }
    virtual ~image_reader() = default;
    image_reader(const image_reader &) = delete;
    image_reader &operator=(const image_reader &) = delete;

    band_list all_bands() const;

    // Reads these bands of a window inside the image. A failure names the first missing line.
    // Readers that are `in_order` may be started again with a window further up.
    virtual void read(const window &part, const band_list &bands, block &samples) = 0;

    const std::string name;
    const file_identity identity;
    const std::int64_t file_length;  // -1: unknown, as for standard input
    file_format format;
    shape form{};
    std::int64_t expected_length = -1;   // of the file, by its header; -1: unknown
    std::optional<native_facts> native;  // of VITec and Helava files
    std::string remark;                  // a note for the user; empty: none
};

// An image file that is being written. All functions throw `failure`.
class image_writer : public access_needs {
public:
    image_writer() = default;
    virtual ~image_writer() = default;
    image_writer(const image_writer &) = delete;
    image_writer &operator=(const image_writer &) = delete;

    virtual void write(const window &part, const block &samples) = 0;
    // Completes the file. Returns the length that it must have; -1: unknown.
    virtual std::int64_t finish() = 0;
};

#endif
