/* imgfile: windowed and tiled access to VITec (.img) and Helava (.d) raster files.
 *
 * The twelve functions of the library, in plain C99. Everything that a host needs to know is here.
 *
 * Words. A line is a row, counted from 0 at the top; a sample is a column, counted from 0 at the
 * left; a band is a channel, counted from 0. A tile is a block of lines and samples, stored whole
 * also where it reaches past the image; tiles are counted row by row from 0 at the top left. A
 * tile plane is one band of one tile: its lines one after the other, without padding.
 *
 * Results. Every function returns 0 or more on success and -1 on failure, unless said otherwise.
 * "After a message" means that one line or more on the standard error stream say what failed;
 * "quietly" means that nothing is printed. Nothing is undone: what was moved before a failure
 * stays moved.
 *
 * Handles. An image is named by a small integer, 0..59: of those that were given back and are
 * free the one given back last, else the lowest that was never used. Any other number, and a
 * closed handle, are refused as said at each function.
 *
 * Limits. A file ends below 2^31 bytes, and so does its last tile, stored whole; a sample takes
 * one byte or two. Images beyond that are refused when they are opened or created. Zero lines,
 * samples or bands make a valid, empty image. Of two-byte samples 12 bits count.
 *
 * Threads. The library's tables are shared and unguarded: one thread calls it at a time. */
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

typedef int32_t img_handle; /* 0..59: an open image; -1: none */

enum {
    IMG_TYPE_VITEC = 0,  /* ".img": a header, then pixels, untiled or tiled */
    IMG_TYPE_HELAVA = 8, /* ".d": one-byte pixels, then a trailer; untiled */
    IMG_NO_TYPE = 44     /* what img_query_image_type answers for a handle that names no image */
};

/* Flags of img_openfile: one access mode, and any of the others added. */
enum {
    IMG_OPEN_READ_ONLY = 0,
    IMG_OPEN_WRITE_ONLY = 1, /* such an image cannot be recognised in an ordinary file */
    IMG_OPEN_READ_WRITE = 2,
    IMG_OPEN_CREATE = 0x100,
    IMG_OPEN_TRUNCATE = 0x200,
    IMG_OPEN_BINARY = 0x8000 /* always added by the library */
};

/* Opens an existing image file and recognises its type.
 *
 * `name` is a file name; null counts as the empty name. Leading "@" are dropped; a further "@" ends
 * the file name and begins the name of an access method, of which this version has none but "",
 * ordinary files: regular files and block devices. So a file with an "@" within its name cannot be
 * opened. `flags` are the IMG_OPEN_ flags; other bits are refused. Creating and truncating happen
 * before anything is recognised: they leave an empty file, and the open fails.
 *
 * Returns a handle, to be given back with img_closefile. Returns -1 quietly with errno 22 when
 * the file cannot be opened, is of no known type, is cut short within its header, or describes an
 * image beyond the limits above; -1 with errno 24 after a message when 60 images are open or
 * after img_mgr_cleanup; -1 when memory is short, after a message or as a file of no known type. */
IMG_EXPORT img_handle img_openfile(const char *name, int32_t flags);

/* Creates an image file, replacing a file of that name, and leaves it open for reading and writing.
 *
 * `name` is as for img_openfile. The image has `nlines` x `nsamps` samples in each of `nbands`
 * bands; `type` is IMG_TYPE_VITEC or IMG_TYPE_HELAVA. `tile_nsamps` and `tile_nlines` are the
 * tile width in samples and its height in lines; 0 and 0 make an untiled image. `nbytes` is the
 * bytes of a sample, 1 or 2.
 *   VITec: 0 to 3 bands; tile sizes 0 or powers of two from 8 to 32768; 1 or 2 bytes. A size is
 *   tested in its lower sixteen bits, so that 0x10008, too, passes for a power of two. With one of
 *   the two 0 the image is untiled, but is still stored in multiples of the other.
 *   Helava: any number of bands; 1 byte. Tile sizes are not stored in the file and hold only
 *   until it is closed. They do not change where samples lie: a "tile" is a piece of that many
 *   samples in file order, and one at the end of a band reaches into what follows it, the next
 *   band or the trailer.
 * The header is written at once, in big-endian order. Samples that are never written read as an
 * error while the file ends before them, as 0 once it has grown past them or has been closed.
 *
 * Returns a handle. Returns -1 after a message: the name is empty or null; the type does not exist
 * or cannot be written; the geometry cannot be stored; the file cannot be created, or its header
 * not be written; 60 images are open or img_mgr_cleanup was called (errno 24); memory is short.
 * The file is emptied before the geometry is looked at, and what was written of it stays. */
IMG_EXPORT img_handle img_createfile(const char *name, int32_t nlines, int32_t nsamps,
                                     int32_t nbands, int32_t type, int32_t tile_nsamps,
                                     int32_t tile_nlines, int32_t nbytes);

/* Closes an image, completing a file that is too short with zero bytes to its full size.
 *
 * Returns 0 always, also for a handle that names no image: closing twice is harmless. A failure
 * while the file is completed or closed cannot be reported. */
IMG_EXPORT int32_t img_closefile(img_handle handle);

/* Ends the use of the library: from then on opens and creates fail as if no handle were free.
 *
 * Images that are still open stay usable and can be closed. Calling it before the first open or
 * create does nothing; calling it twice is harmless. Returns 0 always. */
IMG_EXPORT int32_t img_mgr_cleanup(void);

/* Asks the size of an image: its lines, then its samples per line.
 *
 * A null pointer is passed over. Returns 0, or -1 quietly for a handle that names no image; then
 * nothing is stored. */
IMG_EXPORT int32_t img_query_dimension(img_handle handle, int32_t *nlines_out, int32_t *nsamps_out);

/* Asks the tile size of an image: its width in samples, then its height in lines (the other way
 * round than img_query_dimension). An untiled image answers 0 for at least one of them.
 *
 * A null pointer is passed over. Returns 0, or -1 quietly for a handle that names no image; then
 * nothing is stored. */
IMG_EXPORT int32_t img_query_tile_size(img_handle handle, int32_t *tile_nsamps_out,
                                       int32_t *tile_nlines_out);

/* Returns the IMG_TYPE_ of an image, or IMG_NO_TYPE for a handle that names no image. */
IMG_EXPORT int32_t img_query_image_type(img_handle handle);

/* Returns the number of bands of an image, or -1 quietly for a handle that names no image. */
IMG_EXPORT int32_t img_query_num_bands(img_handle handle);

/* Reads a window of one band into `buffer`.
 *
 * The window is `nlines` x `nsamps` samples, its first at (`line`, `samp`); both may be negative.
 * Samples outside the image get the byte at `fill` (null counts as 0). Row i of `buffer` starts
 * at sample i * `stride`; only its first `nsamps` samples are written, so that it must hold
 * (`nlines` - 1) * `stride` + `nsamps` samples. A window with fewer than one line or sample moves
 * nothing.
 *
 * A sample of `buffer` is one byte. Two-byte images arrive stretched to it: the window's own
 * histogram, taken at every fourth sample of each line and without the fill value, is cut at
 * half a percent and at 99 percent, and what lies between is spread over 0..255. The fill, too,
 * goes through the stretch. Samples beyond the 12 bits map as 4095 does and are not counted. Two
 * windows of one image may map the same sample to different bytes; img_load_tiles reads two-byte
 * samples as they are.
 *
 * Requires `nsamps` <= `stride`, 0 <= `band` < bands, an image not opened write-only.
 * Returns 0. Returns -1 after a message for a handle that names no image, for what is required
 * above, when memory is short, and when the file cannot be read or ends before the window does:
 * of a one-byte image the lines before the one that failed and the bytes that came of that one
 * are in `buffer` (tiled: the rows of tiles before), and the rest of a window that leaves the
 * image holds the fill; of a two-byte image `buffer` is left as it was. Returns -1 quietly when
 * `buffer` is null or would have to hold 2^31 bytes or more, and when memory for the working copy
 * of a two-byte window is short. */
IMG_EXPORT int32_t img_load_buffer(img_handle handle, int32_t line, int32_t samp, int32_t nlines,
                                   int32_t nsamps, int32_t band, void *buffer, int32_t stride,
                                   const uint8_t *fill);

/* Writes a window of one band from `buffer`.
 *
 * The window is as for img_load_buffer; the part of it outside the image is passed over, and a
 * window wholly outside moves nothing. Samples in `buffer` are as wide as the image's, 1 or 2
 * bytes, two-byte samples in the host's byte order; row i starts at sample i * `stride`. `buffer`
 * is not modified. `fill` points to one such sample, for those parts of tiles that the window
 * leaves open and the file does not hold yet; its bytes are stored as they are. Null counts as 0.
 *
 * Requires 0 <= `band` < bands, an image not opened read-only, and `nsamps` <= `stride`. Of the
 * last, only `nsamps` <= `stride` * bytes per sample is tested: the rows of a two-byte window may
 * overlap in `buffer`.
 * Returns 0. Returns -1 quietly for a handle that names no image, an image opened read-only, and
 * a `buffer` that is null or of which 2^31 bytes or more would be spanned by what is written; -1
 * after a message for an unfit `nsamps` or `band`, when memory is short, when the file cannot be
 * written, or when a tile that the window shares cannot be read back. What was written before the
 * failure stays; stored samples outside the window are never lost. */
IMG_EXPORT int32_t img_dump_buffer(img_handle handle, int32_t line, int32_t samp, int32_t nlines,
                                   int32_t nsamps, int32_t band, const void *buffer, int32_t stride,
                                   const void *fill);

/* Reads `ntiles` whole tile planes of one band, from tile `first_tile` on, into `buffer`.
 *
 * The planes lie one after the other, each tile height x tile width x bytes per sample long.
 * Samples are as the file holds them: not stretched, and two-byte samples in the file's byte
 * order, which is big-endian in every file that this library wrote. An untiled image moves
 * nothing; so does `ntiles` below 1.
 *
 * Returns 0. Returns -1 quietly for a handle that names no image, an image opened write-only, a
 * run that leaves the image's tiles, a band out of range, and a null `buffer`; -1 after a message
 * when the file cannot be read or ends before the run does: what was read until then is in
 * `buffer`, and the rest is as it was. */
IMG_EXPORT int32_t img_load_tiles(img_handle handle, int32_t first_tile, int32_t ntiles,
                                  int32_t band, void *buffer);

/* Writes `ntiles` whole tile planes of one band from `buffer`, from tile `first_tile` on.
 *
 * The planes are laid out as for img_load_tiles, samples in the file's byte order; `buffer` is
 * not modified. Tiles passed over by a file that grows read as 0.
 *
 * Returns 0. Returns -1 quietly for a handle that names no image, an image opened read-only, a
 * run that leaves the image's tiles, a band out of range, and a null `buffer`; -1 after a message
 * when the file cannot be written. */
IMG_EXPORT int32_t img_dump_tiles(img_handle handle, int32_t first_tile, int32_t ntiles,
                                  int32_t band, const void *buffer);

#ifdef __cplusplus
}
#endif

#endif
