// Reading VITec and Helava images: raw samples of two bytes included, which the exported functions
// do not pass on. Read native_image.h first.
#include "codecs/codecs.h"
#include "codecs/native_header.h"
#include "codecs/native_image.h"
#include "failure.h"

#include "base/report.h"
#include "base/types.h"
#include "formats/words.h"
#include "std/std.h"

#include <array>

namespace {

constexpr std::array layouts{"band sequential", "pixel interleaved", "tiles of band planes",
                             "bands of tiles", "tiles of pixels"};

class native_reader : public image_reader {
public:
    explicit native_reader(input_file file)
        : image_reader(file, file_format::vitec), m_file(std::move(file)),
          m_image(m_file.fd(), name)
    {
        const img_desc &desc = m_image.desc();
        if (desc.type == IMG_TYPE_HELAVA) format = file_format::helava;
        form = {desc.nlines, desc.nsamps, desc.nbands, desc.nbytes, desc.nbits};
        if (img_is_tiled(&desc)) tiles = {desc.tile_nlines, desc.tile_nsamps};
        expected_length = m_image.whole_length();
        native = {.big_endian = (desc.swap != 0) == IMG_WRITES_SWAPPED,
                  .layout = layouts.at(static_cast<std::size_t>(desc.layout)),
                  .tiles_down = desc.std_file->tiles_down,
                  .tiles_across = desc.std_file->tiles_across,
                  .data_offset = desc.std_file->data_offset,
                  .created = creation_date()};
    }

    void read(const window &part, const band_list &bands, block &samples) override
    {
        for (std::size_t i = 0; i < bands.size(); ++i) {
            const auto position = static_cast<std::int32_t>(i);
            if (part.nlines > 0 && part.nsamps > 0 &&
                !read_band(part, bands[i], samples.row(position, 0)))
                fail(part, bands[i]);
        }
    }

private:
    std::string creation_date() const
    {
        if (format != file_format::vitec) return "";
        const native_header header = read_native_header(m_file.fd());
        return header.vitec && has_date(header.vitec->file) ? date_text(header.vitec->file) : "";
    }

    bool read_band(const window &part, std::int32_t band, std::uint8_t *samples)
    {
        const img_message_keeper messages;
        img_desc &desc = m_image.desc();
        return img_type_of(&desc).read(&desc, part.line, part.samp, part.nlines, part.nsamps, band,
                                       samples, part.nsamps) == 0;
    }

    bool has_line(std::int32_t line, std::int32_t band)
    {
        m_line.resize(static_cast<std::size_t>(form.nsamps) *
                      static_cast<std::size_t>(form.nbytes));
        return read_band({line, 0, 1, form.nsamps}, band, m_line.data());
    }

    // Finds the first missing line of a band whose last line is missing, by bisection.
    std::int32_t first_missing_line(std::int32_t band)
    {
        std::int32_t first = 0, last = form.nlines - 1;
        while (first < last) {
            const std::int32_t middle = first + (last - first) / 2;
            if (has_line(middle, band))
                first = middle + 1;
            else
                last = middle;
        }
        return last;
    }

    // Names the first line of the file that cannot be read, not only of the window. Tiled
    // files hold their bands side by side, others one after the other.
    [[noreturn]] void fail(const window &part, std::int32_t failed_band)
    {
        const int error = img_message_keeper::last_error();
        std::int32_t line = part.line, band = failed_band;
        bool found = false;
        for (std::int32_t each = 0; each < form.nbands && (!found || tiles.nlines != 0); ++each) {
            if (has_line(form.nlines - 1, each)) continue;
            const std::int32_t first = first_missing_line(each);
            if (found && first >= line) continue;
            line = first;
            band = each;
            found = true;
        }
        const std::string missing = text("line ", line, " of band ", band);
        throw failure(name, error == 0 ? "truncated: " + missing + " is missing"
                                       : missing + " cannot be read: " + system_text(error));
    }

    input_file m_file;
    native_image m_image;
    std::vector<std::uint8_t> m_line;
};

}  // namespace

std::unique_ptr<image_reader> open_native(input_file file)
{
    return std::make_unique<native_reader>(std::move(file));
}
