// Opening and creating images in the library, by way of the tool's access methods. Read
// native_image.h, api/open.h and codecs/open_file_method.h first.
#include "codecs/native_image.h"

#include "codecs/native_header.h"
#include "codecs/open_file_method.h"
#include "failure.h"

#include "api/open.h"
#include "formats/helava.h"
#include "std/std.h"

#include <cerrno>

namespace {

constexpr std::size_t LARGEST_TILE = std::size_t{4} << 20U;  // bytes read for a part of it

std::int64_t padded(std::int32_t extent, std::int32_t tile_extent)
{
    return tile_extent == 0 ? extent
                            : std::int64_t{img_whole_tiles(extent, tile_extent)} * tile_extent;
}

}  // namespace

native_image::native_image(int fd, const std::string &name)
{
    const offered_descriptor offer(fd);
    m_handle = img_open_plain_file(name.c_str(), &plain_method(), IMG_OPEN_READ_ONLY);
    if (m_handle != -1 && img_is_tiled(&desc()) && img_plane_size(&desc()) > LARGEST_TILE) {
        img_closefile(m_handle);
        m_handle = img_open_plain_file(name.c_str(), &mapped_method(), IMG_OPEN_READ_ONLY);
    }
    if (m_handle != -1) return;
    const native_header header = read_native_header(fd);
    throw failure(name, header.vitec || header.helava
                            ? "has a header that describes no readable image"
                            : "is not a known image format, or its header is damaged");
}

native_image::native_image(int fd, const std::string &path, const std::string &shown,
                           std::int32_t type, const shape &form, tile_size tiles)
{
    const offered_descriptor offer(fd);
    const std::int64_t length =
        padded(form.nlines, tiles.nlines) * padded(form.nsamps, tiles.nsamps);
    if (form.nbands * form.nbytes != 0 && length > INT32_MAX / (form.nbands * form.nbytes))
        throw failure(shown, "cannot be created: the file would have 2 GiB or more");
    errno = 0;
    m_handle = img_create_plain_file(path.c_str(), &plain_method(), form.nlines, form.nsamps,
                                     form.nbands, type, tiles.nsamps, tiles.nlines, form.nbytes);
    if (m_handle == -1)
        throw failure(shown, errno != 0 && errno != EINVAL
                                 ? "cannot be written: " + system_text(errno)
                                 : "cannot be created: the file would have 2 GiB or more");
}

native_image::~native_image()
{
    img_closefile(m_handle);
}

std::int64_t native_image::whole_length() const
{
    const img_std_file &file = *desc().std_file;
    const std::int64_t samples =
        std::int64_t{file.padded_nlines} * file.padded_nsamps * desc().nbands;
    return file.data_offset + samples * desc().nbytes +
           (desc().type == IMG_TYPE_HELAVA ? std::int64_t{IMG_HELAVA_TRAILER_LENGTH} : 0);
}
