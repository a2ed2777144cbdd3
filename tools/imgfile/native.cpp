#include "native.h"

#include "failure.h"
#include "header.h"
#include "output.h"

#include "api/library.h"
#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "base/types.h"
#include "formats/helava.h"
#include "imgfile/img.h"
#include "io/io_method.h"
#include "io/platform.h"
#include "std/std.h"
#include "std/std_bytes.h"

#include <cerrno>
#include <charconv>
#include <map>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

int last_error = 0;

void keep_message(const char * /*text*/, int error)
{
    if (error != 0) last_error = error;
}

// Names of files that are open, by the number that the library knows them by: the access methods
// of the tool take such a number for a name, and so any "@" in the name itself means nothing.
std::map<std::int32_t, std::string> names;

std::int32_t open_by_number(const char *number, std::int32_t oflags, std::int32_t mode)
{
    std::int32_t key = -1;
    std::from_chars(number, number + std::char_traits<char>::length(number), key);
    return img_platform_open(names.at(key).c_str(), oflags, mode);
}

// Room for what is lent: a piece of a walk, and more.
constexpr std::int32_t LARGEST_COPY = 9 << 20;
std::unique_ptr<std::uint8_t[]> copy;

// Lends a copy of the bytes, which came with one call. Many short lines would take as many.
std::int32_t lend_copy(std::int32_t fd, std::int32_t offset, std::int32_t count, img_io_use_fn use,
                       void *arg)
{
    if (count < 1 || count > LARGEST_COPY ||
        ::pread(fd, copy.get(), static_cast<std::size_t>(count), offset) != count)
        return -1;
    use(arg, copy.get());
    return 0;
}

// Returns the number of a new name. "plain" moves bytes with calls alone: pages of a mapping would
// count as memory of this program.
std::int32_t register_name(const std::string &name)
{
    static std::int32_t next = 0;
    if (next == 0) {
        copy = std::make_unique_for_overwrite<std::uint8_t[]>(LARGEST_COPY);
        img_library_init();
        img_message_sink = keep_message;
        for (const char *const method : {"plain", "mapped"})
            img_register_io_method(method, nullptr, open_by_number, img_platform_close,
                                   img_platform_read, img_platform_write, img_platform_seek,
                                   img_platform_unlink, nullptr);
        img_offer_lending("plain", lend_copy);
        img_offer_lending("mapped", img_platform_lend);
        img_allow_merging("plain");
        img_allow_merging("mapped");
    }
    names[next] = name;
    return next++;
}

// Larger tiles are not read whole for a part of them.
constexpr std::size_t LARGEST_TILE = std::size_t{4} << 20U;

void check_is_readable(const std::string &path)
{
    struct stat status;
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (fd == -1) throw failure(path, system_text(errno));
    const bool known = ::fstat(fd, &status) == 0;
    ::close(fd);
    if (!known || !(S_ISREG(status.st_mode) || S_ISBLK(status.st_mode)))
        throw failure(path, "is not a regular file");
}

class native_reader : public image_reader {
public:
    explicit native_reader(const std::string &path)
        : image_reader(path, file_format::vitec), m_image(path)
    {
        const img_desc &desc = m_image.desc();
        if (desc.type == IMG_TYPE_HELAVA) format = file_format::helava;
        form = {desc.nlines, desc.nsamps, desc.nbands, desc.nbytes, desc.nbits};
        if (img_is_tiled(&desc)) tiles = {desc.tile_nlines, desc.tile_nsamps};
        length = m_image.whole_length();
    }

    void read(const window &part, const band_list &bands, block &to) override
    {
        for (std::size_t i = 0; i < bands.size(); ++i) {
            const auto at = static_cast<std::int32_t>(i);
            if (part.nlines > 0 && part.nsamps > 0 && !read_band(part, bands[i], to.row(at, 0)))
                fail(part, bands[i]);
        }
    }

private:
    bool read_band(const window &part, std::int32_t band, std::uint8_t *to)
    {
        library_message::forget();
        img_desc *const desc = img_find_image(m_image.handle());
        return img_type_of(desc).read(desc, part.line, part.samp, part.nlines, part.nsamps, band,
                                      to, part.nsamps) == 0;
    }

    bool has_line(std::int32_t line, std::int32_t band)
    {
        m_line.resize(static_cast<std::size_t>(form.nsamps) *
                      static_cast<std::size_t>(form.nbytes));
        return read_band({line, 0, 1, form.nsamps}, band, m_line.data());
    }

    // Of a band whose last line is missing, by halving what is left.
    std::int32_t first_missing_line(std::int32_t band)
    {
        std::int32_t from = 0, past = form.nlines - 1;
        while (from < past) {
            const std::int32_t middle = from + (past - from) / 2;
            if (has_line(middle, band))
                from = middle + 1;
            else
                past = middle;
        }
        return past;
    }

    // Names the first line of the file that cannot be read, whatever part was asked for: tiled
    // files hold their bands side by side, others one after the other.
    [[noreturn]] void fail(const window &part, std::int32_t failed_band)
    {
        const std::string reason = library_message::reason("");
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
        const std::string where = text("line ", line, " of band ", band);
        throw failure(name, reason.empty() ? "cut short: " + where + " is missing"
                                           : where + " cannot be read: " + reason);
    }

    native_image m_image;
    std::vector<std::uint8_t> m_line;
};

class native_writer : public image_writer {
public:
    native_writer(output_file &out, std::int32_t type, const shape &form, tile_size tiling)
        : m_name(out.name()), m_image(out.path(), out.name(), type, form, tiling)
    {
        tiles = tiling;
        m_length = m_image.whole_length();
        out.reserve(m_length);  // else bands would be filled up before those after them
    }

    void write(const window &at, const block &from) override
    {
        for (std::int32_t band = 0; band < from.nbands; ++band) {
            library_message::forget();
            if (from.nlines > 0 && from.nsamps > 0 &&
                img_dump_buffer(m_image.handle(), at.line, at.samp, at.nlines, at.nsamps, band,
                                from.row(band, 0), at.nsamps, nullptr) != 0)
                throw failure(m_name, "cannot be written: " +
                                          library_message::reason("not all of it was taken"));
        }
    }
    std::int64_t finish() override { return m_length; }

private:
    std::string m_name;
    native_image m_image;
    std::int64_t m_length;
};

std::int64_t padded(std::int32_t extent, std::int32_t tile_extent)
{
    return tile_extent == 0 ? extent
                            : std::int64_t{img_whole_tiles(extent, tile_extent)} * tile_extent;
}

void check_tile_side(const std::string &name, std::int32_t side)
{
    if (!is_vitec_tile_side(side))
        throw failure(name, "tiles of VITec files are powers of two from 8 to 32768 high and wide");
}

void check_can_hold(const std::string &name, file_format format, const shape &form, tile_size tiles)
{
    if (form.nlines < 0 || form.nsamps < 0 || form.nbands < 0)
        throw failure(name, "sizes cannot be negative");
    if (format == file_format::helava) {
        if (form.nbytes != 1)
            throw failure(
                name,
                "Helava files hold samples of one byte (imgfile convert --stretch makes such)");
        if (tiles.nlines != 0) throw failure(name, "Helava files have no tiles");
    } else {
        if (form.nbands > 3)
            throw failure(name, text("VITec files hold at most 3 bands, not ", form.nbands,
                                     " (imgfile convert --band chooses some)"));
        if (tiles.nlines != 0 || tiles.nsamps != 0) {
            check_tile_side(name, tiles.nlines);
            check_tile_side(name, tiles.nsamps);
        }
    }
}

}  // namespace

void library_message::forget()
{
    last_error = 0;
}

std::string library_message::reason(const std::string &otherwise)
{
    return last_error != 0 ? system_text(last_error) : otherwise;
}

native_image::native_image(const std::string &path) : m_name(register_name(path))
{
    check_is_readable(path);
    m_handle = img_openfile(text(m_name, "@plain").c_str(), IMG_OPEN_READ_ONLY);
    if (m_handle != -1 && img_is_tiled(&desc()) && img_plane_size(&desc()) > LARGEST_TILE) {
        img_closefile(m_handle);
        m_handle = img_openfile(text(m_name, "@mapped").c_str(), IMG_OPEN_READ_ONLY);
    }
    if (m_handle == -1)
        throw failure(path, read_vitec_header(path) || read_helava_trailer(path)
                                ? "has a header that describes no readable image"
                                : "is no image of a known format, or its header is damaged");
}

native_image::native_image(const std::string &path, const std::string &shown, std::int32_t type,
                           const shape &form, tile_size tiles)
    : m_name(register_name(path))
{
    const std::int64_t length =
        padded(form.nlines, tiles.nlines) * padded(form.nsamps, tiles.nsamps);
    if (form.nbands * form.nbytes != 0 && length > INT32_MAX / (form.nbands * form.nbytes))
        throw failure(shown, "cannot be created: the file would have 2 GiB or more");
    errno = 0;
    m_handle = img_createfile(text(m_name, "@plain").c_str(), form.nlines, form.nsamps, form.nbands,
                              type, tiles.nsamps, tiles.nlines, form.nbytes);
    if (m_handle == -1)
        throw failure(shown, errno != 0 && errno != EINVAL
                                 ? "cannot be written: " + system_text(errno)
                                 : "cannot be created: the file would have 2 GiB or more");
}

native_image::~native_image()
{
    img_closefile(m_handle);
    names.erase(m_name);
}

std::int64_t native_image::whole_length() const
{
    const img_std_file &file = *desc().std_file;
    const std::int64_t samples =
        std::int64_t{file.padded_nlines} * file.padded_nsamps * desc().nbands;
    return file.data_offset + samples * desc().nbytes +
           (desc().type == IMG_TYPE_HELAVA ? std::int64_t{IMG_HELAVA_TRAILER_LENGTH} : 0);
}

std::unique_ptr<image_reader> open_native(const std::string &name)
{
    return std::make_unique<native_reader>(name);
}

std::unique_ptr<image_writer> create_native(output_file &out, file_format format, const shape &form,
                                            tile_size tiles)
{
    check_can_hold(out.name(), format, form, tiles);
    return std::make_unique<native_writer>(
        out, format == file_format::vitec ? IMG_TYPE_VITEC : IMG_TYPE_HELAVA, form, tiles);
}
