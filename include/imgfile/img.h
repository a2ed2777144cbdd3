/* imgfile: windowed and tiled access to VITec (.img) and Helava (.d) raster files.
 *
 * This header is the whole interface: twelve functions in plain C99. Its comments are the contract.
 *
 * Terms. A line is a row of the image and a sample is one value in a line. Lines count from 0 at
 * the top, samples from 0 at the left. A band is a channel; bands count from 0. A tile is a block
 * of lines and samples. It is stored whole, even where it extends beyond the image. Tiles count row
 * by row from 0 at the top left. A tile plane is one band of one tile: its lines one after another,
 * without padding.
 *
 * Results. Unless stated otherwise, a function returns 0 or more on success and -1 on failure. A
 * function that fails "with a message" has printed one or more lines on standard error; one that
 * fails "silently" has printed nothing. Nothing is undone after a failure: samples that were
 * already transferred stay transferred.
 *
 * Handles. A handle is an integer from 0 to 59 that identifies an open image. A new image gets the
 * free handle that was closed last or, if there is no such handle, the lowest one never used. Any
 * other number and the handle of a closed image are invalid; each function states how it treats
 * them.
 *
 * Limits. A file, with all of its tiles stored whole, ends below 2^31 bytes. A sample has one or
 * two bytes; two-byte samples have 12 significant bits. An image that exceeds these limits cannot
 * be opened or created. An image with zero lines, samples or bands is valid and empty.
 *
 * Threads. Any thread may call any function at any time. Calls on different images run at the same
 * time, and so do loads and queries of one image. A dump waits for the loads of its image, and they
 * wait for it: no call sees a part of what another one writes. Closing an image waits for the calls
 * in progress on it; a call that begins earlier and gets its turn later finds the handle closed.
 * errno and messages belong to the call that made them. After a fork, the child may use the library
 * and all open images; the fork waits for calls in progress. A signal handler must not call the
 * library. */
#ifndef IMG_H
#define IMG_H

#include <stdint.h>

#if defined(__GNUC__)
#define IMG_EXPORT __attribute__((visibility("default")))
#else
#define IMG_EXPORT
#endif

#ifdef __cplusplus
extern "C" {
#endif

typedef int32_t img_handle; /* 0..59: an open image; -1: no image */

enum {
    IMG_TYPE_VITEC = 0,  /* ".img": a header, then samples, untiled or tiled */
    IMG_TYPE_HELAVA = 8, /* ".d": one-byte samples, untiled, then a trailer */
    IMG_NO_TYPE = 44     /* the result of img_query_image_type for an invalid handle */
};

/* Flags of img_openfile: one access mode, plus any of the others. */
enum {
    IMG_OPEN_READ_ONLY = 0,
    IMG_OPEN_WRITE_ONLY = 1, /* the open fails, because the header cannot be read */
    IMG_OPEN_READ_WRITE = 2,
    IMG_OPEN_CREATE = 0x100,   /* a missing file is created, empty */
    IMG_OPEN_TRUNCATE = 0x200, /* the file is emptied */
    IMG_OPEN_BINARY = 0x8000   /* always added by the library */
};

/* Opens an existing image file. The content of the file determines its type.
 *
 * `name` is a file name; null counts as the empty name. Leading "@" are dropped, except from a
 * name of "@" alone. A later "@" ends the file name and starts the name of an access method. In
 * this version the only method is the one with the empty name, which opens regular files and block
 * devices. A file with an "@" inside its name therefore cannot be opened. `flags` are IMG_OPEN_
 * flags; any other bit is an error. IMG_OPEN_CREATE and IMG_OPEN_TRUNCATE take effect before the
 * type is determined. If they leave an empty file, it stays and the open fails.
 *
 * Returns a handle, to be closed with img_closefile.
 * Fails silently, with errno 22 (EINVAL), if the file cannot be opened, has no known type, is
 * truncated within its header, or describes an image beyond the limits above. Fails with a message,
 * and with errno 24 (EMFILE), if 60 images are open or img_mgr_cleanup was called. If memory is
 * short, it fails with a message or as for a file of no known type. */
IMG_EXPORT img_handle img_openfile(const char *name, int32_t flags);

/* Creates an image file, replacing any file of that name, and opens it for reading and writing.
 *
 * `name` is as for img_openfile. The image has `nbands` bands of `nlines` x `nsamps` samples.
 * `type` is IMG_TYPE_VITEC or IMG_TYPE_HELAVA. `tile_nsamps` is the tile width in samples and
 * `tile_nlines` the tile height in lines; 0 and 0 make an untiled image. `nbytes` is the number of
 * bytes per sample.
 *   VITec: 0 to 3 bands, 1 or 2 bytes per sample. A tile size is 0 or a power of two from 8 to
 *   32768. Only its low 16 bits are tested for a power of two, so that 0x10008 is accepted as well.
 *   If only one of the two sizes is 0, the image is untiled, but the line length or the number of
 *   lines is padded to a multiple of the other size.
 *   Helava: any number of bands, 1 byte per sample. The file does not store tile sizes; they hold
 *   until the image is closed. They do not change where samples are stored: a "tile" consists of
 *   tile width x tile height consecutive samples of the file. The last tile of a band may extend
 *   into the next band or the trailer.
 * The header is written at once, in big-endian byte order. A sample that was never written cannot
 * be read as long as the file ends before it. It reads as 0 once a later write or img_closefile has
 * extended the file past it.
 *
 * Returns a handle, to be closed with img_closefile.
 * Fails with a message if the name is empty or null, the type does not exist or cannot be written,
 * the format cannot store the geometry, the file cannot be created, the header cannot be written,
 * 60 images are open or img_mgr_cleanup was called (both errno 24), or memory is short. The file is
 * emptied before the geometry is validated. Data written before the failure stays in the file. */
IMG_EXPORT img_handle img_createfile(const char *name, int32_t nlines, int32_t nsamps,
                                     int32_t nbands, int32_t type, int32_t tile_nsamps,
                                     int32_t tile_nlines, int32_t nbytes);

/* Closes an image. A file that is too short is first extended to its full size with zero bytes,
 * unless it was opened read-only.
 *
 * Always returns 0, even for an invalid handle. Closing twice is harmless unless another image got
 * the handle in between. A failure to extend or close the file cannot be reported. */
IMG_EXPORT int32_t img_closefile(img_handle handle);

/* Ends the use of the library: every later open or create fails as if no handle were free.
 *
 * Images that are open stay usable and can be closed. Working memory kept between calls is freed.
 * The call has no effect before the first open or create, and may be repeated. Always returns 0. */
IMG_EXPORT int32_t img_mgr_cleanup(void);

/* Gets the size of an image: first its lines, then its samples per line.
 *
 * A null pointer is skipped. Returns 0. For an invalid handle, returns -1 silently and stores
 * nothing. */
IMG_EXPORT int32_t img_query_dimension(img_handle handle, int32_t *nlines_out, int32_t *nsamps_out);

/* Gets the tile size of an image: first the width in samples, then the height in lines, the reverse
 * of img_query_dimension. At least one of them is 0 for an untiled image.
 *
 * A null pointer is skipped. Returns 0. For an invalid handle, returns -1 silently and stores
 * nothing. */
IMG_EXPORT int32_t img_query_tile_size(img_handle handle, int32_t *tile_nsamps_out,
                                       int32_t *tile_nlines_out);

/* Returns the IMG_TYPE_ of an image, or IMG_NO_TYPE for an invalid handle. */
IMG_EXPORT int32_t img_query_image_type(img_handle handle);

/* Returns the number of bands of an image, or -1 silently for an invalid handle. */
IMG_EXPORT int32_t img_query_num_bands(img_handle handle);

/* Reads a window of one band into `buffer`.
 *
 * The window is `nlines` x `nsamps` samples. Its first sample is at (`line`, `samp`). Both may be
 * negative, and the window may extend beyond the image. Samples outside the image are set to the
 * byte at `fill`; null counts as 0. Row i of `buffer` starts at sample i * `stride`. Only the first
 * `nsamps` samples of a row are written, so `buffer` needs room for (`nlines` - 1) * `stride` +
 * `nsamps` samples. If `nlines` or `nsamps` is below 1, nothing is transferred.
 *
 * A sample of `buffer` is one byte. Two-byte samples are stretched to 8 bits, each window by its
 * own histogram. The histogram counts every fourth sample of each line, except samples that equal
 * the fill or exceed 12 bits. The lowest 0.5 and the highest 1 percent of it are cut off, and the
 * values between the cuts are spread over 0..255. The fill is stretched as well. Samples that
 * exceed 12 bits map as 4095 does. Because the histogram depends on the window, two windows of one
 * image may map the same sample to different bytes. img_load_tiles reads two-byte samples
 * unchanged.
 *
 * Requires `nsamps` <= `stride`, 0 <= `band` < bands, and an image not opened write-only.
 * Returns 0.
 * Fails with a message if the handle is invalid, a requirement above is not met, memory is short,
 * the file cannot be read, or the file ends before the window does.
 * Fails silently if `buffer` is null, if it would hold 2^31 bytes or more, or if memory is short
 * for the working copy of a two-byte window.
 * After a failed read of a two-byte image, `buffer` is unchanged. Of a one-byte image it holds the
 * lines before the failed one and the bytes that were read of that line or, if the image is tiled,
 * the rows of tiles before the failed one. If the window extends beyond the image, the rest of
 * `buffer` then holds the fill. */
IMG_EXPORT int32_t img_load_buffer(img_handle handle, int32_t line, int32_t samp, int32_t nlines,
                                   int32_t nsamps, int32_t band, void *buffer, int32_t stride,
                                   const uint8_t *fill);

/* Writes a window of one band from `buffer`.
 *
 * The window is as for img_load_buffer. Samples outside the image are skipped. A sample of `buffer`
 * is as wide as one of the image, 1 or 2 bytes; two-byte samples are in native byte order. Row i of
 * `buffer` starts at sample i * `stride`. `buffer` is not modified.
 *
 * `fill` points to one sample of that width; null counts as 0. Where the file does not yet hold a
 * tile, the samples of the tile outside the window are set to the fill, without a byte swap.
 * Untiled images ignore the fill.
 *
 * Requires `nsamps` <= `stride`, 0 <= `band` < bands, and an image not opened read-only. Of the
 * first, only `nsamps` <= `stride` * bytes per sample is checked, so that the rows of a two-byte
 * window may overlap in `buffer`.
 * Returns 0.
 * Fails silently if the handle is invalid, the image was opened read-only, `buffer` is null, or a
 * sample to be written does not lie within the first 2^31 - 1 bytes of `buffer`.
 * Fails with a message if `nsamps` or `band` is out of range, memory is short, the file cannot be
 * written, or a tile that the window covers in part cannot be read back.
 * Samples written before the failure stay in the file. Stored samples outside the window are never
 * lost. */
IMG_EXPORT int32_t img_dump_buffer(img_handle handle, int32_t line, int32_t samp, int32_t nlines,
                                   int32_t nsamps, int32_t band, const void *buffer, int32_t stride,
                                   const void *fill);

/* Reads `ntiles` whole tile planes of one band, starting at tile `first_tile`, into `buffer`.
 *
 * The planes follow one another in `buffer`. The size of each in bytes is tile height x tile width
 * x bytes per sample. Samples are not stretched, and two-byte samples are in the byte order of the
 * file, which is big-endian if this library created it. If the image is untiled or `ntiles` is
 * below 1, nothing is transferred.
 *
 * Returns 0.
 * Fails silently if the handle is invalid, the image was opened write-only, the run extends beyond
 * the image's tiles, `band` is out of range, or `buffer` is null.
 * Fails with a message if the file cannot be read or ends before the run does. `buffer` then holds
 * the bytes that were read; the rest of it is unchanged. */
IMG_EXPORT int32_t img_load_tiles(img_handle handle, int32_t first_tile, int32_t ntiles,
                                  int32_t band, void *buffer);

/* Writes `ntiles` whole tile planes of one band, starting at tile `first_tile`, from `buffer`.
 *
 * The planes are laid out as for img_load_tiles, with two-byte samples in the byte order of the
 * file. `buffer` is not modified. If the run starts beyond the end of the file, the tiles in
 * between read as 0.
 *
 * Returns 0.
 * Fails silently if the handle is invalid, the image was opened read-only, the run extends beyond
 * the image's tiles, `band` is out of range, or `buffer` is null.
 * Fails with a message if the file cannot be written. */
IMG_EXPORT int32_t img_dump_tiles(img_handle handle, int32_t first_tile, int32_t ntiles,
                                  int32_t band, const void *buffer);

#ifdef __cplusplus
}
#endif

#endif
