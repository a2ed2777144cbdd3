#!/bin/sh
# check_abi.sh [--renew] DESCRIPTION LIBRARY HEADERS: holds the interface of LIBRARY, which has debug
# information, against the stored description; with --renew, stores it anew. Symbols, parameter and
# result types and constants count; that a pointer is to constant void does not.
set -eu
renew=false
[ "$1" != --renew ] || { renew=true && shift; }
description=$1 library=$2 headers=$3

if $renew; then
    abidw --headers-dir "$headers" --drop-private-types --exported-interfaces-only --no-corpus-path \
        --no-comp-dir-path --no-elf-needed --no-show-locs --type-id-style hash \
        --out-file "$description" "$library"
    sed -i "s#path='.*/\\(src\\|tests\\)/#path='\\1/#" "$description"  # wherever it was built
else
    abidiff --headers-dir2 "$headers" --harmless --no-show-locs "$description" "$library" || {
        echo "The interface is not the one in $description. If that is meant, give IMGFILE_0 a"
        echo 'successor where hosts would break, and renew the description: CONTRIBUTING.md, "Packages".'
        exit 1
    }
fi
