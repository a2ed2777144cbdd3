// TIFF files of 8 or 16 bits, in strips or tiles.
#include "failure.h"
#include "image.h"
#include "output.h"
#include "samples.h"

#include "std/std.h"

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <tiffio.h>

#include <unistd.h>

namespace {

int keep_message(TIFF * /*file*/, void *to, const char * /*module*/, const char *format,
                 std::va_list arguments)
{
    char message[512];
    const int error = errno;
    std::vsnprintf(message, sizeof message, format, arguments);
    *static_cast<std::string *>(to) =
        error == ENOSPC || error == EIO || error == EFBIG || error == EDQUOT ? system_text(error)
                                                                             : message;
    return 1;  // nobody else is told
}

using tiff_file = std::unique_ptr<TIFF, decltype(&TIFFClose)>;

// Opens `fd`, which is closed with the file, or now if that fails. What goes wrong with the file is
// left in `message`. "m" in the mode: without a mapping, whose pages would count as memory of this
// program.
tiff_file open_tiff_file(int fd, const std::string &name, const char *mode, std::string &message)
{
    const auto pass_over = [](TIFF *, void *, const char *, const char *, std::va_list) {
        return 1;
    };
    const std::unique_ptr<TIFFOpenOptions, decltype(&TIFFOpenOptionsFree)> options(
        TIFFOpenOptionsAlloc(), TIFFOpenOptionsFree);
    if (!options) throw std::bad_alloc();
    TIFFOpenOptionsSetErrorHandlerExtR(options.get(), keep_message, &message);
    TIFFOpenOptionsSetWarningHandlerExtR(options.get(), pass_over, nullptr);
    errno = 0;
    tiff_file file(TIFFFdOpenExt(fd, name.c_str(), mode, options.get()), TIFFClose);
    if (!file) ::close(fd);
    return file;
}

template <typename Number>
Number field(const tiff_file &file, ttag_t tag, Number otherwise)
{
    Number value = otherwise;
    TIFFGetFieldDefaulted(file.get(), tag, &value);
    return value;
}

constexpr std::uint64_t LARGEST_PIECE = std::uint64_t{48} << 20U;  // bytes of a tile

class tiff_reader : public image_reader {
public:
    tiff_reader(const std::string &path, int fd)
        : image_reader(path, file_format::tiff), m_file(open_tiff_file(fd, path, "rm", m_message))
    {
        if (!m_file) throw failure(name, "is a damaged TIFF file: " + m_message);
        refuse_unless(field<std::uint16_t>(m_file, TIFFTAG_SAMPLEFORMAT, SAMPLEFORMAT_UINT) ==
                          SAMPLEFORMAT_UINT,
                      "samples that are not unsigned whole numbers");
        const int bits = field<std::uint16_t>(m_file, TIFFTAG_BITSPERSAMPLE, 1);
        refuse_unless(bits == 8 || bits == 16, text("samples of ", bits, " bits"));
        const int photometric =
            field<std::uint16_t>(m_file, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_MINISBLACK);
        const bool lossy =
            field<std::uint16_t>(m_file, TIFFTAG_COMPRESSION, COMPRESSION_NONE) == COMPRESSION_JPEG;
        refuse_unless(photometric == PHOTOMETRIC_MINISBLACK || photometric == PHOTOMETRIC_RGB ||
                          (photometric == PHOTOMETRIC_YCBCR && lossy),
                      "colours that are neither gray nor RGB");
        if (photometric == PHOTOMETRIC_YCBCR)
            TIFFSetField(m_file.get(), TIFFTAG_JPEGCOLORMODE, JPEGCOLORMODE_RGB);

        const auto nlines = field<std::uint32_t>(m_file, TIFFTAG_IMAGELENGTH, 0);
        const auto nsamps = field<std::uint32_t>(m_file, TIFFTAG_IMAGEWIDTH, 0);
        refuse_unless(nlines >= 1 && nsamps >= 1 && nlines <= INT32_MAX && nsamps <= INT32_MAX,
                      "no usable size");
        form = {.nlines = static_cast<std::int32_t>(nlines),
                .nsamps = static_cast<std::int32_t>(nsamps),
                .nbands = field<std::uint16_t>(m_file, TIFFTAG_SAMPLESPERPIXEL, 1),
                .nbytes = bits / 8,
                .nbits = bits};
        m_planar = form.nbands > 1 &&
                   field<std::uint16_t>(m_file, TIFFTAG_PLANARCONFIG, PLANARCONFIG_CONTIG) ==
                       PLANARCONFIG_SEPARATE;
        if (TIFFIsTiled(m_file.get()) != 0) {
            tiles = {static_cast<std::int32_t>(field<std::uint32_t>(m_file, TIFFTAG_TILELENGTH, 0)),
                     static_cast<std::int32_t>(field<std::uint32_t>(m_file, TIFFTAG_TILEWIDTH, 0))};
            const std::uint64_t size = TIFFTileSize64(m_file.get());
            refuse_unless(size > 0 && size <= LARGEST_PIECE, "tiles of no usable size");
        } else {
            in_order = true;
            refuse_unless(TIFFScanlineSize64(m_file.get()) > 0, "lines of no usable size");
        }
    }

    void read(const window &part, const band_list &bands, block &to) override
    {
        const bool tiled = tiles.nlines != 0;
        m_piece.resize(static_cast<std::size_t>(tiled ? TIFFTileSize64(m_file.get())
                                                      : TIFFScanlineSize64(m_file.get())));
        if (tiled)
            read_tiles(part, bands, to);
        else
            read_lines(part, bands, to);
    }

private:
    void refuse_unless(bool fit, const std::string &what)
    {
        if (!fit)
            throw failure(name,
                          "has " + what + "; TIFF files of 8 or 16 bits, gray or RGB, are read");
    }
    [[noreturn]] void fail_at(std::int32_t line) const
    {
        throw failure(name, text("line ", line, " is missing or damaged",
                                 m_message.empty() ? "" : ": ", m_message));
    }

    // Calls `take(plane, nbands, bands, position)` for each of what is stored by itself: all bands
    // in one, or each band in its own plane, where its samples lie side by side.
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

    // libtiff reads lines of compressed strips from the top only, and starts over by itself when
    // the plane changes.
    void read_lines(const window &part, const band_list &bands, block &to)
    {
        for_each_plane(bands, [&](std::uint16_t plane, std::int32_t nbands, const band_list &chosen,
                                  std::int32_t position) {
            for (std::int32_t i = 0; i < part.nlines; ++i) {
                if (TIFFReadScanline(m_file.get(), m_piece.data(),
                                     static_cast<std::uint32_t>(part.line + i), plane) != 1 ||
                    !m_message.empty())
                    fail_at(part.line + i);
                spread_pixels(&m_piece[static_cast<std::size_t>(part.samp) * pixel_size(nbands)],
                              nbands, chosen, {i, 0, part.nsamps, position}, to);
            }
        });
    }

    void read_tiles(const window &part, const band_list &bands, block &to)
    {
        const std::int32_t last_line = part.line + part.nlines, last_samp = part.samp + part.nsamps;
        for_each_plane(bands, [&](std::uint16_t plane, std::int32_t nbands, const band_list &chosen,
                                  std::int32_t position) {
            for (std::int64_t top = part.line / tiles.nlines * tiles.nlines; top < last_line;
                 top += tiles.nlines)
                for (std::int64_t left = part.samp / tiles.nsamps * tiles.nsamps; left < last_samp;
                     left += tiles.nsamps) {
                    if (TIFFReadTile(m_file.get(), m_piece.data(), static_cast<std::uint32_t>(left),
                                     static_cast<std::uint32_t>(top), 0, plane) == -1 ||
                        !m_message.empty())
                        fail_at(static_cast<std::int32_t>(top));
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
                            to);
                }
        });
    }

    std::size_t pixel_size(std::int32_t nbands) const
    {
        return static_cast<std::size_t>(nbands * form.nbytes);
    }

    std::string m_message;  // of what went wrong last
    tiff_file m_file;
    bool m_planar = false;
    std::vector<std::uint8_t> m_piece;  // a line or a tile
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
        m_pixel = static_cast<std::size_t>(form.nbands * form.nbytes);
        if (tiling.nlines != 0) {
            in_order = false;
            whole_tiles = true;
            set(TIFFTAG_TILELENGTH, tiling.nlines);
            set(TIFFTAG_TILEWIDTH, tiling.nsamps);
            m_piece.resize(static_cast<std::size_t>(TIFFTileSize64(m_file.get())));
        } else {
            constexpr std::int64_t strip = std::int64_t{256} << 10U;  // bytes, about
            const std::int64_t line = std::max<std::int64_t>(form.bytes() / form.nlines, 1);
            set(TIFFTAG_ROWSPERSTRIP,
                static_cast<std::uint32_t>(std::clamp<std::int64_t>(strip / line, 1, form.nlines)));
        }
    }

    void write(const window &at, const block &from) override
    {
        if (tiles.nlines != 0) return write_tiles(at, from);
        m_piece.resize(from.bytes.size() / static_cast<std::size_t>(from.nlines));
        for (std::int32_t i = 0; i < from.nlines; ++i) {
            gather_pixels(from, {i, 0, from.nsamps, 0}, m_piece.data());
            if (TIFFWriteScanline(m_file.get(), m_piece.data(),
                                  static_cast<std::uint32_t>(at.line + i), 0) != 1)
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
    void write_tiles(const window &at, const block &from)
    {
        const std::size_t pitch = static_cast<std::size_t>(tiles.nsamps) * m_pixel;
        for (std::int32_t top = 0; top < from.nlines; top += tiles.nlines)
            for (std::int32_t left = 0; left < from.nsamps; left += tiles.nsamps) {
                std::ranges::fill(m_piece, std::uint8_t{0});
                const std::int32_t count = std::min(tiles.nsamps, from.nsamps - left);
                for (std::int32_t i = 0; i < std::min(tiles.nlines, from.nlines - top); ++i)
                    gather_pixels(from, {top + i, left, count, 0},
                                  &m_piece[static_cast<std::size_t>(i) * pitch]);
                if (TIFFWriteTile(m_file.get(), m_piece.data(),
                                  static_cast<std::uint32_t>(at.samp + left),
                                  static_cast<std::uint32_t>(at.line + top), 0, 0) == -1)
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

std::unique_ptr<image_reader> open_tiff(const std::string &name, int fd)
{
    return std::make_unique<tiff_reader>(name, fd);
}

std::unique_ptr<image_writer> create_tiff(output_file &out, const shape &form, tile_size tiles)
{
    if (form.nbands < 1 || form.nbands > 3)
        throw failure(out.name(), text("TIFF files are written with 1 to 3 bands, not ",
                                       form.nbands, "; --band chooses some"));
    if (form.nsamples() == 0) throw failure(out.name(), "an empty image is no TIFF picture");
    for (const std::int32_t side : {tiles.nlines, tiles.nsamps})
        if (side % 16 != 0)
            throw failure(out.name(), "tiles of TIFF files are multiples of 16 high and wide");
    if (std::int64_t{tiles.nlines} * tiles.nsamps * form.nbands * form.nbytes >
        std::int64_t{LARGEST_PIECE})
        throw failure(out.name(), "its tiles would be too large");
    constexpr std::int64_t most = 2'000'000;  // libtiff holds the places of all in memory
    if (tiles_in(form, tiles) > most)
        throw failure(out.name(), "it would have too many tiles; ask for larger ones");
    return std::make_unique<tiff_writer>(out, form, tiles);
}
