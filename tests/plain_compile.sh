#!/bin/sh
# plain_compile.sh CXX CC ROOT: one compiler call makes the library, without a build system and without
# options for the sources, and the example host runs with it.
# shellcheck source=tests/expect.sh
. "$(dirname "$0")/expect.sh"
cxx=$1 cc=$2
root=$(cd "$3" && pwd)

cd "$scratch"
"$cxx" -std=c++20 -I"$root/src" -I"$root/include" -shared -fPIC "$root"/src/*/*.cpp -o libimgfile.so
"$cc" -I"$root/include/imgfile" "$root/examples/smallest_host.c" "$scratch/libimgfile.so" -o host
sh "$root/examples/check_output.sh" "$root/examples/smallest_host.expected" "$scratch/host"
