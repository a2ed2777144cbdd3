// VITec and Helava images as the library has them open, raw samples included.
#ifndef TOOL_NATIVE_H
#define TOOL_NATIVE_H

#include "image.h"

#include "base/image_table.h"
#include "base/img_desc.h"
#include "imgfile/img.h"

#include <functional>

// The last thing that the library said since forget() was called.
class library_message {
public:
    static void forget();
    // In the tool's words: what the operating system gave as the reason, else `otherwise`.
    static std::string reason(const std::string &otherwise);
};

// An image of the library, closed when it goes out of scope. The file may have any name: what the
// library would take for the name of an access method is kept from it.
class native_image {
public:
    // Opens for reading. Throws `failure`, which says so when the file is of another format.
    explicit native_image(const std::string &path);
    // Creates; `shown` is the name in failures.
    native_image(const std::string &path, const std::string &shown, std::int32_t type,
                 const shape &form, tile_size tiles);
    ~native_image();
    native_image(const native_image &) = delete;
    native_image &operator=(const native_image &) = delete;

    img_handle handle() const { return m_handle; }
    const img_desc &desc() const { return *img_find_image(m_handle); }
    // Bytes that the file must have for all samples, trailer included.
    std::int64_t whole_length() const;

private:
    std::int32_t m_name;
    img_handle m_handle = -1;
};

#endif
