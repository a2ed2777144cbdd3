#!/bin/sh
# check_install.sh CMAKE GENERATOR BUILD VERSION CC [CFLAGS]: installs the build tree and moves the
# installed tree. Then builds and runs a host with it, once through the CMake package and once through
# pkg-config.
set -eu
cmake=$1 generator=$2 build=$3 version=$4 cc=$5 cflags=${6:-}

here=$(cd "$(dirname "$0")" && pwd)
scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
"$cmake" --install "$build" --prefix "$scratch/installed" >/dev/null
mv "$scratch/installed" "$scratch/moved"
cd "$scratch"

"$cmake" -G "$generator" -S "$here" -B by_cmake -DCMAKE_PREFIX_PATH="$scratch/moved" \
    -DIMGFILE_VERSION="$version" \
    -DCMAKE_C_COMPILER="$cc" -DCMAKE_C_FLAGS="$cflags"
"$cmake" --build by_cmake
by_cmake/consumer by_cmake.img

package=$(dirname "$(find moved -name imgfile.pc)")
ask() { PKG_CONFIG_PATH="$package" pkg-config "$@" imgfile; }
# shellcheck disable=SC2046,SC2086 # the flags are meant to be split
"$cc" -std=c99 -pedantic-errors -Wall -Wextra -Werror $cflags $(ask --cflags) \
    -o by_pkg_config "$here/consumer.c" $(ask --libs) -Wl,-rpath,"$(ask --variable=libdir)"
./by_pkg_config by_pkg_config.img

[ "$(ask --modversion)" = "$version" ]
ls moved/share/doc/imgfile/LICENSE moved/share/doc/imgfile/README.md
