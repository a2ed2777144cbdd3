#!/bin/sh
# manual.sh HEADER PAGE...: the manual pages render without a warning, and those of section 3 have the
# functions of the header in their synopses, each once and with the same types and names.
# shellcheck source=tests/expect.sh
. "$(dirname "$0")/expect.sh"
header=$1
shift

if command -v mandoc >/dev/null; then
    mandoc -T lint -W warning "$@" || failed=1
fi
if command -v man >/dev/null; then
    MANROFFSEQ='' MANWIDTH=80 LC_ALL=C.UTF-8 man --warnings -E UTF-8 -l "$@" 2>&1 >/dev/null |
        grep . && failed=1
fi

awk '
    sub(/^IMG_EXPORT /, "") { text = ""; inside = 1 }
    inside { gsub(/^ +/, ""); text = text (text ? " " : "") $0 }
    inside && /;$/ { print text; inside = 0 }' "$header" | sort >"$scratch/declared"
awk '
    FILENAME !~ /\.3$/ { next }
    /^\.Sh / { synopsis = $2 == "SYNOPSIS" }
    !synopsis { next }
    { gsub(/"/, "") }
    /^\.Ft / { result = substr($0, 5) }
    /^\.Fn / { print result " " $2 "(" $3 ");" }
    /^\.Fo / { text = result " " $2 "("; separator = "" }
    /^\.Fa / { text = text separator substr($0, 5); separator = ", " }
    /^\.Fc/ { print text ");" }' "$@" | sort >"$scratch/described"
diff -u "$scratch/declared" "$scratch/described" || failed=1
exit "${failed:?}"
