/* A small complete host of imgfile. It creates a tiled image, opens it again and prints its
 * properties. Then it reads a window that extends beyond the image, and a whole tile.
 *
 *     cc smallest_host.c $(pkg-config --cflags --libs imgfile) -o smallest_host
 *     ./smallest_host [NEW_FILE]
 *
 * The contract of each function is in img.h. */
#include "img.h"

#include <stdio.h>
#include <stdlib.h>

enum { NLINES = 12, NSAMPS = 20, NBANDS = 1, TILE = 8, LAST_TILE = 5 };

static int failed(const char *what)
{
    fprintf(stderr, "smallest_host: cannot %s\n", what);
    return -1;
}

static void print_samples(const char *title, const uint8_t *samples, int nlines, int nsamps)
{
    printf("%s\n", title);
    for (int line = 0; line < nlines; ++line) {
        for (int samp = 0; samp < nsamps; ++samp) printf("%4d", samples[line * nsamps + samp]);
        printf("\n");
    }
}

static int make_image(const char *name)
{
    uint8_t samples[NLINES * NSAMPS]; /* the value at line 3, sample 4 is 3 * 20 + 4 */
    for (int i = 0; i < NLINES * NSAMPS; ++i) samples[i] = (uint8_t)i;

    const img_handle image =
        img_createfile(name, NLINES, NSAMPS, NBANDS, IMG_TYPE_VITEC, TILE, TILE, 1);
    if (image == -1) return failed("create the image");
    const uint8_t fill = 0; /* for the parts of edge tiles outside the image */
    const int result = img_dump_buffer(image, 0, 0, NLINES, NSAMPS, 0, samples, NSAMPS, &fill);
    img_closefile(image); /* always returns 0 */
    return result == 0 ? 0 : failed("write the window");
}

static int print_image(img_handle image)
{
    int32_t nlines, nsamps, tile_nsamps, tile_nlines;
    if (img_query_dimension(image, &nlines, &nsamps) == -1 ||
        img_query_tile_size(image, &tile_nsamps, &tile_nlines) == -1)
        return failed("get the sizes");
    const int nbands = img_query_num_bands(image);
    if (nbands == -1) return failed("get the number of bands");
    const int is_vitec = img_query_image_type(image) == IMG_TYPE_VITEC;
    printf("%d lines x %d samples, %d band, %s, tiles of %d lines x %d samples\n", (int)nlines,
           (int)nsamps, nbands, is_vitec ? "VITec" : "not VITec", (int)tile_nlines,
           (int)tile_nsamps);

    uint8_t window[5 * 7]; /* its last two lines and three samples are outside the image */
    const uint8_t fill = 255;
    if (img_load_buffer(image, NLINES - 3, NSAMPS - 4, 5, 7, 0, window, 7, &fill) == -1)
        return failed("read the window");
    print_samples("window at line 9, sample 16, filled with 255 outside the image:", window, 5, 7);

    uint8_t tile[TILE * TILE];
    if (img_load_tiles(image, LAST_TILE, 1, 0, tile) == -1) return failed("read the tile");
    print_samples("tile 5, the last one, stored whole:", tile, TILE, TILE);
    return 0;
}

int main(int argc, char **argv)
{
    const char *name = argc > 1 ? argv[1] : "smallest_host.img";
    FILE *existing = fopen(name, "rb"); /* img_createfile would replace it */
    if (existing) {
        fclose(existing);
        fprintf(stderr, "smallest_host: %s exists already\n", name);
        return EXIT_FAILURE;
    }

    int result = make_image(name);
    if (result == 0) {
        const img_handle image = img_openfile(name, IMG_OPEN_READ_ONLY);
        result = image == -1 ? failed("open the image") : print_image(image);
        img_closefile(image);
        if (remove(name) != 0) result = failed("remove the image");
    }
    img_mgr_cleanup(); /* no image can be opened after this */
    return result == 0 ? EXIT_SUCCESS : EXIT_FAILURE;
}
