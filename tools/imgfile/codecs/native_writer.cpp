// Writing VITec and Helava images through the library, after checking that the format can hold
// them. Read native_image.h first.
#include "codecs/codecs.h"
#include "codecs/native_image.h"
#include "failure.h"
#include "output_file.h"

#include "base/report.h"
#include "formats/vitec.h"

namespace {

class native_writer : public image_writer {
public:
    native_writer(output_file &out, std::int32_t type, const shape &form, tile_size tiling)
        : m_name(out.name()), m_image(out.fd(), out.path(), out.name(), type, form, tiling)
    {
        tiles = tiling;
        m_length = m_image.whole_length();
        // Without the room, a write to one band would first fill all bands before it with zeros.
        out.reserve(m_length);
    }

    void write(const window &part, const block &samples) override
    {
        const img_message_keeper messages;
        for (std::int32_t band = 0; band < samples.nbands; ++band) {
            if (samples.nlines > 0 && samples.nsamps > 0 &&
                img_dump_buffer(m_image.handle(), part.line, part.samp, part.nlines, part.nsamps,
                                band, samples.row(band, 0), part.nsamps, nullptr) != 0)
                fail();
        }
    }
    std::int64_t finish() override { return m_length; }

private:
    [[noreturn]] void fail() const
    {
        const int error = img_message_keeper::last_error();
        throw failure(m_name, "cannot be written: " + (error != 0 ? system_text(error)
                                                                  : "not all bytes were accepted"));
    }

    std::string m_name;
    native_image m_image;
    std::int64_t m_length;
};

void check_tile_side(const std::string &name, std::int32_t side)
{
    if (!img_vitec_is_tile_size(side))
        throw failure(name, text("the tile sides of VITec files are powers of two from ",
                                 IMG_VITEC_MIN_TILE, " to ", IMG_VITEC_MAX_TILE));
}

void check_vitec(const std::string &name, const shape &form, tile_size tiles)
{
    if (form.nbands > IMG_VITEC_MAX_BANDS)
        throw failure(name, text("VITec files hold at most ", IMG_VITEC_MAX_BANDS, " bands, not ",
                                 form.nbands, " (imgfile convert --band chooses some)"));
    if (tiles.nlines == 0 && tiles.nsamps == 0) return;
    check_tile_side(name, tiles.nlines);
    check_tile_side(name, tiles.nsamps);
}

void check_helava(const std::string &name, const shape &form, tile_size tiles)
{
    if (form.nbytes != 1)
        throw failure(name, "Helava files hold samples of one byte (imgfile convert --stretch "
                            "reduces samples to one byte)");
    if (tiles.nlines != 0) throw failure(name, "Helava files have no tiles");
}

}  // namespace

std::unique_ptr<image_writer> create_native(output_file &out, file_format format, const shape &form,
                                            tile_size tiles)
{
    if (form.nlines < 0 || form.nsamps < 0 || form.nbands < 0)
        throw failure(out.name(), "sizes cannot be negative");
    const bool is_vitec = format == file_format::vitec;
    if (is_vitec)
        check_vitec(out.name(), form, tiles);
    else
        check_helava(out.name(), form, tiles);
    return std::make_unique<native_writer>(out, is_vitec ? IMG_TYPE_VITEC : IMG_TYPE_HELAVA, form,
                                           tiles);
}
