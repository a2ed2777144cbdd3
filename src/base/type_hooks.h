// The table of header hooks: what a format adds to the standard driver. A format that is built on
// the driver (img_std_fill_type) fills the slot of its own number; the driver alone calls it.
//
// probe, read_header and write_header take a record whose file is open on the header descriptor of
// its `std_file`. Order:
//
//   open         probe, read_header, then padded_nsamps_fn and padded_nlines_fn
//   create       write_header, then padded_nsamps_fn and padded_nlines_fn
//   create_mem   padded_nsamps_fn and padded_nlines_fn; there is no file
//
// A hook that fails leaves the record to the driver, which closes the file and frees the state;
// what a hook stored in the record's `header` goes with the record.
#ifndef IMG_TYPE_HOOKS_H
#define IMG_TYPE_HOOKS_H

#include "base/types.h"

struct img_type_hooks {
    std::int32_t untiled_layout;  // of an image whose `layout` is IMG_LAYOUT_DEFAULT and untiled
    std::int32_t tiled_layout;    // the same with both tile sizes other than 0

    // Never null. Called with the descriptor at position 0. Returns 1 and sets `swap` for a file of
    // this type, else 0 with the record as it was: the same record is offered to the next type.
    // Files too short to tell, and files that cannot be read, are not of this type.
    img_image_fn probe;
    // Never null. Called once, after a probe that answered 1, wherever that left the descriptor.
    // Reads the header, hands the geometry to img_set_image_params as the header states it, and
    // sets `data_offset`; the driver then validates the geometry. Returns 0, or -1 quietly: the
    // file ends within the header, or states a version or a position that the format excludes.
    img_image_fn read_header;
    // Never null. Called once on a new, empty file. Writes the header for the geometry in the
    // record, sets `data_offset` and, where the format fixes a byte order, `swap`. Returns 0, or
    // -1, after a message for a geometry that the format excludes; what was written stays.
    img_image_fn write_header;
    // Lines that are stored of a band plane, at least `nlines`; -1: more than 31 bits. Null: as
    // many as the image has.
    img_image_fn padded_nlines_fn;
    // Samples that are stored of a line, at least `nsamps`; -1: more than 31 bits. Null: as many
    // as the image has.
    img_image_fn padded_nsamps_fn;
};

// One slot for each slot of img_type_table.
extern std::array<img_type_hooks, IMG_MAX_TYPES + 1> img_type_hooks_table;

// Returns the hooks of the image's type.
const img_type_hooks &img_hooks_of(const img_desc *desc);

#endif
