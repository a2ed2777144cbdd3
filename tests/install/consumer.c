/* A host of the installed library: writes an image, opens it again and reads it back. */
#include <img.h>
#include <stdio.h>
#include <string.h>

static int step(const char *what, int32_t result)
{
    if (result < 0) fprintf(stderr, "consumer: %s failed\n", what);
    return result;
}

int main(int argc, char **argv)
{
    const uint8_t written[6] = {1, 2, 3, 4, 5, 6};
    const uint8_t fill = 0;
    uint8_t read[6] = {0};
    if (argc != 2) return 2;

    img_handle image = step("create", img_createfile(argv[1], 2, 3, 1, IMG_TYPE_VITEC, 0, 0, 1));
    if (image < 0) return 1;
    if (step("write", img_dump_buffer(image, 0, 0, 2, 3, 0, written, 3, &fill)) < 0) return 1;
    img_closefile(image);

    image = step("open", img_openfile(argv[1], IMG_OPEN_READ_ONLY));
    if (image < 0) return 1;
    if (step("read", img_load_buffer(image, 0, 0, 2, 3, 0, read, 3, &fill)) < 0) return 1;
    img_closefile(image);
    return step("comparison", memcmp(written, read, sizeof read) == 0 ? 0 : -1) < 0;
}
