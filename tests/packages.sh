#!/bin/sh
# packages.sh CPACK BUILD SOURCE CC: makes the Debian packages of a build tree, twice, and looks at them
# as their users will: what they ask for, what is in them, whether man finds every function, and a
# host and the program of the unpacked tree at work.
# shellcheck disable=SC2016 # dpkg-deb puts the fields in
set -eu
# shellcheck source=/dev/null
. "$(dirname "$0")/expect.sh"
cpack=$1 build=$2 source=$3 cc=$4

scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
cd "$scratch"
export LC_ALL=C.UTF-8 SOURCE_DATE_EPOCH=1700000000


for folder in once again; do
    "$cpack" --config "$build/CPackConfig.cmake" -B "$scratch/$folder" >log 2>&1 || { cat log; exit 1; }
    rm -r "$folder/_CPack_Packages"
done
diff -r once again || { echo 'the same tree does not give the same packages'; failed=1; }

version=$(sed -n 's/^ *VERSION //p' "$source/CMakeLists.txt")
architecture=$(dpkg --print-architecture)
libraries=usr/lib/$(dpkg-architecture -q DEB_HOST_MULTIARCH)
package() { echo "once/$1_${version}_$architecture.deb"; }
expect 'packages' "$(package imgfile) $(package libimgfile-dev) $(package libimgfile0) " \
    "$(printf '%s ' once/*)"

# What they ask for of others.
fields() { dpkg-deb --showformat "$2" --show "$(package "$1")"; }
names() { fields "$1" '${Depends}' | sed 's/ *([^)]*)//g; s/, */\n/g' | sort | tr '\n' ' '; }
basics='${Source} ${Section} ${Priority} ${Multi-Arch}'
expect 'fields of libimgfile0' 'imgfile libs optional same' "$(fields libimgfile0 "$basics")"
expect 'fields of libimgfile-dev' 'imgfile libdevel optional same' "$(fields libimgfile-dev "$basics")"
expect 'fields of imgfile' 'imgfile graphics optional foreign' "$(fields imgfile "$basics")"
expect 'needs of libimgfile0' 'libc6 libgcc-s1 libstdc++6 ' "$(names libimgfile0)"
expect 'needs of libimgfile-dev' "libimgfile0 (= $version)" "$(fields libimgfile-dev '${Depends}')"
expect 'needs of the program: the library' '' "$(names imgfile | tr ' ' '\n' | grep libimgfile || true)"

# What they give.
for name in libimgfile0 libimgfile-dev imgfile; do
    mkdir "$name"
    dpkg-deb --raw-extract "$(package "$name")" "$name"
    (cd "$name/DEBIAN" && printf '%s ' *) >"$name.control"
    (cd "$name" && find usr ! -type d | sort) >"$name.found"
    expect "version in the changelog of $name" "$version" \
        "$(zcat "$name/usr/share/doc/$name/changelog.gz" | dpkg-parsechangelog -l - -S Version)"
done
expect 'control files of libimgfile0' 'control md5sums shlibs symbols triggers ' \
    "$(cat libimgfile0.control)"
expect 'control files of libimgfile-dev' 'control md5sums ' "$(cat libimgfile-dev.control)"
expect 'control files of imgfile' 'control md5sums ' "$(cat imgfile.control)"

documents() { printf "usr/share/doc/$1/%s\n" changelog.gz copyright; }
functions=$(sed -n 's/^IMG_EXPORT .*[ *]\(img_[a-z_]*\)(.*/\1/p' "$source/include/imgfile/img.h")
{
    printf "$libraries/%s\n" libimgfile.so.0 "libimgfile.so.$version"
    documents libimgfile0
} | sort | diff -u - libimgfile0.found || failed=1
{
    printf "$libraries/%s\n" libimgfile.so pkgconfig/imgfile.pc cmake/imgfile/imgfileConfig.cmake \
        cmake/imgfile/imgfileConfig-release.cmake cmake/imgfile/imgfileConfigVersion.cmake
    echo usr/include/imgfile/img.h
    # shellcheck disable=SC2086 # one word for each function
    printf 'usr/share/man/man3/%s.3.gz\n' imgfile $functions
    documents libimgfile-dev
    printf 'usr/share/doc/libimgfile-dev/%s\n' README.md examples/smallest_host.c
} | sort | diff -u - libimgfile-dev.found || failed=1
{
    echo usr/bin/imgfile
    for page in "$source"/tools/imgfile/man/*.1 "$source"/docs/man/*.5; do
        echo "usr/share/man/man${page##*.}/${page##*/}.gz"
    done
    [ ! -e "$source/tools/imgfile/completion.bash" ] ||
        echo usr/share/bash-completion/completions/imgfile
    documents imgfile
} | sort | diff -u - imgfile.found || failed=1

dpkg-gensymbols -plibimgfile0 -v"$version" -c4 -Plibimgfile0 \
    -I"$source/cmake/debian/symbols" -O/dev/null || failed=1
if command -v lintian >/dev/null; then
    lintian --allow-root --fail-on error,warning once/* || failed=1
fi

# All three in one tree.
mkdir root
for name in libimgfile0 libimgfile-dev imgfile; do
    cp -a "$name/usr" root
done
for function in $functions; do
    ! command -v man >/dev/null ||
        man --warnings -M root/usr/share/man 3 "$function" 2>&1 | grep -q "^ *$function(" ||
        { echo "man does not show $function" && failed=1; }
done
expect 'version of the program' "imgfile $version" "$(root/usr/bin/imgfile --version)"

ask() { PKG_CONFIG_PATH=root/$libraries/pkgconfig pkg-config "$@" imgfile; }
expect 'version for pkg-config' "$version" "$(ask --modversion)"
# shellcheck disable=SC2046 # the flags are meant to be split
"$cc" -std=c99 -pedantic-errors -Wall -Wextra -Werror $(ask --cflags) \
    root/usr/share/doc/libimgfile-dev/examples/smallest_host.c -o host $(ask --libs)
LD_LIBRARY_PATH=root/$libraries ./host >output
diff -u "$source/examples/smallest_host.expected" output || failed=1
exit "${failed:?}"
