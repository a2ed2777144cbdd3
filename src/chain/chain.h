// The image chain: ten slots of links through which loaded samples pass on their way from the image
// type to the caller's buffer. A link computes a lookup table (LUT) from the samples, applies one,
// or remaps the samples into another buffer.
//
// A load prepares the chain (chain_prepare.h), reads into the buffer that the preparation returns,
// and applies the chain (chain_apply.h); after a failed read it releases the chain instead.
// Definitions are worked out backwards, from the caller's buffer to the image; samples then pass
// forwards, slot 0 first. Links are added and removed in chain_links.h.
#ifndef IMG_CHAIN_H
#define IMG_CHAIN_H

#include "base/scratch.h"
#include "base/shared_lock.h"
#include "imgfile/img.h"

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

// Fills `lut`, 1 << bits_in entries, from the samples in the state they have at the link. 0:
// success.
using img_chain_create_fn = std::int32_t (*)(void *arg, const std::uint8_t *buffer,
                                             const img_buffer_def *def, std::uint16_t *lut);
// Maps the window in `in_buffer` to `out_buffer`. `pending` not 0: every sample first passes
// through `lut`, which has 1 << in_def->nbits entries; 0: `lut` must not be read. 0: success.
using img_chain_process_fn = std::int32_t (*)(void *arg, const std::uint8_t *in_buffer,
                                              const img_buffer_def *in_def,
                                              std::uint8_t *out_buffer,
                                              const img_buffer_def *out_def, std::int32_t pending,
                                              const std::uint16_t *lut);
// Fills in the definition of the input that a link needs for the output `out_def`. Negative:
// failure; 0: the two agree in lines, samples, stride and bytes; positive: they differ. A link that
// says 0 wrongly overruns the caller's buffer.
using img_chain_input_def_fn = std::int32_t (*)(void *arg, const img_buffer_def *out_def,
                                                img_buffer_def *in_def);

enum : std::int32_t {  // kinds of links
    IMG_CHAIN_EMPTY = 0,
    IMG_CHAIN_LUT_FCN = 1,   // computes the LUT of a later link
    IMG_CHAIN_LUT = 2,       // applies a LUT to every sample
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
    std::uint16_t *lut;    // the target's table; null once the target is removed
    std::int32_t target;   // slot of the link that uses the table
    std::int32_t bits_in;  // the table has 1 << bits_in entries
};
struct img_chain_remap_part {
    std::int32_t out_bits;  // width that the link produces; 0: not stated
    img_chain_process_fn process_fn;
    img_chain_input_def_fn input_def_fn;  // null: input and output are defined alike
};

struct img_chain_link {
    void *arg;                   // first argument of the link's functions
    std::int32_t owns_arg;       // 1: `arg` is an img_chain_lut that the link frees
    img_buffer_def out_def;      // the samples after this link; preparation sets this and the next
    std::int32_t placement;      // an IMG_CHAIN_OUT_ code
    std::int32_t release_input;  // IMG_CHAIN_KEEP_INPUT or IMG_CHAIN_FREE_INPUT
    std::int32_t changes_def;    // not 0: the samples before this link are defined differently
    std::int32_t kind;
    union {
        img_chain_lut_fcn_part lut_fcn;  // IMG_CHAIN_LUT_FCN
        img_chain_lut lut_def;           // IMG_CHAIN_LUT
        img_chain_remap_part remap;      // IMG_CHAIN_REMAP_FCN
    };
};

// The chain of one handle. It lives as long as the process; img_chain_init resets it when the image
// is opened and when it is released. Links are added and removed while no load of the image is in
// progress. Loads through links that share tables take turns; those through the mapdown alone run
// at the same time (mapdown.h), and so do those of a chain without links.
struct img_chain {
    std::uint8_t identity;      // 1: no slot holds a link; samples pass unchanged
    std::uint8_t prepared;      // 1: between preparation and the successful end of application
    std::int32_t has_lut_link;  // not 0: application needs running tables
    std::int32_t lut_bits;      // width that the running LUT covers
    std::int32_t out_bits;      // width of the samples that the chain delivers
    // Of the load in progress; null in between:
    std::uint8_t *work_buffer;   // the image type reads into it
    img_scratch work_memory;     // owns work_buffer, unless that is final_buffer
    img_buffer_def *work_def;    // describes work_buffer; the caller's
    std::uint8_t *final_buffer;  // the caller's
    const img_buffer_def *final_def;
    std::array<img_chain_link, IMG_CHAIN_LINKS> links;
    img_mutex mutex;  // held by a load that uses the chain itself, and the tables of its links
};

// Returns the chain of a handle within 0..59.
img_chain &img_chain_of(img_handle handle);

// Ends a load: frees the chain's own buffer, if it has one, and forgets the caller's. `prepared`
// keeps its value.
void img_chain_release(img_chain &chain);
void img_chain_release(img_handle handle);

// What the chain delivers: bits and bytes per sample. The handle lies within 0..59.
std::int32_t img_chain_out_bits(img_handle handle);
std::int32_t img_chain_out_nbytes(img_handle handle);
// Returns the bytes that a sample of `nbits` takes.
std::int32_t img_chain_nbytes(std::int32_t nbits);

// Returns memory for `nlines` x `stride` samples, or null.
img_scratch img_chain_new_buffer(std::int32_t nlines, std::int32_t stride, std::int32_t nbytes);

#endif
