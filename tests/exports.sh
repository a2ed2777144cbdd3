#!/bin/sh
# exports.sh LIBRARY HEADER NM READELF: holds the symbol table of the shared library against the
# public header, and the libraries it needs against the runtimes.
# shellcheck source=tests/expect.sh
. "$(dirname "$0")/expect.sh"
library=$1 header=$2 nm=$3 readelf=$4

joined() { sort | tr '\n' ' '; }

declared=$(sed -n 's/^IMG_EXPORT .*[ *]\(img_[a-z_]*\)(.*/\1/p' "$header" | joined)
exported=$("$nm" -D --defined-only "$library" | awk '$2 != "A" { print $3 }' | joined)
expect 'functions in the header' 12 "$(echo "$declared" | wc -w)"
expect 'exported symbols' "$(echo "$declared" | sed 's/ /@@IMGFILE_0 /g')" "$exported"

dynamic=$("$readelf" -d "$library")
expect 'SONAME' libimgfile.so.0 "$(echo "$dynamic" | sed -n 's/.*(SONAME).*\[\(.*\)\]/\1/p')"
expect 'needed beyond the runtimes' '' "$(echo "$dynamic" | sed -n 's/.*(NEEDED).*\[\(.*\)\]/\1/p' |
    grep -Ev '^(libstdc\+\+|libgcc_s|libm|libc|libasan|libubsan|ld-linux[a-z0-9_-]*)\.so\.[0-9]+$' | joined)"

# The library is built without exceptions: what throws when memory is short must not be called.
expect 'calls that throw' '' "$("$nm" -D --undefined-only "$library" | awk '{ print $2 }' |
    grep -E '^(_Zn[wa][jm]|_ZSt[0-9]+__throw_.*|__cxa_throw)(@|$)' | joined)"
exit "${failed:?}"
