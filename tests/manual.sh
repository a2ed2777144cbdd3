#!/bin/sh
# manual.sh HEADER PAGE...: the manual pages render without a warning, and those of section 3 have the
# functions of the header in their synopses, each once and with the same types and names.
set -eu
header=$1
shift

scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
failed=0
for page; do
    if command -v mandoc >/dev/null; then
        mandoc -T lint -W warning "$page" || failed=1
    fi
    if command -v man >/dev/null; then
        MANROFFSEQ='' MANWIDTH=80 LC_ALL=C.UTF-8 man --warnings -E UTF-8 -l "$page" 2>&1 >/dev/null |
            grep . && failed=1
    fi
done

awk '
    /^IMG_EXPORT / { sub(/^IMG_EXPORT /, ""); text = ""; inside = 1 }
    inside { gsub(/^ +/, ""); text = text (text ? " " : "") $0 }
    /;$/ { if (inside) print text; inside = 0 }' "$header" | sort >"$scratch/declared"
for page; do
    case $page in
    *.3) cat "$page" ;;
    esac
done | awk '
    function unquoted(text) { gsub(/"/, "", text); return text }
    /^\.Sh / { synopsis = $2 == "SYNOPSIS" }
    !synopsis { next }
    /^\.Ft / { result = substr($0, 5) }
    /^\.Fn / { print result " " $2 "(" unquoted($3) ");" }
    /^\.Fo / { text = result " " $2 "("; separator = "" }
    /^\.Fa / { text = text separator unquoted(substr($0, 5)); separator = ", " }
    /^\.Fc/ { print text ");" }' | sort >"$scratch/described"
diff -u "$scratch/declared" "$scratch/described" || failed=1
exit "$failed"
