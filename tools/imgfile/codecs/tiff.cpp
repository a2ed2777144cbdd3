// TIFF files of 8 or 16 bits, in strips or tiles, read and written by libtiff. Uncompressed strips
// are read without it, line by line: libtiff would hold a whole strip in memory. Read codecs.h
// first.
#include "codecs/codecs.h"
#include "codecs/pixels.h"
#include "failure.h"
#include "file_descriptor.h"
#include "output_file.h"

#include "base/img_desc.h"

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <tiffio.h>

#include <unistd.h>

namespace {

int keep_message(TIFF * /*file*/, void *text, const char * /*module*/, const char *format,
                 std::va_list arguments)
{
    char message[512];
    const int error = errno;
    std::vsnprintf(message, sizeof message, format, arguments);
    auto &kept = *static_cast<std::string *>(text);
    kept = error == ENOSPC || error == EIO || error == EFBIG || error == EDQUOT ? system_text(error)
                                                                                : message;
    kept.resize(std::min(kept.find('\n'), kept.size()));
    return 1;  // handled: libtiff prints nothing
}

using tiff_file = std::unique_ptr<TIFF, decltype(&TIFFClose)>;

// Opens `fd` and closes it with the file, or at once when that fails. `message` receives the reason
// of the last failure. "m" in the mode: no mapping, whose pages would count as memory of the tool.
tiff_file open_tiff_file(int fd, const std::string &name, const char *mode, std::string &message)
{
    const auto ignore_warning = [](TIFF *, void *, const char *, const char *, std::va_list) {
        return 1;
    };
    const std::unique_ptr<TIFFOpenOptions, decltype(&TIFFOpenOptionsFree)> options(
        TIFFOpenOptionsAlloc(), TIFFOpenOptionsFree);
    if (!options) throw std::bad_alloc();
    TIFFOpenOptionsSetErrorHandlerExtR(options.get(), keep_message, &message);
    TIFFOpenOptionsSetWarningHandlerExtR(options.get(), ignore_warning, nullptr);
    errno = 0;
    tiff_file file(TIFFFdOpenExt(fd, name.c_str(), mode, options.get()), TIFFClose);
    if (!file) ::close(fd);
    return file;
}

template <typename Number>
Number field(const tiff_file &file, ttag_t tag, Number fallback)
{
    Number value = fallback;
    TIFFGetFieldDefaulted(file.get(), tag, &value);
    return value;
}

constexpr std::uint64_t LARGEST_PIECE = std::uint64_t{48} << 20U;  // bytes of a tile

// libtiff converts the samples of such files to RGB.
bool is_jpeg_of_colours(const tiff_file &file)
{
    return field<std::uint16_t>(file, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_MINISBLACK) ==
               PHOTOMETRIC_YCBCR &&
           field<std::uint16_t>(file, TIFFTAG_COMPRESSION, COMPRESSION_NONE) == COMPRESSION_JPEG;
}

class tiff_reader : public image_reader {
public:
    explicit tiff_reader(input_file file)
        : image_reader(file, file_format::tiff), m_file(open_file(file.release()))
    {
        refuse_unless(field<std::uint16_t>(m_file, TIFFTAG_SAMPLEFORMAT, SAMPLEFORMAT_UINT) ==
                          SAMPLEFORMAT_UINT,
                      "samples that are not unsigned integers");
        const int bits = field<std::uint16_t>(m_file, TIFFTAG_BITSPERSAMPLE, 1);
        refuse_unless(bits == 8 || bits == 16, text("samples of ", bits, " bits"));
        const int photometric =
            field<std::uint16_t>(m_file, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_MINISBLACK);
        refuse_unless(photometric == PHOTOMETRIC_MINISBLACK || photometric == PHOTOMETRIC_RGB ||
                          is_jpeg_of_colours(m_file),
                      "colours that are neither gray nor RGB");

        const auto nlines = field<std::uint32_t>(m_file, TIFFTAG_IMAGELENGTH, 0);
        const auto nsamps = field<std::uint32_t>(m_file, TIFFTAG_IMAGEWIDTH, 0);
        refuse_unless(nlines >= 1 && nsamps >= 1 && nlines <= INT32_MAX && nsamps <= INT32_MAX,
                      "no valid size");
        form = {.nlines = static_cast<std::int32_t>(nlines),
                .nsamps = static_cast<std::int32_t>(nsamps),
                .nbands = field<std::uint16_t>(m_file, TIFFTAG_SAMPLESPERPIXEL, 1),
                .nbytes = bits / 8,
                .nbits = bits};
        m_planar = form.nbands > 1 &&
                   field<std::uint16_t>(m_file, TIFFTAG_PLANARCONFIG, PLANARCONFIG_CONTIG) ==
                       PLANARCONFIG_SEPARATE;
        if (TIFFIsTiled(m_file.get()) != 0)
            set_up_tiles();
        else
            set_up_strips();
        if (const int orientation =
                field<std::uint16_t>(m_file, TIFFTAG_ORIENTATION, ORIENTATION_TOPLEFT);
            orientation != ORIENTATION_TOPLEFT)
            remark = text("the orientation tag (", orientation, ") is ignored");
        else if (has_pages())
            remark = "only the first of its images is read";
    }

    void read(const window &part, const band_list &bands, block &samples) override
    {
        const bool tiled = tiles.nlines != 0;
        m_piece.resize(static_cast<std::size_t>(tiled ? TIFFTileSize64(m_file.get())
                                                      : TIFFScanlineSize64(m_file.get())));
        if (tiled)
            read_tiles(part, bands, samples);
        else
            read_lines(part, bands, samples);
    }

private:
    void refuse_unless(bool supported, const std::string &property)
    {
        if (!supported)
            throw failure(name, "has " + property +
                                    "; only TIFF files of 8 or 16 bits, gray or RGB, can be read");
    }
    void set_up_tiles()
    {
        tiles = {static_cast<std::int32_t>(field<std::uint32_t>(m_file, TIFFTAG_TILELENGTH, 0)),
                 static_cast<std::int32_t>(field<std::uint32_t>(m_file, TIFFTAG_TILEWIDTH, 0))};
        const std::uint64_t size = TIFFTileSize64(m_file.get());
        refuse_unless(size > 0, "tiles without a valid size");
        if (size > LARGEST_PIECE)
            throw failure(name,
                          text("has tiles of ", size, " bytes; at most 48 MiB are supported"));
    }
    void set_up_strips()
    {
        in_order = true;
        m_plain =
            field<std::uint16_t>(m_file, TIFFTAG_COMPRESSION, COMPRESSION_NONE) ==
                COMPRESSION_NONE &&
            field<std::uint16_t>(m_file, TIFFTAG_FILLORDER, FILLORDER_MSB2LSB) == FILLORDER_MSB2LSB;
        const auto nlines = static_cast<std::uint32_t>(form.nlines);
        m_strip_nlines = std::max(field<std::uint32_t>(m_file, TIFFTAG_ROWSPERSTRIP, nlines), 1U);
        refuse_unless(TIFFScanlineSize64(m_file.get()) > 0, "lines without a valid size");
    }
    [[noreturn]] void fail_at(std::int64_t line, std::uint16_t plane) const
    {
        throw failure(
            name, text("line ", line, m_planar ? text(" of band ", plane) : "",
                       m_message.empty() ? " is missing" : " is missing or damaged: ", m_message));
    }
    tiff_file open_file(int fd)
    {
        tiff_file file = open_tiff_file(fd, name, "rm", m_message);
        if (!file) throw failure(name, "is a damaged TIFF file: " + m_message);
        if (is_jpeg_of_colours(file))
            TIFFSetField(file.get(), TIFFTAG_JPEGCOLORMODE, JPEGCOLORMODE_RGB);
        m_message.clear();  // the file could be opened all the same
        return file;
    }

    // True when a second image follows that is neither the first one reduced nor a mask.
    bool has_pages()
    {
        if (TIFFLastDirectory(m_file.get()) != 0) return false;
        const tiff_file again = open_file(open_again(TIFFFileno(m_file.get()), name));
        const bool found = TIFFReadDirectory(again.get()) == 1;
        const auto type = field<std::uint32_t>(again, TIFFTAG_SUBFILETYPE, 0);
        m_message.clear();
        return found && (type & (FILETYPE_REDUCEDIMAGE | FILETYPE_MASK)) == 0;
    }

    // Calls `take(plane, nbands, bands, position)` for each plane: for one with the pixels of all
    // bands, or for each band's own, whose samples go to band `position` of the block.
    template <typename Take>
    void for_each_plane(const band_list &bands, Take take)
    {
        if (!m_planar) {
            take(std::uint16_t{0}, form.nbands, bands, 0);
            return;
        }
        for (std::size_t i = 0; i < bands.size(); ++i)
            take(static_cast<std::uint16_t>(bands[i]), 1, band_list{0},
                 static_cast<std::int32_t>(i));
    }

    // A plane of compressed lines that is being read. A strip can only be read from its first line
    // on, so each plane is read through a file of its own: one file would start a strip again at
    // each change of the plane.
    struct lines_in_order {
        tiff_file file;
        std::uint16_t plane;
        std::int64_t next = 0;
    };

    lines_in_order &lines_of(std::uint16_t plane, std::int32_t position)
    {
        const auto index = static_cast<std::size_t>(position);
        while (m_lines.size() <= index)
            m_lines.push_back({open_file(open_again(TIFFFileno(m_file.get()), name)), plane});
        lines_in_order &lines = m_lines[index];
        if (lines.plane != plane) lines.next = 0;
        lines.plane = plane;
        return lines;
    }

    // Reads lines of one strip, at most `most`, into m_piece. Returns their number.
    std::int32_t read_plain_lines(std::int64_t line, std::int32_t most, std::int64_t line_length,
                                  std::uint16_t plane)
    {
        constexpr std::int64_t at_once = std::int64_t{1} << 20U;  // bytes
        TIFF *const file = m_file.get();
        const std::int64_t before = line % m_strip_nlines;
        const auto count = std::min<std::int64_t>(
            {most, m_strip_nlines - before, std::max<std::int64_t>(at_once / line_length, 1)});
        m_piece.resize(static_cast<std::size_t>(count * line_length));
        const std::uint32_t strip = TIFFComputeStrip(file, static_cast<std::uint32_t>(line), plane);
        const auto first_byte = static_cast<std::uint64_t>(before * line_length);
        const std::uint64_t stored = TIFFGetStrileByteCount(file, strip);
        ssize_t got = 0;
        if (first_byte < stored)
            got = ::pread(TIFFFileno(file), m_piece.data(),
                          static_cast<std::size_t>(
                              std::min<std::uint64_t>(m_piece.size(), stored - first_byte)),
                          static_cast<off_t>(TIFFGetStrileOffset(file, strip) + first_byte));
        if (got == -1) m_message = system_text(errno);
        if (got != static_cast<ssize_t>(m_piece.size()))
            fail_at(line + std::max<ssize_t>(got, 0) / line_length, plane);
        if (TIFFIsByteSwapped(file) != 0 && form.nbytes == 2)
            exchange_bytes(m_piece.data(), m_piece.size() / 2);
        return static_cast<std::int32_t>(count);
    }
    // Reads a line into m_piece.
    void read_line(lines_in_order &lines, std::int64_t line)
    {
        const std::int64_t first = line / m_strip_nlines * m_strip_nlines;
        if (lines.next < first || lines.next > line) lines.next = first;
        for (; lines.next <= line; ++lines.next)
            if (TIFFReadScanline(lines.file.get(), m_piece.data(),
                                 static_cast<std::uint32_t>(lines.next), lines.plane) != 1 ||
                !m_message.empty())
                fail_at(lines.next, lines.plane);
    }

    void read_lines(const window &part, const band_list &bands, block &samples)
    {
        for_each_plane(bands, [&](std::uint16_t plane, std::int32_t nbands, const band_list &chosen,
                                  std::int32_t position) {
            const std::size_t first = static_cast<std::size_t>(part.samp) * pixel_size(nbands);
            const std::size_t pitch = static_cast<std::size_t>(form.nsamps) * pixel_size(nbands);
            for (std::int32_t i = 0; i < part.nlines;) {
                const std::int64_t line = std::int64_t{part.line} + i;
                std::int32_t count = 1;
                if (m_plain)
                    count = read_plain_lines(line, part.nlines - i,
                                             static_cast<std::int64_t>(pitch), plane);
                else
                    read_line(lines_of(plane, position), line);
                for (std::int32_t k = 0; k < count; ++k, ++i)
                    spread_pixels(&m_piece[static_cast<std::size_t>(k) * pitch + first], nbands,
                                  chosen, {i, 0, part.nsamps, position}, samples);
            }
        });
    }

    void read_tiles(const window &part, const band_list &bands, block &samples)
    {
        const std::int32_t last_line = part.line + part.nlines, last_samp = part.samp + part.nsamps;
        for_each_plane(bands, [&](std::uint16_t plane, std::int32_t nbands, const band_list &chosen,
                                  std::int32_t position) {
            for (std::int64_t top = part.line - part.line % tiles.nlines; top < last_line;
                 top += tiles.nlines)
                for (std::int64_t left = part.samp - part.samp % tiles.nsamps; left < last_samp;
                     left += tiles.nsamps) {
                    if (TIFFReadTile(m_file.get(), m_piece.data(), static_cast<std::uint32_t>(left),
                                     static_cast<std::uint32_t>(top), 0, plane) == -1 ||
                        !m_message.empty())
                        fail_at(top, plane);
                    const auto first_line = std::max<std::int64_t>(top, part.line);
                    const auto end_line = std::min<std::int64_t>(top + tiles.nlines, last_line);
                    const auto first = std::max<std::int64_t>(left, part.samp);
                    const auto end = std::min<std::int64_t>(left + tiles.nsamps, last_samp);
                    const std::size_t pitch =
                        m_piece.size() / static_cast<std::size_t>(tiles.nlines);
                    for (std::int64_t line = first_line; line < end_line; ++line)
                        spread_pixels(
                            &m_piece[static_cast<std::size_t>(line - top) * pitch +
                                     static_cast<std::size_t>(first - left) * pixel_size(nbands)],
                            nbands, chosen,
                            {static_cast<std::int32_t>(line - part.line),
                             static_cast<std::int32_t>(first - part.samp),
                             static_cast<std::int32_t>(end - first), position},
                            samples);
                }
        });
    }

    std::size_t pixel_size(std::int32_t nbands) const
    {
        return static_cast<std::size_t>(nbands) * static_cast<std::size_t>(form.nbytes);
    }

    std::string m_message;  // the last one of libtiff; empty: none
    tiff_file m_file;
    bool m_planar = false;
    bool m_plain = false;  // lines can be read without libtiff
    std::int64_t m_strip_nlines = 0;
    std::vector<lines_in_order> m_lines;  // of the planes that are read
    std::vector<std::uint8_t> m_piece;    // a line or a tile
};

std::int64_t tiles_in(const shape &form, tile_size tiles)
{
    return tiles.nlines == 0 ? 0
                             : std::int64_t{img_whole_tiles(form.nlines, tiles.nlines)} *
                                   img_whole_tiles(form.nsamps, tiles.nsamps);
}

// Classic files end at 4 GiB.
bool needs_big_tiff(const shape &form, tile_size tiles)
{
    const std::int64_t samples = std::max(form.nsamples(), tiles_in(form, tiles) * tiles.nlines *
                                                               tiles.nsamps * form.nbands);
    return samples * form.nbytes > 4'000'000'000;
}

class tiff_writer : public image_writer {
public:
    tiff_writer(output_file &out, const shape &form, tile_size tiling)
        : m_name(out.name()),
          m_file(open_tiff_file(::dup(out.fd()), out.name(),
                                needs_big_tiff(form, tiling) ? "w8" : "w", m_message))
    {
        if (!m_file) fail();
        tiles = tiling;
        in_order = true;
        const auto set = [this](ttag_t tag, auto value) {
            if (TIFFSetField(m_file.get(), tag, value) != 1) fail();
        };
        set(TIFFTAG_IMAGELENGTH, form.nlines);
        set(TIFFTAG_IMAGEWIDTH, form.nsamps);
        set(TIFFTAG_SAMPLESPERPIXEL, form.nbands);
        set(TIFFTAG_BITSPERSAMPLE, form.nbytes * 8);
        set(TIFFTAG_SAMPLEFORMAT, SAMPLEFORMAT_UINT);
        set(TIFFTAG_PLANARCONFIG, PLANARCONFIG_CONTIG);
        set(TIFFTAG_PHOTOMETRIC, form.nbands == 3 ? PHOTOMETRIC_RGB : PHOTOMETRIC_MINISBLACK);
        if (form.nbands == 2) {
            const std::uint16_t unspecified = EXTRASAMPLE_UNSPECIFIED;
            if (TIFFSetField(m_file.get(), TIFFTAG_EXTRASAMPLES, 1, &unspecified) != 1) fail();
        }
        m_pixel = form.pixel_size();
        if (tiling.nlines != 0) {
            in_order = false;
            whole_tiles = true;
            set(TIFFTAG_TILELENGTH, tiling.nlines);
            set(TIFFTAG_TILEWIDTH, tiling.nsamps);
            m_piece.resize(static_cast<std::size_t>(TIFFTileSize64(m_file.get())));
        } else {
            constexpr std::int64_t strip = std::int64_t{256} << 10U;  // bytes, roughly
            const std::int64_t line = std::max<std::int64_t>(form.bytes() / form.nlines, 1);
            set(TIFFTAG_ROWSPERSTRIP,
                static_cast<std::uint32_t>(std::clamp<std::int64_t>(strip / line, 1, form.nlines)));
        }
        write_directory();
    }

    void write(const window &part, const block &samples) override
    {
        if (tiles.nlines != 0) return write_tiles(part, samples);
        m_piece.resize(samples.bytes.size() / static_cast<std::size_t>(samples.nlines));
        for (std::int32_t i = 0; i < samples.nlines; ++i) {
            gather_pixels(samples, {i, 0, samples.nsamps, 0}, m_piece.data());
            if (TIFFWriteScanline(m_file.get(), m_piece.data(),
                                  static_cast<std::uint32_t>(part.line + i), 0) != 1)
                fail();
        }
    }
    std::int64_t finish() override
    {
        if (TIFFFlush(m_file.get()) != 1) fail();
        m_file.reset();
        if (!m_message.empty()) fail();
        return -1;
    }

private:
    // Writes the directory before the samples: a truncated file then still states its size. The
    // offsets of strips and tiles follow once they are known.
    void write_directory()
    {
        TIFF *const file = m_file.get();
        if (TIFFDeferStrileArrayWriting(file) != 1 ||
            TIFFWriteCheck(file, whole_tiles ? 1 : 0, "") != 1 || TIFFWriteDirectory(file) != 1 ||
            TIFFSetDirectory(file, 0) != 1 || TIFFForceStrileArrayWriting(file) != 1)
            fail();
    }
    void write_tiles(const window &part, const block &samples)
    {
        const std::size_t pitch = static_cast<std::size_t>(tiles.nsamps) * m_pixel;
        for (std::int32_t top = 0; top < samples.nlines; top += tiles.nlines)
            for (std::int32_t left = 0; left < samples.nsamps; left += tiles.nsamps) {
                std::ranges::fill(m_piece, std::uint8_t{0});
                const std::int32_t count = std::min(tiles.nsamps, samples.nsamps - left);
                for (std::int32_t i = 0; i < std::min(tiles.nlines, samples.nlines - top); ++i)
                    gather_pixels(samples, {top + i, left, count, 0},
                                  &m_piece[static_cast<std::size_t>(i) * pitch]);
                if (TIFFWriteTile(m_file.get(), m_piece.data(),
                                  static_cast<std::uint32_t>(part.samp + left),
                                  static_cast<std::uint32_t>(part.line + top), 0, 0) == -1)
                    fail();
            }
    }
    [[noreturn]] void fail() const { throw failure(m_name, "cannot be written: " + m_message); }

    std::string m_name, m_message;
    tiff_file m_file;
    std::size_t m_pixel = 0;
    std::vector<std::uint8_t> m_piece;  // a line or a tile
};

}  // namespace

std::unique_ptr<image_reader> open_tiff(input_file file)
{
    return std::make_unique<tiff_reader>(std::move(file));
}

std::unique_ptr<image_writer> create_tiff(output_file &out, const shape &form, tile_size tiles)
{
    if (form.nbands < 1 || form.nbands > 3)
        throw failure(out.name(), text("TIFF files are written with 1 to 3 bands, not ",
                                       form.nbands, "; --band chooses some"));
    if (form.nsamples() == 0) throw failure(out.name(), "TIFF files cannot be empty");
    for (const std::int32_t side : {tiles.nlines, tiles.nsamps})
        if (side % 16 != 0)
            throw failure(out.name(), "the tile sides of TIFF files are multiples of 16");
    if (std::int64_t{tiles.nlines} * tiles.nsamps * form.nbands * form.nbytes >
        std::int64_t{LARGEST_PIECE})
        throw failure(out.name(), "its tiles would be too large; at most 48 MiB are supported");
    constexpr std::int64_t most = 2'000'000;  // libtiff holds all offsets in memory
    if (tiles_in(form, tiles) > most)
        throw failure(out.name(), "it would have too many tiles; choose larger ones");
    return std::make_unique<tiff_writer>(out, form, tiles);
}
