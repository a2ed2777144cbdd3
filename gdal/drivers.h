// The two drivers, as GDAL's table of drivers has them.
#ifndef GDAL_IMGFILE_DRIVERS_H
#define GDAL_IMGFILE_DRIVERS_H

#include <gdal_pam.h>

#include <cstdint>

// What sets the formats apart.
struct image_format {
    const char *name;  // of the driver
    const char *long_name;
    std::int32_t type;  // an IMG_TYPE_ code
    int most_bands;
    bool has_tiles, has_two_bytes;
    int (*identify)(GDALOpenInfo *info);  // GDAL_IDENTIFY_ code, silently
};
extern const image_format vitec_format, helava_format;

// Makes a driver that reads, updates and creates images of the format.
void register_format(const image_format &format);

#endif
