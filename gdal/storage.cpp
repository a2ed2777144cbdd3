// An access method on GDAL's virtual file system. A descriptor is an index into a table, which
// grows as needed. Read storage.h and io/io_method.h first.
#include "storage.h"

#include "api/library.h"
#include "imgfile/img.h"

#include <cpl_vsi.h>

#include <algorithm>
#include <cerrno>
#include <exception>
#include <mutex>
#include <utility>
#include <vector>

namespace {

constexpr char METHOD_NAME[] = "vsi";

std::mutex table_mutex;

thread_local int close_error = 0;

// Returns the open files by descriptor; null: free. The caller holds table_mutex. The table is
// never destroyed: GDAL may close data sets after the plugin's destructors have run.
std::vector<VSILFILE *> &open_files()
{
    static std::vector<VSILFILE *> &table = *new std::vector<VSILFILE *>;
    return table;
}

VSILFILE *file_of(std::int32_t fd)
{
    const std::lock_guard lock(table_mutex);
    return open_files()[static_cast<std::size_t>(fd)];
}

std::int32_t enter(VSILFILE *file)
{
    const std::lock_guard lock(table_mutex);
    std::vector<VSILFILE *> &files = open_files();
    const auto free = std::find(files.begin(), files.end(), nullptr);
    const auto fd = static_cast<std::int32_t>(free - files.begin());
    if (free != files.end())
        *free = file;
    else
        files.push_back(file);
    return fd;
}

// Virtual files do not always say why they fail.
std::int32_t fail()
{
    if (errno == 0) errno = EIO;
    return -1;
}

const char *mode_of(std::int32_t oflags)
{
    constexpr std::int32_t access = 3;
    if ((oflags & IMG_OPEN_TRUNCATE) != 0) return "wb+";
    return (oflags & access) == IMG_OPEN_READ_ONLY ? "rb" : "rb+";
}

std::int32_t open_virtual(const char *filename, std::int32_t oflags, std::int32_t /*mode*/)
{
    errno = 0;
    VSILFILE *const file = VSIFOpenL(filename, mode_of(oflags));
    if (file == nullptr) return fail();
    try {
        return enter(file);
    } catch (const std::exception &) {
        VSIFCloseL(file);
        errno = ENOMEM;
        return -1;
    }
}

std::int32_t close_virtual(std::int32_t fd)
{
    VSILFILE *file = nullptr;
    {
        const std::lock_guard lock(table_mutex);
        file = std::exchange(open_files()[static_cast<std::size_t>(fd)], nullptr);
    }
    errno = 0;
    if (VSIFCloseL(file) == 0) return 0;
    fail();
    close_error = errno;
    return -1;
}

std::int32_t read_virtual(std::int32_t fd, void *buffer, std::uint32_t count)
{
    return static_cast<std::int32_t>(VSIFReadL(buffer, 1, count, file_of(fd)));
}

std::int32_t write_virtual(std::int32_t fd, const void *buffer, std::uint32_t count)
{
    errno = 0;
    const std::size_t written = VSIFWriteL(buffer, 1, count, file_of(fd));
    if (written < count && errno == 0) errno = ENOSPC;
    return static_cast<std::int32_t>(written);
}

std::int32_t seek_virtual(std::int32_t fd, std::int32_t offset, std::int32_t whence)
{
    VSILFILE *const file = file_of(fd);
    std::int64_t base = 0;
    if (whence == IMG_SEEK_END) {
        if (VSIFSeekL(file, 0, SEEK_END) != 0) return fail();
        base = static_cast<std::int64_t>(VSIFTellL(file));
    } else if (whence == IMG_SEEK_CURRENT) {
        base = static_cast<std::int64_t>(VSIFTellL(file));
    }
    const std::int64_t position = base + offset;
    if (position < 0 || position > INT32_MAX) {
        errno = position < 0 ? EINVAL : EOVERFLOW;
        return -1;
    }
    errno = 0;
    if (VSIFSeekL(file, static_cast<vsi_l_offset>(position), SEEK_SET) != 0) return fail();
    return static_cast<std::int32_t>(position);
}

std::int32_t unlink_virtual(const char *filename)
{
    return VSIUnlink(filename);
}

const img_io_method *register_virtual()
{
    img_library_init();
    img_register_io_method(METHOD_NAME, /*init_op=*/nullptr, open_virtual, close_virtual,
                           read_virtual, write_virtual, seek_virtual, unlink_virtual,
                           /*get_value=*/nullptr);
    img_allow_merging(METHOD_NAME);
    return img_lookup_io_method(METHOD_NAME);
}

}  // namespace

const img_io_method *storage_of(const std::string &filename)
{
    static const img_io_method *const virtual_files = register_virtual();
    return filename.rfind("/vsi", 0) == 0 ? virtual_files : img_lookup_io_method("");
}

int take_close_error()
{
    return std::exchange(close_error, 0);
}
