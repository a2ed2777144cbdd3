#!/bin/sh
# installed_plugin.sh CMAKE BUILD PYTHON: installs the component `gdal` into a folder of its own, and
# opens a file of each format with the plugin that was installed.
# shellcheck source=tests/expect.sh
. "$(dirname "$0")/../expect.sh"
cmake=$1 build=$2 python=$3
here=$(cd "$(dirname "$0")" && pwd)

"$cmake" --install "$build" --prefix "$scratch/root" --component gdal >/dev/null
plugin=$(find "$scratch/root" -path '*/gdalplugins/gdal_IMGFILE.so')
expect 'installed plugins' 1 "$(echo "$plugin" | grep -c .)"
export GDAL_DRIVER_PATH="${plugin%/*}"
for file in tiled_3bands.img:VITec helava_2bands.d:Helava; do
    expect "driver of $file" "${file#*:}" "$(sh "$here/python.sh" "$python" -c '
import sys
from osgeo import gdal
image = gdal.Open(sys.argv[1])
print(image.GetDriver().ShortName if image.ReadAsArray() is not None else "unread")' \
        "$here/../data/${file%:*}")"
done
exit "${failed:?}"
