#!/bin/sh
# packages.sh CPACK BUILD SOURCE CC: makes the Debian packages of a build tree, twice, and looks at them
# as their users will: what they ask for, what is in them, whether man finds every function, and a
# host and the program of the unpacked tree at work.
# shellcheck disable=SC2016,SC2059 # dpkg-deb puts the fields in; formats have folders
# shellcheck source=tests/expect.sh
. "$(dirname "$0")/expect.sh"
cpack=$1 build=$2 source=$3 cc=$4

cd "$scratch"
export LC_ALL=C.UTF-8 SOURCE_DATE_EPOCH=1700000000

for folder in once again; do
    "$cpack" --config "$build/CPackConfig.cmake" -B "$scratch/$folder" >log 2>&1 || { cat log; exit 1; }
    rm -r "$folder/_CPack_Packages"
done
diff -r once again || { echo 'the same tree does not give the same packages'; failed=1; }

version=$(sed -n 's/^ *VERSION //p' "$source/CMakeLists.txt")
libraries=usr/lib/$(dpkg-architecture -q DEB_HOST_MULTIARCH)
functions=$(sed -n 's/^IMG_EXPORT .*[ *]\(img_[a-z_]*\)(.*/\1/p' "$source/include/imgfile/img.h")
set -- once/*
has_plugin=$(grep -c 'CPACK_COMPONENTS_ALL .*gdal' "$build/CPackConfig.cmake" || true)
expect 'number of packages' $((3 + has_plugin)) $#

# Looks at one package and unpacks it into root/. The names of its files are standard input.
look() {  # PACKAGE FIELDS CONTROL_FILES
    file=once/$1_${version}_$(dpkg --print-architecture).deb documents=usr/share/doc/$1
    expect "fields of $1" "imgfile optional $2" "$(dpkg-deb --show \
        --showformat '${Source} ${Priority} ${Section} ${Multi-Arch}' "$file")"
    dpkg-deb --field "$file" Depends >"$1.needs"
    dpkg-deb --raw-extract "$file" "$1"
    expect "control files of $1" "$3" "$(cd "$1/DEBIAN" && echo *)"
    { cat && printf "$documents/%s\n" changelog.gz copyright; } | sort >wanted
    (cd "$1" && find usr ! -type d) | sort | diff -u wanted - || failed=1
    expect "version in the changelog of $1" "$version" \
        "$(zcat "$1/$documents/changelog.gz" | dpkg-parsechangelog -l - -S Version)"
    cp -a "$1/usr" root
}
mkdir root
look libimgfile0 'libs same' 'control md5sums shlibs symbols triggers' <<END
$libraries/libimgfile.so.0
$libraries/libimgfile.so.$version
END
# shellcheck disable=SC2086 # one word for each function
look libimgfile-dev 'libdevel same' 'control md5sums' <<END
$(printf "$libraries/%s\n" libimgfile.so pkgconfig/imgfile.pc)
$(printf "$libraries/cmake/imgfile/imgfileConfig%s.cmake\n" '' -release Version)
$(printf 'usr/share/man/man3/%s.3.gz\n' imgfile $functions)
$(printf 'usr/share/doc/libimgfile-dev/%s\n' README.md examples/smallest_host.c)
usr/include/imgfile/img.h
END
look imgfile 'graphics foreign' 'control md5sums' <<END
usr/bin/imgfile
usr/share/bash-completion/completions/imgfile
$(printf '%s\n' "$source"/tools/imgfile/man/*.1 "$source"/docs/man/*.5 | sed 's|.*/\(.*\.\(.\)\)$|usr/share/man/man\2/\1.gz|')
END
if [ "$has_plugin" = 1 ]; then
    look libgdal-imgfile 'libs same' 'control md5sums' <<END
$libraries/gdalplugins/gdal_IMGFILE.so
usr/share/doc/libgdal-imgfile/examples/archive_statistics.py
END
    expect 'needs of libgdal-imgfile' 'libc6 libgcc-s1 libgdalN libstdc++6' \
        "$(sed 's/ ([^)]*),*//g; s/libgdal[0-9]*/libgdalN/' libgdal-imgfile.needs)"
fi
expect 'needs of libimgfile0' 'libc6 libgcc-s1 libstdc++6' "$(sed 's/ ([^)]*),*//g' libimgfile0.needs)"
expect 'needs of libimgfile-dev' "libimgfile0 (= $version)" "$(cat libimgfile-dev.needs)"
expect 'needs of the program: the library' '' "$(grep libimgfile imgfile.needs || true)"

dpkg-gensymbols -plibimgfile0 -v"$version" -c4 -Plibimgfile0 \
    -I"$source/cmake/debian/symbols" -O/dev/null || failed=1
if command -v lintian >/dev/null; then
    lintian --allow-root --fail-on error,warning once/* || failed=1
fi

# All in one tree.
for function in $functions; do
    ! command -v man >/dev/null ||
        man --warnings -M root/usr/share/man 3 "$function" 2>&1 | grep -q "^ *$function(" ||
        { echo "man does not show $function" && failed=1; }
done
expect 'version of the program' "imgfile $version" "$(root/usr/bin/imgfile --version)"

ask() { PKG_CONFIG_PATH=root/$libraries/pkgconfig pkg-config "$@" imgfile; }
# shellcheck disable=SC2046 # the flags are meant to be split
"$cc" -std=c99 -pedantic-errors -Wall -Wextra -Werror $(ask --cflags) \
    root/usr/share/doc/libimgfile-dev/examples/smallest_host.c -o host $(ask --libs)
LD_LIBRARY_PATH=root/$libraries ./host >output
diff -u "$source/examples/smallest_host.expected" output || failed=1
exit "${failed:?}"
