// Where samples lie behind the header and what reads of them deliver, said once more and without
// the library.
#ifndef IMG_TEST_LAYOUT_RULES_H
#define IMG_TEST_LAYOUT_RULES_H

#include "support/files.h"
#include "support/test_image.h"

#include <algorithm>
#include <bit>
#include <cstddef>
#include <utility>

inline bool has_tiles(const test_geometry &image)
{
    return image.tile_nsamps != 0 && image.tile_nlines != 0;
}

// True when a pixel's samples of all bands lie side by side, and move together.
inline bool is_interleaved(const test_geometry &image)
{
    return image.nbands > 1 &&
           (image.layout == IMG_LAYOUT_BIP || image.layout == IMG_LAYOUT_TILED_BIP);
}

// Lines or samples that are stored for `extent` of them.
inline std::int64_t stored_extent(std::int64_t extent, std::int64_t tile_extent)
{
    return tile_extent == 0 ? extent : (extent + tile_extent - 1) / tile_extent * tile_extent;
}

// Bytes between the first pixel and a sample.
inline std::size_t stored_at(const test_geometry &image, std::int64_t band, std::int64_t line,
                             std::int64_t samp)
{
    const std::int64_t width = stored_extent(image.nsamps, image.tile_nsamps);
    const std::int64_t height = stored_extent(image.nlines, image.tile_nlines);
    const std::int64_t tile_plane = std::int64_t{image.tile_nlines} * image.tile_nsamps;
    std::int64_t tile = 0, pixel = line * width + samp;
    if (tile_plane != 0) {
        tile = line / image.tile_nlines * (width / image.tile_nsamps) + samp / image.tile_nsamps;
        pixel = line % image.tile_nlines * image.tile_nsamps + samp % image.tile_nsamps;
    }
    std::int64_t sample = band * width * height + tile * tile_plane + pixel;
    if (image.layout == IMG_LAYOUT_BIP || image.layout == IMG_LAYOUT_TILED_BIP)
        sample = (tile * tile_plane + pixel) * image.nbands + band;
    else if (image.layout == IMG_LAYOUT_TILED)
        sample = (tile * image.nbands + band) * tile_plane + pixel;
    return static_cast<std::size_t>(sample * image.nbytes);
}

// Bytes of all pixels.
inline std::size_t stored_bytes(const test_geometry &image)
{
    return static_cast<std::size_t>(stored_extent(image.nlines, image.tile_nlines) *
                                    stored_extent(image.nsamps, image.tile_nsamps) * image.nbands *
                                    image.nbytes);
}

// True when an image of that geometry, any numbers, may be opened and created: no size is
// negative, samples have one byte or two, and every size and the end of the data fit 31 bits.
inline bool is_within_limits(const test_geometry &image, std::int64_t data_offset)
{
    if (std::min({image.nlines, image.nsamps, image.nbands, image.tile_nsamps, image.tile_nlines}) <
            0 ||
        image.nbytes < 1 || image.nbytes > 2 || data_offset < 0)
        return false;
    // As floating-point numbers, products are exact or far too large, but never wrap.
    const auto width = static_cast<double>(stored_extent(image.nsamps, image.tile_nsamps));
    const auto height = static_cast<double>(stored_extent(image.nlines, image.tile_nlines));
    const double plane = width * height * image.nbytes;
    const double tile = static_cast<double>(image.tile_nsamps) * image.tile_nlines * image.nbytes;
    const double end = static_cast<double>(data_offset) + plane * image.nbands;
    return std::max({width, height, plane, tile, end}) <= INT32_MAX;
}

// A file byte by byte, and the image in it.
struct file_image {
    test_geometry image;
    std::int64_t data_offset;
    bytes content;
};

inline constexpr std::uint8_t UNTOUCHED = 0xEE, FILL = 0x55;

// Works out what reads of a file leave in a buffer of UNTOUCHED bytes, windows beyond the image
// with FILL around it, and what they say.
class reader {
public:
    explicit reader(const file_image &file) : m_file(file) {}

    // What a load of a window leaves; its rows come without gaps.
    bytes window(std::int64_t band, std::int64_t line, std::int64_t samp, std::int64_t nlines,
                 std::int64_t nsamps)
    {
        const auto nbytes = static_cast<std::size_t>(m_image.nbytes);
        bytes buffer(static_cast<std::size_t>(nlines * nsamps) * nbytes, UNTOUCHED);
        const std::int64_t right = std::min<std::int64_t>(samp + nsamps, m_image.nsamps);
        const std::int64_t bottom = std::min<std::int64_t>(line + nlines, m_image.nlines);
        m_fell_short = false;
        if (line < 0 || samp < 0 || bottom < line + nlines || right < samp + nsamps)
            for (std::size_t i = 0; i < buffer.size(); ++i)
                buffer[i] =
                    i % nbytes == (std::endian::native == std::endian::little ? 0 : nbytes - 1)
                        ? FILL
                        : 0;
        const std::int64_t left = std::max<std::int64_t>(samp, 0);
        std::int64_t at = std::max<std::int64_t>(line, 0);
        auto to = buffer.begin() + ((at - line) * nsamps + left - samp) * m_image.nbytes;
        while (at < bottom && left < right && reads(band, at, left, right - left, to)) {
            const std::int64_t end = stored_extent(at + 1, has_tiles(m_image) ? height() : 1);
            for (; at < std::min(end, bottom); ++at, to += nsamps * m_image.nbytes)
                for (std::int64_t i = left; i < right; ++i)
                    deliver(place(band, at, i), to + (i - left) * m_image.nbytes);
        }
        return buffer;
    }
    // What a load of one whole tile leaves.
    bytes tile(std::int64_t band, std::int64_t tile)
    {
        bytes plane(static_cast<std::size_t>(height() * width() * m_image.nbytes), UNTOUCHED);
        const std::int64_t line = tile / tiles_across() * height();
        const std::int64_t samp = tile % tiles_across() * width();
        m_fell_short = false;
        reads(band, line, samp, width(), plane.begin());
        for (std::size_t i = 0; i < plane.size(); ++i) {  // of interleaved pixels, whole samples
            const auto nbytes = static_cast<std::size_t>(m_image.nbytes), byte = i % nbytes;
            const auto pixel = static_cast<std::int64_t>(i / nbytes);
            const std::size_t at = place(band, line + pixel / width(), samp + pixel % width());
            if (available(at) > (is_interleaved(m_image) ? nbytes - 1 : byte))
                plane[i] = m_file.content[at + byte];
        }
        return plane;
    }
    // Tiles of a band; 0: none, or such as are too large to be read one by one.
    std::int32_t ntiles() const
    {
        if (!has_tiles(m_image) || height() * width() > 1 << 16) return 0;
        const std::int64_t tiles_down = stored_extent(m_image.nlines, height()) / height();
        return static_cast<std::int32_t>(tiles_across() * tiles_down);
    }
    bool fell_short() const { return m_fell_short; }
    const std::string &text() const { return m_text; }

private:
    std::int64_t height() const { return m_image.tile_nlines; }
    std::int64_t width() const { return m_image.tile_nsamps; }
    std::int64_t tiles_across() const { return stored_extent(m_image.nsamps, width()) / width(); }
    std::size_t place(std::int64_t band, std::int64_t line, std::int64_t samp) const
    {
        return static_cast<std::size_t>(m_file.data_offset) + stored_at(m_image, band, line, samp);
    }
    std::size_t available(std::size_t at) const
    {
        return m_file.content.size() - std::min(at, m_file.content.size());
    }
    void deliver(std::size_t at, bytes::iterator to) const
    {
        std::copy_n(&m_file.content[at], m_image.nbytes, to);
        if (m_image.nbytes == 2 && m_image.swap != 0) std::swap(to[0], to[1]);
    }
    // Reads the samples of a line that begin at `samp`, or the tiles that hold them. False: the
    // file ends before; what there is of an untiled line is at `to`.
    bool reads(std::int64_t band, std::int64_t line, std::int64_t samp, std::int64_t nsamps,
               bytes::iterator to)
    {
        const bool tiled = has_tiles(m_image), interleaved = is_interleaved(m_image);
        std::int64_t pieces = 1, length = nsamps * m_image.nbytes;
        if (tiled) {
            nsamps += samp % width();
            samp -= samp % width();
            line -= line % height();
            pieces = (nsamps + width() - 1) / width();
            length = height() * width() * m_image.nbytes;
        }
        if (interleaved) length *= m_image.nbands;
        if (m_image.layout != IMG_LAYOUT_TILED || m_image.nbands == 1)
            length *= std::exchange(pieces, 1);
        for (std::int64_t i = 0; i < pieces; ++i) {
            const std::size_t at =
                place(interleaved ? 0 : band, line, samp + (tiled ? i * width() : 0));
            const auto got = static_cast<std::int64_t>(available(at));
            if (got >= length) continue;
            m_fell_short = true;
            m_text += tiled         ? "img_std_read_tiles: "
                      : interleaved ? "img_std_read_nontiled_interleaved: "
                                    : "img_read_nontiled: ";
            m_text += std::to_string(got) + " of " + std::to_string(length) + " bytes read!!\n";
            if (!tiled && !interleaved) std::copy_n(m_file.content.end() - got, got, to);
            return false;
        }
        return true;
    }

    const file_image &m_file;
    const test_geometry &m_image = m_file.image;
    bool m_fell_short = false;
    std::string m_text;
};

// Why a VITec header cannot store an image, however small it may be.
inline std::string vitec_objection(const test_geometry &image)
{
    if (image.nbands > 3) return "Unsupported number of bands, must be less than 4!!\n";
    for (const std::int32_t size : {image.tile_nsamps, image.tile_nlines})
        if (size != 0 && (size < 8 || !std::has_single_bit(static_cast<std::uint16_t>(size))))
            return "Unsupported tile size, must be power of 2 >= 8!!\n";
    return image.nbytes < 3
               ? ""
               : "Unsupported # bits per pixel (" + std::to_string(image.nbytes) + ")!!\n";
}

#endif
