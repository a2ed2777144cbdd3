// The calls of hosts: which of them run at the same time, on any number of threads.
//
// Every exported function makes an img_call first; those that name an image then make an
// img_image_use. Three kinds of locks follow each other in this order:
//
//   1. the library's: each call shares it. Fork and img_mgr_cleanup hold it alone, so that both
//      find no call in progress.
//   2. the image's: reads and queries share it; a write or a close holds it alone. Images that keep
//      a tile cache change with every read: there reads hold it alone, too.
//   3. mutexes for a few instructions: handles, registrations, kept blocks of working memory, the
//      mapping of a file, the position of a descriptor without positional reads, a chain whose
//      links share tables.
//
// An operation of an access method may call the library again, for other images: its thread shares
// the library's lock already and does not take it again. Such calls must not lead back to the image
// that the operation works for, through any number of threads.
#ifndef IMG_CALLS_H
#define IMG_CALLS_H

#include "imgfile/img.h"

#include <cstdint>

struct img_desc;

// One call of an exported function. Waits while another thread forks or cleans up.
class img_call {
public:
    img_call();
    ~img_call();
    img_call(const img_call &) = delete;
    img_call &operator=(const img_call &) = delete;

private:
    std::uint32_t m_counter = 0;  // of the library's lock
    int m_cancellation = 0;       // of the thread, before the call
};

enum class img_purpose : std::uint8_t { query, load, dump, close };

// The image of a handle, locked while this lives. A handle that is closed, or closed and opened
// again, while this waits for the lock names no image.
class img_image_use {
public:
    img_image_use(img_handle handle, img_purpose purpose);
    ~img_image_use();
    img_image_use(const img_image_use &) = delete;
    img_image_use &operator=(const img_image_use &) = delete;

    // Null: the handle is outside 0..59 or names no open image. After a close has begun with
    // img_purpose::close, the handle names no image to any later call.
    img_desc *desc() const { return m_desc; }

private:
    bool enter(bool alone, std::uint32_t opening);
    void leave();

    img_handle m_handle;
    bool m_is_alone = false;
    std::uint32_t m_counter = 0;  // of the lock, where it is shared
    img_desc *m_desc = nullptr;   // null: no lock is held
};

// Makes the image of `handle` known to other calls. Before, only the opening thread works with it.
void img_publish_image(img_handle handle);

// No other call is in progress while it lives; calls that come meanwhile wait. Made by an operation
// of an access method, whose own call is in progress, it waits for nobody.
class img_pause {
public:
    img_pause();
    ~img_pause();
    img_pause(const img_pause &) = delete;
    img_pause &operator=(const img_pause &) = delete;

    bool is_alone() const { return m_is_alone; }

private:
    bool m_is_alone;
};

#endif
