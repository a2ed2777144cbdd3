#!/bin/sh
# check_install.sh CMAKE GENERATOR BUILD VERSION CC [CFLAGS]: installs the build tree and moves the
# installed tree. Then builds and runs a host with it, once through the CMake package and once through
# pkg-config.
# shellcheck source=tests/expect.sh
. "$(dirname "$0")/../expect.sh"
cmake=$1 generator=$2 build=$3 version=$4 cc=$5 cflags=${6:-}

here=$(cd "$(dirname "$0")" && pwd)
examples=$(cd "$here/../../examples" && pwd)
"$cmake" --install "$build" --prefix "$scratch/installed" >/dev/null
mv "$scratch/installed" "$scratch/moved"
cd "$scratch"

"$cmake" -G "$generator" -S "$here" -B by_cmake -DCMAKE_PREFIX_PATH="$scratch/moved" \
    -DIMGFILE_VERSION="$version" -DIMGFILE_HOST="$examples/smallest_host.c" \
    -DCMAKE_C_COMPILER="$cc" -DCMAKE_C_FLAGS="$cflags"
"$cmake" --build by_cmake
sh "$examples/check_output.sh" "$examples/smallest_host.expected" "$scratch/by_cmake/consumer"

package=$(dirname "$(find moved -name imgfile.pc)")
ask() { PKG_CONFIG_PATH="$package" pkg-config "$@" imgfile; }
# shellcheck disable=SC2046,SC2086 # the flags are meant to be split
"$cc" -std=c99 -pedantic-errors -Wall -Wextra -Werror $cflags $(ask --cflags) \
    -o by_pkg_config "$examples/smallest_host.c" $(ask --libs) -Wl,-rpath,"$PWD/$(ask --variable=libdir)"
sh "$examples/check_output.sh" "$examples/smallest_host.expected" "$scratch/by_pkg_config"

[ "$(ask --modversion)" = "$version" ]
ls moved/share/doc/imgfile/LICENSE moved/share/doc/imgfile/README.md
