#!/bin/sh
# layers.sh SOURCE_DIR ARCHIVE NM: holds src/ against the order of its folders in src/layers.txt.
# Fails for an include or an undefined symbol that leads from a folder to one above it, and for a
# folder that the order does not name. A lower layer reaches an upper one through a table of
# operations alone.
# shellcheck source=tests/expect.sh
. "$(dirname "$0")/expect.sh"
archive=$(realpath "$2") nm=$3
cd "$1/src"

# Lines "KIND FROM_FOLDER FROM_FILE TO_FOLDER TO_FILE".
grep '^#include "' ./*/* |
    sed -n 's|^\./\([a-z]*\)/\([^:]*\):.*"\([a-z]*\)/\([^"]*\)"|include \1 \2 \3 \4|p' |
    grep -v ' imgfile img\.h$' >"$scratch/all"
# An object file is named as its source; file names are unique.
find . -name '*.cpp' | tr / ' ' | cut -d ' ' -f 2- >"$scratch/homes"
"$nm" -A "$archive" | awk '
    FNR == NR { home[$2 ".o"] = $0; next }
    { match($1, /[^:]*\.o/); object = substr($1, RSTART, RLENGTH); kind = $(NF - 1) }
    kind ~ /^[TDBRVWiu]$/ && !($NF in defined) { defined[$NF] = object }
    kind == "U" { needs[object " " $NF] }
    END {
        for (need in needs) {
            split(need, f, " ")
            if (f[2] in defined) print "symbol", home[f[1]], home[defined[f[2]]]
        }
    }' "$scratch/homes" - | sort -u >>"$scratch/all"

awk '
    FNR == NR { if (!/^#/) rank[$1] = FNR; next }
    { ++seen[$1] }
    !($2 in rank) || !($4 in rank) || rank[$4] < rank[$2] {
        print $1 ": " $2 "/" $3 " reaches up to " $4 "/" $5
        bad = 1
    }
    END {
        print seen["include"] " includes, " seen["symbol"] " symbols between files"
        exit bad || !seen["include"] || !seen["symbol"]
    }' layers.txt "$scratch/all"
