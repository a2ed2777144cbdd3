# Debian packages, one per component, made by `cpack` in a build tree; scripts/package builds and runs
# it. debian/tree.cmake completes the trees before they are packed; debian/finish.cmake then adds what
# CPack cannot.
set(package_files ${PROJECT_SOURCE_DIR}/cmake/debian)

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_CONTACT "imgfile developers <imgfile@example.org>")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "")  # each package has its own first line
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_PRE_BUILD_SCRIPTS ${package_files}/tree.cmake)
set(CPACK_POST_BUILD_SCRIPTS ${package_files}/finish.cmake)

set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_ALL library development)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SOURCE imgfile)
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY ">=")

set(CPACK_DEBIAN_LIBRARY_PACKAGE_NAME libimgfile${PROJECT_VERSION_MAJOR})
set(CPACK_DEBIAN_LIBRARY_PACKAGE_SECTION libs)
set(CPACK_DEBIAN_LIBRARY_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_LIBRARY_PACKAGE_CONTROL_EXTRA ${package_files}/symbols ${package_files}/triggers)
set(CPACK_DEBIAN_LIBRARY_DESCRIPTION
"windowed and tiled access to VITec and Helava raster images
Twelve C functions open, create and query images of two raster formats,
VITec (.img) and Helava (.d), and read and write rectangular windows and
whole tiles of them. Two-byte samples arrive stretched to one byte.

This package contains the shared library.")

set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_NAME libimgfile-dev)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_DEPENDS
    "${CPACK_DEBIAN_LIBRARY_PACKAGE_NAME} (= ${PROJECT_VERSION})")
set(CPACK_DEBIAN_DEVELOPMENT_DESCRIPTION
"windowed and tiled access to VITec and Helava images - development files
Twelve C functions open, create and query images of two raster formats,
VITec (.img) and Helava (.d), and read and write rectangular windows and
whole tiles of them. Two-byte samples arrive stretched to one byte.

This package contains the header, files for CMake and pkg-config, manual
pages of the functions, and an example.")

if(TARGET imgfile_tool)
    list(APPEND CPACK_COMPONENTS_ALL tool)
    set(CPACK_DEBIAN_TOOL_PACKAGE_NAME imgfile)
    set(CPACK_DEBIAN_TOOL_PACKAGE_SECTION graphics)
    set(CPACK_DEBIAN_TOOL_PACKAGE_SHLIBDEPS ON)
    set(CPACK_DEBIAN_TOOL_DESCRIPTION
"look at, check and convert VITec and Helava raster images
One program with sub-commands for archives of two raster formats, VITec
(.img) and Helava (.d). It describes files and finds errors in them,
converts them from and to PNG, TIFF, PGM and PPM, makes previews and
statistics, and compares images sample by sample.")
endif()

if(TARGET imgfile_gdal)
    list(APPEND CPACK_COMPONENTS_ALL gdal)
    set(CPACK_DEBIAN_GDAL_PACKAGE_NAME libgdal-imgfile)
    set(CPACK_DEBIAN_GDAL_PACKAGE_SECTION libs)
    set(CPACK_DEBIAN_GDAL_PACKAGE_SHLIBDEPS ON)
    set(CPACK_DEBIAN_GDAL_DESCRIPTION
"VITec and Helava raster images in GDAL, QGIS and rasterio
A plugin with two drivers for GDAL: VITec (.img) and Helava (.d). With it,
each program that uses GDAL reads, changes and writes images of these
formats: QGIS, the GDAL commands, and the Python packages rasterio and
rioxarray among them.")
endif()

include(CPack)
