#!/bin/sh
# plugin.sh PLUGIN NM READELF: the plugin exports the two functions by which GDAL finds the drivers,
# and needs GDAL and the runtimes alone, from where the system keeps them.
# shellcheck source=tests/expect.sh
. "$(dirname "$0")/../expect.sh"
plugin=$1 nm=$2 readelf=$3

expect 'file name' gdal_IMGFILE.so "$(basename "$plugin")"
expect 'exported symbols' 'GDALRegisterMe GDALRegister_IMGFILE ' \
    "$("$nm" -D --defined-only "$plugin" | awk '{ print $3 }' | LC_ALL=C sort | tr '\n' ' ')"
dynamic=$("$readelf" -d "$plugin")
needed=$(echo "$dynamic" | sed -n 's/.*(NEEDED).*\[\(.*\)\]/\1/p')
expect 'GDAL among the needed' 1 "$(echo "$needed" | grep -c '^libgdal\.so\.[0-9]*$')"
expect 'needed beyond GDAL and the runtimes' '' "$(echo "$needed" |
    grep -Ev '^(libgdal|libstdc\+\+|libgcc_s|libm|libc|libasan|libubsan|ld-linux[a-z0-9_-]*)\.so\.[0-9]+$')"
expect 'search paths' '' "$(echo "$dynamic" | grep -E 'RPATH|RUNPATH')"
exit "${failed:?}"
