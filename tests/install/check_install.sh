#!/bin/sh
# check.sh CMAKE GENERATOR BUILD CC [CFLAGS]: installs the build tree, moves the installed tree, and builds
# and runs a host against it both ways: through the CMake package and through pkg-config.
set -eu
cmake=$1 generator=$2 build=$3 cc=$4 cflags=${5:-}

here=$(cd "$(dirname "$0")" && pwd)
scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
"$cmake" --install "$build" --prefix "$scratch/installed" >/dev/null
mv "$scratch/installed" "$scratch/moved"
cd "$scratch"

"$cmake" -G "$generator" -S "$here" -B by_cmake -DCMAKE_PREFIX_PATH="$scratch/moved" \
    -DCMAKE_C_COMPILER="$cc" -DCMAKE_C_FLAGS="$cflags"
"$cmake" --build by_cmake
by_cmake/consumer by_cmake.img

package=$(dirname "$(find moved -name imgfile.pc)")
ask() { PKG_CONFIG_PATH="$package" pkg-config "$@" imgfile; }
# shellcheck disable=SC2046,SC2086 # the flags are meant to be split
"$cc" -std=c99 -pedantic-errors -Wall -Wextra -Werror $cflags $(ask --cflags) \
    -o by_pkg_config "$here/consumer.c" $(ask --libs) -Wl,-rpath,"$(ask --variable=libdir)"
./by_pkg_config by_pkg_config.img

[ "$(ask --modversion)" = 0.1.0 ]
ls moved/share/doc/imgfile/LICENSE moved/share/doc/imgfile/README.md
