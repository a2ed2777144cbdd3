// Images of all formats that the tool knows: one way to read them, one way to write them.
#ifndef TOOL_IMAGE_H
#define TOOL_IMAGE_H

#include <cstddef>
#include <cstdint>
#include <memory>
#include <numeric>
#include <string>
#include <vector>

class output_file;

enum class file_format { vitec, helava, pgm, ppm, pnm, png, tiff };  // pnm: either of both

// "VITec", "Helava", "PGM", "PPM", "PNM", "PNG", "TIFF".
const char *name_of(file_format format);

struct tile_size {
    std::int32_t nlines = 0, nsamps = 0;  // 0 and 0: untiled
};

struct shape {
    std::int32_t nlines, nsamps, nbands;
    std::int32_t nbytes;  // of a sample, 1 or 2
    std::int32_t nbits;  // that samples are said to have: 8, 12 in VITec files of 2 bytes, up to 16
    std::int64_t nsamples() const { return std::int64_t{nlines} * nsamps * nbands; }
    std::int64_t bytes() const { return nsamples() * nbytes; }
    std::int32_t highest() const { return (1 << nbits) - 1; }
};

struct window {
    std::int32_t line, samp, nlines, nsamps;
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
    std::vector<std::uint8_t> bytes;  // from operator new: good for two-byte samples

private:
    std::size_t offset(std::int32_t band, std::int32_t line) const
    {
        return (static_cast<std::size_t>(band) * static_cast<std::size_t>(nlines) +
                static_cast<std::size_t>(line)) *
               static_cast<std::size_t>(nsamps) * static_cast<std::size_t>(nbytes);
    }
};

using band_list = std::vector<std::int32_t>;

// In what pieces samples come and go.
struct access_needs {
    tile_size tiles{};         // in whole ones of these it goes best
    bool whole_tiles = false;  // true: only in windows that begin and end at their edges
    bool in_order = false;     // true: only in whole lines, each window below the one before
};

// An image file that is open for reading. All functions here throw `failure`.
class image_reader : public access_needs {
public:
    image_reader(std::string file_name, file_format file_kind)
        : name(std::move(file_name)), format(file_kind)
    {
    }
    virtual ~image_reader() = default;
    image_reader(const image_reader &) = delete;
    image_reader &operator=(const image_reader &) = delete;

    band_list all_bands() const;

    // Reads these bands of a window inside the image. A failure names the first line that the file
    // does not have.
    virtual void read(const window &part, const band_list &bands, block &to) = 0;

    const std::string name;
    file_format format;
    shape form{};
    std::int64_t length = -1;  // bytes that the file must have; -1: not known
    std::string remark;        // what people should know of the file; empty: nothing
};

// An image file that is being made.
class image_writer : public access_needs {
public:
    image_writer() = default;
    virtual ~image_writer() = default;
    image_writer(const image_writer &) = delete;
    image_writer &operator=(const image_writer &) = delete;

    virtual void write(const window &at, const block &from) = 0;
    // Completes the file. Returns the length that it must have, -1 where that is not known.
    virtual std::int64_t finish() = 0;
};

// Opens an image of any format, which its first bytes tell; "-" is standard input. Readers of one
// name do not depend on each other.
std::unique_ptr<image_reader> open_image(const std::string &name);

// Makes an image in `out`, which `name` is to become; refuses what the format cannot hold.
std::unique_ptr<image_writer> create_image(output_file &out, file_format format, const shape &form,
                                           tile_size tiles);

// Returns the format that a name ends in, or that is called `wanted` ("" : not said).
// `option` is what could say it.
file_format format_of_output(const std::string &name, const std::string &wanted,
                             const std::string &option);

// Refuses names that do not end in ".png".
void check_png_name(const std::string &name);

// --- by format ---

std::unique_ptr<image_reader> open_native(const std::string &name);  // VITec, Helava
std::unique_ptr<image_reader> open_pnm(const std::string &name, int fd);
std::unique_ptr<image_reader> open_png(const std::string &name, int fd);
std::unique_ptr<image_reader> open_tiff(const std::string &name, int fd);
std::unique_ptr<image_writer> create_native(output_file &out, file_format format, const shape &form,
                                            tile_size tiles);
std::unique_ptr<image_writer> create_pnm(output_file &out, file_format format, const shape &form);
std::unique_ptr<image_writer> create_png(output_file &out, const shape &form);
std::unique_ptr<image_writer> create_tiff(output_file &out, const shape &form, tile_size tiles);

#endif
