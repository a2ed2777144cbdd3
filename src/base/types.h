// The table of image types: what each file format can do. A format fills one slot at start-up and
// never changes it; the upper layers reach the formats and the standard driver through it alone.
//
// Who calls what, in the life of one image:
//
//   open | create | create_mem      first; on failure nothing is left open and no state is left
//   read, write, read_tiles,        any number of times, in any order
//   write_tiles, io_virtual,
//   pix_io_virtual
//   close | delete_image            once, last; nothing is called afterwards
//
// `open` is tried for each type until one accepts the file. An operation that is null is not
// offered; callers test for it. Each comment says whether null is allowed.
#ifndef IMG_TYPES_H
#define IMG_TYPES_H

#include "imgfile/img.h"

#include <array>
#include <cstdint>

struct img_desc;

inline constexpr std::int32_t IMG_MAX_TYPES = 44;     // slots 0..43; slot IMG_NO_TYPE stays empty
inline constexpr std::int32_t IMG_STATIC_TYPES = 25;  // slots offered to the static registrations

// Something done to an image as a whole. Returns 0 or more, or -1.
using img_image_fn = std::int32_t (*)(img_desc *desc);

// Reads, or writes, `nlines` x `nsamps` samples of one band from (`line`, `samp`) on.
//
// Callers pass a band of the image and, unless the record's `unclipped` is set, at least one line
// and one sample, all inside the image. Row i of `buffer` starts at sample i * `stride`; `stride`
// is at least `nsamps` for a read. A write may have rows that overlap in `buffer`, which it must
// not modify. Samples are `nbytes` wide and in the host's byte order. `fill` points to one sample
// in the file's byte order, for samples of a tile that neither the region nor the file has; null
// counts as 0.
//
// Returns 0, or -1 after a message; quietly for a region outside the image. Rows finished before a
// failure stay moved; the row that failed may be moved in part; the image stays usable. A read that
// meets the end of the file fails: samples that were never stored do not read as 0. A write beyond
// the end first fills the gap with zero bytes.
using img_read_fn = std::int32_t (*)(img_desc *desc, std::int32_t line, std::int32_t samp,
                                     std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                     std::uint8_t *buffer, std::int32_t stride);
using img_write_fn = std::int32_t (*)(img_desc *desc, std::int32_t line, std::int32_t samp,
                                      std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                      const std::uint8_t *buffer, std::int32_t stride,
                                      const std::uint8_t *fill);

// Reads, or writes, the tile planes of `band` of tiles `first_tile` to `first_tile` + `ntiles` - 1,
// one after the other in `buffer`, each `tile_nlines` x `tile_nsamps` samples without padding.
//
// Callers pass a tiled image, a band of it, and a run of at least one tile inside the image. Bytes
// are those of the file: no byte order is exchanged. Samples of an edge tile that lie outside the
// image are moved like the others; virtual tiles leave them alone.
//
// Returns 0, or -1 after a message; quietly when memory is short. Planes finished before a failure
// stay moved. A read
// that meets the end of the file puts what the file holds into `buffer`, leaves the rest as it was
// and fails. A write beyond the end first fills the gap with zero bytes.
using img_read_tiles_fn = std::int32_t (*)(img_desc *desc, std::int32_t first_tile,
                                           std::int32_t ntiles, std::int32_t band,
                                           std::uint8_t *buffer);
using img_write_tiles_fn = std::int32_t (*)(img_desc *desc, std::int32_t first_tile,
                                            std::int32_t ntiles, std::int32_t band,
                                            const std::uint8_t *buffer);

// Moves all of `mem_desc`, an image in memory, into the image (`writing` not 0) or fills it from
// there; its first sample lies at (`line0`, `samp0`) of the image. Returns 0, or -1.
using img_io_virtual_fn = std::int32_t (*)(std::int32_t writing, img_desc *desc, img_desc *mem_desc,
                                           std::int32_t line0, std::int32_t samp0);
// Moves one sample between an image in memory and `value`, which has its width. Returns 0, or -1.
using img_pix_io_virtual_fn = std::int32_t (*)(std::int32_t writing, img_desc *desc,
                                               std::int32_t line, std::int32_t samp,
                                               std::int32_t band, std::uint8_t *value);
// An operation of the type's own, which the library never calls.
using img_type_op_fn = std::int32_t (*)();

// One image type. The record `desc` that an operation gets always names a file and an access
// method, except that the method is null where the name asks for one that does not exist.
struct img_type_desc {
    std::int32_t enabled;   // 1: the slot holds a usable type
    const char *name;       // referenced, not owned; null: empty slot
    const char *extension;  // usual ending of a file name, referenced; null: empty slot

    // Recognises the file and opens it with the record's `oflags`, fills in the geometry and makes
    // what the type needs. Called for each enabled type in slot order until one accepts the file,
    // with `type` already set. -1, quietly: not of this type, or not to be opened; then everything
    // of the attempt is closed and freed, for the next type gets the same record. Null: the type
    // opens no files.
    img_image_fn open;
    // Creates the file for the geometry in the record and writes its header. -1, after a message
    // where the format has one: the geometry cannot be stored or the file not be written; then
    // nothing is left open, but the file that was begun stays. Null: no create succeeds.
    img_image_fn create;
    // Makes an image in memory of the geometry in the record, all samples 0. -1 as for `open`. Null
    // is allowed; no function that a host calls asks for it.
    img_image_fn create_mem;
    // Completes the file and closes it; frees what the type made. Called also after a failed
    // create, when there may be nothing to close. The result is ignored. Null: nothing to do.
    img_image_fn close;

    img_read_fn read;    // null: loads fail
    img_write_fn write;  // null: dumps and creates fail
    // The standard driver moves windows of tiled images through these, too, however they were
    // replaced. Null: whole tiles, and windows that need them, fail.
    img_read_tiles_fn read_tiles;
    img_write_tiles_fn write_tiles;
    img_io_virtual_fn io_virtual;          // null is allowed; nothing in the library calls it
    img_pix_io_virtual_fn pix_io_virtual;  // the same
    // Closes the image without completing it and removes its files. Null is allowed; nothing in
    // the library calls it.
    img_image_fn delete_image;
    img_type_op_fn type_op;       // null is allowed
    std::array<void *, 3> spare;  // cleared at start-up; used by nothing
};

// Slots 0..43, and slot IMG_NO_TYPE, which has no operations: the type of images without one.
extern std::array<img_type_desc, IMG_MAX_TYPES + 1> img_type_table;

// Returns slot `slot`, which lies within 0..44.
img_type_desc &img_type_slot(std::int32_t slot);

// Returns the slot of the image's type; the empty one for an image without.
const img_type_desc &img_type_of(const img_desc *desc);

#endif
