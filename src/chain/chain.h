// The image chain: ten slots of links through which loaded data passes on its way from the image
// type to the caller's buffer. A link computes a lookup table (LUT) from the data, applies one, or
// remaps the data into another buffer.
//
// A load prepares the chain, reads into the buffer that the preparation names, and applies the
// chain; or releases it, when the read failed. Definitions are worked out backwards, from the
// caller's buffer to the image; data then passes forwards, slot 0 first.
#ifndef IMG_CHAIN_H
#define IMG_CHAIN_H

#include "api/img.h"
#include "api/scratch.h"

#include <algorithm>
#include <array>
#include <cstdint>

inline constexpr std::int32_t IMG_CHAIN_LINKS = 10;
inline constexpr std::int32_t IMG_CHAIN_MAX_BITS = 30;  // so that a table's size fits 31 bits

// A window of samples in memory. Row i starts at sample i * stride. Two-byte samples are in host
// order; a width of b bits takes ((b - 1) >> 3) + 1 bytes.
struct img_buffer_def {
    std::int32_t nlines, nsamps;
    std::int32_t line, samp;  // first line and sample of the window in the image
    std::int32_t stride;
    std::int32_t nbytes;  // bytes per sample
    std::int32_t nbits;   // significant bits per sample
    std::uint16_t fill;   // sample given to what lies outside the image; no stretch counts it
};

// A lookup table: `size` = 1 << bits_in entries. Samples beyond it map as its last entry does.
struct img_chain_lut {
    std::uint8_t bits_in;   // width of the index
    std::uint8_t bits_out;  // width of the entries
    std::int32_t size;
    std::uint16_t *lut;
    std::int32_t owned;  // 1: who holds the record frees `lut` with it (from new[])
};

// Fills `lut`, 1 << bits_in entries, from the data as it stands at the link. 0: success.
using img_chain_create_fn = std::int32_t (*)(void *arg, const std::uint8_t *buffer,
                                             const img_buffer_def *def, std::uint16_t *lut);
// Maps the window in `in_buffer` to `out_buffer`; with `pending` not 0 every sample first passes
// through `lut`, 1 << in_def->nbits entries, which is not to be read else. 0: success.
using img_chain_process_fn = std::int32_t (*)(void *arg, const std::uint8_t *in_buffer,
                                              const img_buffer_def *in_def,
                                              std::uint8_t *out_buffer,
                                              const img_buffer_def *out_def, std::int32_t pending,
                                              const std::uint16_t *lut);
// Tells the input that a link needs for the output that follows it. Negative: failure; 0: the two
// agree; positive: they differ.
using img_chain_input_def_fn = std::int32_t (*)(void *arg, const img_buffer_def *out_def,
                                                img_buffer_def *in_def);

enum : std::int32_t {  // kinds of links
    IMG_CHAIN_EMPTY = 0,
    IMG_CHAIN_LUT_FCN = 1,   // computes the LUT of a later link
    IMG_CHAIN_LUT = 2,       // a LUT for every sample
    IMG_CHAIN_REMAP_FCN = 3  // maps one buffer to another
};
enum : std::int32_t {            // where the output of a link goes
    IMG_CHAIN_OUT_ALLOC = 0,     // a fresh buffer
    IMG_CHAIN_OUT_FINAL = 1,     // the caller's buffer
    IMG_CHAIN_OUT_IN_PLACE = 2,  // the link's input buffer
    IMG_CHAIN_OUT_UNDECIDED = 3  // only while preparation runs
};
enum : std::int32_t { IMG_CHAIN_KEEP_INPUT = 4, IMG_CHAIN_FREE_INPUT = 5 };  // after the link

struct img_chain_lut_fcn_part {
    img_chain_create_fn create_fn;
    std::uint16_t *lut;    // the target's table; null once that is gone: nothing to fill
    std::int32_t target;   // slot of the link that uses the table
    std::int32_t bits_in;  // the table has 1 << bits_in entries
};
struct img_chain_remap_part {
    std::int32_t out_bits;  // width that the link produces; 0: it does not say
    img_chain_process_fn process_fn;
    img_chain_input_def_fn input_def_fn;  // null: the input is defined as the output is
};

struct img_chain_link {
    void *arg;                   // first argument of the link's functions
    std::int32_t owns_arg;       // 1: `arg` is an img_chain_lut that goes with the link
    img_buffer_def out_def;      // the data after this link; set by preparation, as are the next
    std::int32_t placement;      // an IMG_CHAIN_OUT_ code
    std::int32_t release_input;  // IMG_CHAIN_KEEP_INPUT or IMG_CHAIN_FREE_INPUT
    std::int32_t changes_def;    // not 0: the data before this link is defined otherwise
    std::int32_t kind;
    union {
        img_chain_lut_fcn_part lut_fcn;  // IMG_CHAIN_LUT_FCN
        img_chain_lut lut_def;           // IMG_CHAIN_LUT
        img_chain_remap_part remap;      // IMG_CHAIN_REMAP_FCN
    };
};

// The chain of one handle. It lives as long as the process; img_chain_init resets it, as the image
// is opened and when it is released.
struct img_chain {
    std::uint8_t identity;       // 1: no slot holds a link, the data is left as it is
    std::uint8_t prepared;       // 1: between preparation and the successful end of application
    std::int32_t has_lut_link;   // not 0: application needs running tables
    std::int32_t lut_bits;       // width that the running LUT covers
    std::int32_t out_bits;       // width of the samples that the chain delivers
    std::uint8_t *work_buffer;   // what the image type reads into; null: forgotten
    img_scratch work_memory;     // holds it, unless it is final_buffer
    img_buffer_def *work_def;    // the caller's of preparation
    std::uint8_t *final_buffer;  // the caller's buffer
    const img_buffer_def *final_def;
    std::array<img_chain_link, IMG_CHAIN_LINKS> links;
};

// Returns the chain of a handle within 0..59.
img_chain &img_chain_of(img_handle handle);

// --- Structure ---
//
// 0 on success; -1 for a handle that names no image, after its message, and quietly for a slot
// outside 0..9 or a missing function; then nothing is changed. A change ends a preparation.
// Adding into a slot overwrites it and frees nothing: remove its link first.

// Frees what the links own and empties all slots.
void img_chain_init(img_handle handle);
std::int32_t img_chain_add_remap_link(img_handle handle, std::int32_t link, std::int32_t out_bits,
                                      void *arg, img_chain_process_fn process_fn,
                                      img_chain_input_def_fn input_def_fn);
// Adds a LUT of 1 << `bits_in` entries: as a link of its own (`remap` 0) or as a remap link that
// applies it. `owned` 1: the link frees `lut`, which is from new[]. Also -1, quietly, for a width
// outside 1..30, a null `lut`, and when memory is short.
std::int32_t img_chain_add_lut_link(img_handle handle, std::int32_t link, std::int32_t bits_in,
                                    std::int32_t bits_out, std::int32_t remap, std::uint16_t *lut,
                                    std::int32_t owned);
// Adds a link that computes a LUT from the data, and in the later slot `target` the link that uses
// it, as above. Without a `lut` the chain makes one of its own. Also -1 when memory is short.
std::int32_t img_chain_add_lut_create_link(img_handle handle, std::int32_t link, void *arg,
                                           img_chain_create_fn create_fn, std::int32_t target,
                                           std::int32_t bits_in, std::int32_t bits_out,
                                           std::int32_t remap, std::uint16_t *lut,
                                           std::int32_t owned);
// Empties a slot, and the target of a link that computes a LUT with it.
std::int32_t img_chain_remove_link(img_handle handle, std::int32_t link);
// Sets out_bits: that of the last remap link that states a width, else the image's bits.
void img_chain_update_out_bits(img_handle handle);

// What the chain delivers: bits and bytes per sample. The handle lies within 0..59.
std::int32_t img_chain_out_bits(img_handle handle);
std::int32_t img_chain_out_nbytes(img_handle handle);
// Bytes that a sample of `nbits` takes.
std::int32_t img_chain_nbytes(std::int32_t nbits);

// --- One load ---

// Returns the buffer into which the image type must read the window that `work_def` then
// describes: `buffer` itself or the chain's own. Null on failure, after a message unless memory
// is short. `def` describes `buffer`; both records must last until the application ends.
std::uint8_t *img_chain_prepare_operations(img_handle handle, std::uint8_t *buffer,
                                           const img_buffer_def *def, img_buffer_def *work_def);
// Passes what was read through the links into the caller's buffer. Returns 0; -1 after a message,
// quietly without a preparation or memory for a link's output.
std::int32_t img_apply_img_chain(img_handle handle);
// Frees the chain's own buffer, if it has one, after a failed read, and forgets it.
void img_chain_release(img_handle handle);
// Returns memory for `nlines` x `stride` samples; null when it cannot be had.
img_scratch img_chain_new_buffer(std::int32_t nlines, std::int32_t stride, std::int32_t nbytes);

// Returns the entry of `sample` in a table of `size` entries, the last one for what is beyond it.
inline std::uint16_t img_chain_entry(const std::uint16_t *table, std::int32_t size,
                                     std::uint32_t sample)
{
    return table[std::min(sample, static_cast<std::uint32_t>(size) - 1)];
}
// Replaces every sample of the window by its entry, in one-byte samples by the entry's low byte.
void img_chain_apply_lut(std::uint8_t *buffer, const img_buffer_def *def, const img_chain_lut *lut);
// Re-expresses the table of `src` for the widths of `dst`, whose size may not exceed the room in
// `dst_table`.
void img_chain_convert_lut(const std::uint16_t *src_table, const img_chain_lut *src,
                           std::uint16_t *dst_table, const img_chain_lut *dst);
// The two functions of a LUT's remap link; `record` is its img_chain_lut.
std::int32_t img_chain_lut_input_definition(void *record, const img_buffer_def *out_def,
                                            img_buffer_def *in_def);
std::int32_t img_chain_lut_remap(void *record, const std::uint8_t *in_buffer,
                                 const img_buffer_def *in_def, std::uint8_t *out_buffer,
                                 const img_buffer_def *out_def, std::int32_t pending,
                                 const std::uint16_t *lut);

// --- Stretch ---

// The callback of the mapdown: a stretch to 8 bits; ignores `arg`.
std::int32_t img_chain_create_16to8_lut(void *arg, const std::uint8_t *buffer,
                                        const img_buffer_def *def, std::uint16_t *lut);
// Fills `lut`, 1 << def->nbits entries, with the stretch of the window's histogram, taken at every
// fourth sample of each line and without the fill, to `bits_out` bits. Samples of more than
// def->nbits bits are not counted. Returns 0, or -1 after a message: more than 16 bits, or memory
// is short. Other widths that have no stretch print a message and leave `lut` as it is.
std::int32_t img_chain_create_stretch_lut_from_buffer(const std::uint8_t *buffer,
                                                      const img_buffer_def *def, std::uint16_t *lut,
                                                      std::int32_t bits_out);
// Fills `lut` from a histogram of 1 << `bits_in` counters. `descriptor` states the widths; null:
// the output is as wide as the input. Returns 0, or -1 after a message, `lut` untouched, for widths
// outside 1..16 or that disagree, and for a null histogram.
std::int32_t img_chain_compute_stretch_lut(const std::uint32_t *histogram, std::int32_t bits_in,
                                           const img_chain_lut *descriptor, std::uint16_t *lut);
// The kernel of the above for outputs that are not wider than the input: entry i becomes the bits
// from `shift` on of (i - low) * gain, truncated, within 0..top.
void img_chain_fill_stretch(std::uint16_t *lut, std::int32_t size, double low, double gain,
                            std::int32_t shift, std::int32_t top);

#endif
