// The standard raster driver: one file organisation for all formats that consist of a header or
// trailer and raw pixels. It opens and creates the files, knows where each sample lies, and moves
// regions and whole tiles of one band.
#ifndef IMG_STD_H
#define IMG_STD_H

#include "base/types.h"
#include "io/io_method.h"

#include <array>
#include <cstddef>
#include <cstdint>

// Driver state of one open image. Made by img_std_open, img_std_create and img_std_create_mem;
// freed by img_std_close, img_std_fail_close and img_std_delete. Offsets and sizes in bytes, all
// of them proven by the set-up to fit 31 bits, the end of the last tile and plane included.
struct img_std_file {
    std::int32_t hdr_fd;         // header hooks use it; equals data_fd; -1: in-memory image
    std::int32_t data_fd;        // pixel data; -1: in-memory image
    std::int32_t veof;           // file: its length as last seen; memory: offset of the last byte
    std::int32_t veof_max;       // memory: offset of the last byte; file: its length at set-up
    std::int32_t data_offset;    // first pixel byte; set by the read- or write-header hook
    std::int32_t band_size;      // one band plane: padded_nlines x padded_nsamps samples
    std::int32_t tiles_across;   // tiles in a row of tiles; 0: untiled
    std::int32_t tiles_down;     // rows of tiles; 0: untiled
    std::int32_t tile_size;      // one tile plane, in layout 4 the whole tile; 0: untiled
    std::int32_t padded_nsamps;  // samples of a stored line
    std::int32_t padded_nlines;  // stored lines of a band plane
    std::int32_t pre_reads;      // img_std_pre_read scopes that are open
    std::int32_t read_error;     // why a pre-read did not get bytes that are there; 0: it did
    char *companion_name;        // owned, from new[]; null: the image has no second file
};

// 1: failures of img_std_read_tiles are printed; 0: a pre-read is under way, and they are not.
inline std::int32_t img_std_report_errors = 1;

// The fill of transfers that have none of their own.
inline constexpr std::array<std::uint8_t, 16> img_zero_sample{};

// --- Opening and closing: operations of a type slot. 0 or -1, quietly. ---

// Opens the file, asks the type whether it is of its kind and reads the header. -1, with nothing
// left open: not of this type, cut short, outside what the driver supports, or not to be opened.
std::int32_t img_std_open(img_desc *desc);
// Creates the file and writes the header for the geometry in the record. On failure nothing is
// left open; a file that was begun stays.
std::int32_t img_std_create(img_desc *desc);
// Makes an in-memory image of the geometry in the record, all samples 0.
std::int32_t img_std_create_mem(img_desc *desc);
// Completes a file that is too short with zero bytes and closes it; frees the state. Returns the
// result of closing the data descriptor, 0 when there is none.
std::int32_t img_std_close(img_desc *desc);
// Closes the descriptors, frees the state and removes the image's files. Returns the result of
// removing the one that bears the image's name.
std::int32_t img_std_delete(img_desc *desc);

// --- What they are made of ---

// Computes the file organisation from the geometry and the type's hooks. -1: an image outside
// what the driver supports.
std::int32_t img_std_setup(img_desc *desc);
// Closes the descriptors as they are and frees the state.
void img_std_fail_close(img_desc *desc);

// --- Bytes of the data file ---

// Returns 0 when a seek went to `expected`, else -1 with errno set: by the seek, or by this.
std::int32_t img_std_check_position(std::int32_t position, std::int64_t expected);
// Appends `count` >= 1 zero bytes to the data file and leaves its descriptor at the new end; does
// nothing for an in-memory image. Returns 0, or -1 with errno set.
std::int32_t img_std_extend(img_desc *desc, std::int32_t count);
// Puts the data descriptor at `offset`, growing the file up to it first when it is shorter.
// Returns 0, or -1 with errno set.
std::int32_t img_std_seek_to_write(img_desc *desc, std::int64_t offset);
// Sets veof to the file's length. Returns 0, or -1 with errno set.
std::int32_t img_std_update_veof(img_desc *desc);
// Reads or writes `count` bytes at `offset`, a write growing the file up to it and updating veof.
// Return the bytes moved, or -1 with errno set.
std::int32_t img_std_read_at(img_desc *desc, std::int64_t offset, void *buffer, std::int32_t count);
std::int32_t img_std_write_at(img_desc *desc, std::int64_t offset, const void *buffer,
                              std::int32_t count);
// Returns where the `count` bytes at `offset` of an image in memory are to be written, and raises
// veof to the last of them; null when they do not lie inside.
std::uint8_t *img_std_memory_to_write(const img_desc *desc, std::int64_t offset,
                                      std::int32_t count);
// Calls `use` with the `count` bytes at `offset` where they lie: in memory, or in a file whose
// access method lends them. Returns true when all of them are there. Else what `use` did, if it
// was called, is worth nothing, and the bytes are to be asked for one transfer at a time.
bool img_std_lend(const img_desc *desc, std::int64_t offset, std::int64_t count, img_io_use_fn use,
                  void *arg);
template <typename Use>
bool img_std_lend(const img_desc *desc, std::int64_t offset, std::int64_t count, Use use)
{
    const img_io_use_fn call = [](void *arg, const std::uint8_t *lent) {
        (*static_cast<Use *>(arg))(lent);
    };
    return img_std_lend(desc, offset, count, call, &use);
}
// True when nobody counts the calls by which the image's file is reached. Not for images in memory.
bool img_std_joins_calls(const img_desc *desc);

// --- Types ---

// Fills type slot and hook slot `slot` with the standard driver's operations and the hooks given;
// note that the tiled layout comes before the untiled one. The strings are referenced. Returns 0.
std::int32_t img_std_fill_type(std::int32_t slot, const char *name, const char *extension,
                               std::int32_t tiled_layout, std::int32_t untiled_layout,
                               img_image_fn probe, img_image_fn read_header,
                               img_image_fn write_header, img_image_fn padded_nlines_fn,
                               img_image_fn padded_nsamps_fn, img_type_op_fn type_op,
                               img_type_desc *slot_record);

// --- Samples ---

// Returns a size or an offset as it is, or -1 when it does not fit 31 bits.
inline std::int32_t img_std_fitting(std::int64_t size)
{
    return size <= INT32_MAX ? static_cast<std::int32_t>(size) : -1;
}
// Byte offsets from the start of the file or of mem_image: of a sample in a plane of lines, of a
// pixel in lines of pixels, and of a tile of `band`, which in layout 4 is the tile of all bands.
std::int64_t img_std_line_offset(const img_desc *desc, std::int64_t line, std::int32_t samp,
                                 std::int32_t band);
std::int64_t img_std_pixel_offset(const img_desc *desc, std::int64_t line, std::int32_t samp);
std::int64_t img_std_tile_offset(const img_desc *desc, std::int64_t tile, std::int32_t band);
// Returns the byte offset of a sample in the image's layout; 0 in a layout that has no addressing;
// -1 for a negative position, one beyond the last tile, and an offset beyond 31 bits.
std::int32_t img_std_sample_offset(const img_desc *desc, std::int32_t line, std::int32_t samp,
                                   std::int32_t band);
// True when two-byte samples change their byte order between the image and a caller's buffer.
bool img_std_exchanges_bytes(const img_desc *desc);
// Copies `count` samples of `nbytes` bytes, from one to the next `from_step` and `to_step` bytes,
// exchanging the two bytes of each if asked. Any alignment; `from` and `to` must not overlap,
// unless they are the same and bytes are exchanged.
void img_std_copy_samples(const std::uint8_t *from, std::size_t from_step, std::uint8_t *to,
                          std::size_t to_step, std::size_t count, std::int32_t nbytes,
                          bool exchange);
// The kernel of these copies: exchanges the bytes of `count` samples that lie side by side.
void img_std_exchange_bytes(const std::uint8_t *from, std::uint8_t *to, std::size_t count);

// Rows of samples in memory: sample k of row i lies at `first` + i * `pitch` + k * `step` bytes.
struct img_std_rows {
    const std::uint8_t *first;
    std::size_t pitch, step;
};
// Copies `nrows` rows of `nsamps` samples to rows that are `to_pitch` bytes apart, in which the
// samples lie side by side.
void img_std_copy_rows(const img_std_rows &from, std::uint8_t *to, std::size_t to_pitch,
                       std::size_t nrows, std::size_t nsamps, std::int32_t nbytes, bool exchange);

// --- Regions of one band ---
//
// A region is `nlines` x `nsamps` samples from (`line`, `samp`) on, inside the image; row i of
// `buffer` starts at sample i * `stride`, and its samples are in host order. All return 0, or -1
// after a message; what was moved before a failure stays. Writes leave `buffer` as it is.

// The `read` and `write` operations: hand the region to the transfer of the image's layout. An
// empty region moves nothing; one that is not inside the image is refused quietly.
std::int32_t img_std_read(img_desc *desc, std::int32_t line, std::int32_t samp, std::int32_t nlines,
                          std::int32_t nsamps, std::int32_t band, std::uint8_t *buffer,
                          std::int32_t stride);
std::int32_t img_std_write(img_desc *desc, std::int32_t line, std::int32_t samp,
                           std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                           const std::uint8_t *buffer, std::int32_t stride,
                           const std::uint8_t *fill);

// Untiled, band sequential. `exchange` says whether two-byte samples change their byte order.
std::int32_t img_std_read_lines(img_desc *desc, std::int32_t line, std::int32_t samp,
                                std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                std::uint8_t *buffer, std::int32_t stride, bool exchange);
std::int32_t img_std_write_lines(img_desc *desc, std::int32_t line, std::int32_t samp,
                                 std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                 const std::uint8_t *buffer, std::int32_t stride, bool exchange);
// The same with the byte order of the image taken care of; the write ignores `fill`.
std::int32_t img_read_nontiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                               std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                               std::uint8_t *buffer, std::int32_t stride);
std::int32_t img_std_write_nontiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                                    std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                    const std::uint8_t *buffer, std::int32_t stride,
                                    const std::uint8_t *fill);
// Untiled, pixel interleaved. The write touches this band's bytes alone and ignores `fill`.
std::int32_t img_std_read_nontiled_interleaved(img_desc *desc, std::int32_t line, std::int32_t samp,
                                               std::int32_t nlines, std::int32_t nsamps,
                                               std::int32_t band, std::uint8_t *buffer,
                                               std::int32_t stride);
std::int32_t img_std_write_nontiled_interleaved(img_desc *desc, std::int32_t line,
                                                std::int32_t samp, std::int32_t nlines,
                                                std::int32_t nsamps, std::int32_t band,
                                                const std::uint8_t *buffer, std::int32_t stride,
                                                const std::uint8_t *fill);
// Tiled, through img_load_tiles and img_dump_tiles. The write gives `fill` (null: 0), its bytes
// as they are, to the parts of its tiles that the image does not hold yet; it fails rather than
// store a tile of which it could not read what the file holds.
std::int32_t img_read_tiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                            std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                            std::uint8_t *buffer, std::int32_t stride);
std::int32_t img_std_write_tiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                                 std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                 const std::uint8_t *buffer, std::int32_t stride,
                                 const std::uint8_t *fill);

// --- Whole tiles ---
//
// A run is the tile planes of `band` of tiles `first_tile` to `first_tile` + `ntiles` - 1, inside
// the image, one after the other in `buffer` and in the file's byte order. All return 0, or -1
// after a message. A run of no tiles, or of an untiled image, moves nothing.

// The `read_tiles` and `write_tiles` operations. What a failed read did get is in `buffer`.
std::int32_t img_std_read_tiles(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                std::int32_t band, std::uint8_t *buffer);
std::int32_t img_std_write_tiles(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                 std::int32_t band, const std::uint8_t *buffer);
// Tiles of an untiled file, composed of regions; samples beyond the image are not touched.
std::int32_t img_std_read_virtual_tiles(img_desc *desc, std::int32_t first_tile,
                                        std::int32_t ntiles, std::int32_t band,
                                        std::uint8_t *buffer);
std::int32_t img_std_write_virtual_tiles(img_desc *desc, std::int32_t first_tile,
                                         std::int32_t ntiles, std::int32_t band,
                                         const std::uint8_t *buffer);

// How the samples of a band lie in a stored tile: byte of the first, bytes from one to the next.
struct img_std_plane {
    std::size_t first, step;
};
img_std_plane img_std_plane_in_tile(const img_desc *desc, std::int32_t band);

// Copies a run out of the tiles where they lie, of each plane the `nsamps` samples from
// `first_sample` on. Returns false when the run is not lent whole; then `buffer` may have been
// written.
bool img_std_read_lent_tiles(const img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                             std::int32_t band, std::size_t first_sample, std::size_t nsamps,
                             std::uint8_t *buffer);

// Copy the samples of each band between one pixel-interleaved tile and the bands' planes; sample
// i of a pixel belongs to band `band_map`[i]. Bands whose plane is null are passed over.
void img_std_split_tile(const std::uint8_t *tile, std::int32_t tile_nsamps,
                        std::int32_t tile_nlines, std::int32_t nbytes, std::int32_t nbands,
                        const std::array<std::int32_t, 3> &band_map,
                        const std::array<std::uint8_t *, 3> &planes);
void img_std_merge_tile(std::int32_t nbands, const std::array<std::int32_t, 3> &band_map,
                        const std::array<const std::uint8_t *, 3> &planes, std::int32_t tile_nsamps,
                        std::int32_t tile_nlines, std::int32_t nbytes, std::uint8_t *tile);

// --- Pre-reads ---

// The scope of reads of tiles that are to be overlaid and stored again. While it lasts,
// img_std_read_tiles prints nothing, and a read that does not get bytes that the file holds is
// told apart from one that meets the end of the data. Scopes may lie within each other.
class img_std_pre_read {
public:
    explicit img_std_pre_read(img_desc *desc);
    ~img_std_pre_read();
    img_std_pre_read(const img_std_pre_read &) = delete;
    img_std_pre_read &operator=(const img_std_pre_read &) = delete;

    // Returns 0 when the reads got all that the file holds, else -1 after a message.
    std::int32_t result() const;

private:
    img_std_file *m_file;
    std::int32_t m_outer_report_errors;
    std::int32_t m_outer_read_error;
};

// --- Images in memory ---

// Copies the whole in-memory image `mem_desc` into the file image `desc`, or fills it from there
// (`writing` 0); its first sample lies at (`line0`, `samp0`) of the file image. Both must agree
// in width and bands and, if tiled, in tile sizes; tiled images meet at tile corners. No byte
// exchange.
// Returns 0, or -1 after a message; quietly for an image that has no such storage.
std::int32_t img_std_io_virtual(std::int32_t writing, img_desc *desc, img_desc *mem_desc,
                                std::int32_t line0, std::int32_t samp0);
// Copies one sample, `nbytes` bytes, between an in-memory image and `value` (`writing` 0: out of
// the image). Returns 0, or -1 after a message; quietly for a file image or a negative position.
std::int32_t img_std_pix_io_virtual(std::int32_t writing, img_desc *desc, std::int32_t line,
                                    std::int32_t samp, std::int32_t band, std::uint8_t *value);

#endif
