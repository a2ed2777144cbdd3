// VITec and Helava images that the library has open.
#ifndef TOOL_NATIVE_IMAGE_H
#define TOOL_NATIVE_IMAGE_H

#include "codecs/image.h"

#include "base/image_table.h"
#include "base/img_desc.h"
#include "imgfile/img.h"

// An image of the library, closed when it goes out of scope. The caller owns the descriptor of its
// file and closes it later. The name of the file may contain "@".
class native_image {
public:
    // Opens for reading. Throws `failure` when the library refuses the file.
    native_image(int fd, const std::string &name);
    // Creates. `path` is a name of the file, `shown` the one in failures.
    native_image(int fd, const std::string &path, const std::string &shown, std::int32_t type,
                 const shape &form, tile_size tiles);
    ~native_image();
    native_image(const native_image &) = delete;
    native_image &operator=(const native_image &) = delete;

    img_handle handle() const { return m_handle; }
    img_desc &desc() const { return *img_find_image(m_handle); }
    // Bytes that the file must have for all samples, trailer included.
    std::int64_t whole_length() const;

private:
    img_handle m_handle = -1;
};

#endif
