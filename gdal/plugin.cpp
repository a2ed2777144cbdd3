// The entry points by which GDAL finds the drivers in a plugin.
#include "drivers.h"

#include <gdal_version.h>

extern "C" {

// NOLINTBEGIN(readability-identifier-naming): GDAL gives the names
[[gnu::visibility("default")]] void GDALRegister_IMGFILE();
[[gnu::visibility("default")]] void GDALRegisterMe();
// NOLINTEND(readability-identifier-naming)

void GDALRegister_IMGFILE()
{
    // The classes of GDAL change from one minor version to the next.
    if (GDALCheckVersion(GDAL_VERSION_MAJOR, GDAL_VERSION_MINOR, "gdal_IMGFILE") == FALSE) return;
    register_format(vitec_format);
    register_format(helava_format);
}

void GDALRegisterMe()
{
    GDALRegister_IMGFILE();
}
}
