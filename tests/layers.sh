#!/bin/sh
# layers.sh SOURCE_DIR ARCHIVE NM: holds src/ against the order of its folders in src/layers.txt.
# Fails for an include or an undefined symbol that leads from a folder to one above it, and for a
# folder that the order does not name. A lower layer reaches an upper one through a table of
# operations alone.
set -eu
source=$1 archive=$2 nm=$3
scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT

folders=$(grep -v '^#' "$source/src/layers.txt")
rank() { echo "$folders" | grep -nx "$1" | cut -d: -f1; }
for folder in "$source"/src/*/; do
    [ -n "$(rank "$(basename "$folder")")" ] || {
        echo "src/$(basename "$folder") stands in no line of src/layers.txt"
        exit 1
    }
done

# Edges "FROM_FOLDER FROM_FILE TO_FOLDER TO_FILE" of either kind.
(cd "$source/src" && grep -n '^#include "' ./*/*) |
    sed -n 's|^\./\([a-z]*\)/\([^:]*\):.*"\([a-z]*\)/\([^"]*\)"|\1 \2 \3 \4|p' |
    grep -v ' imgfile img\.h$' >"$scratch/includes"

# An object file is named as its source; file names are unique.
(cd "$source/src" && ls ./*/*.cpp) | sed 's|^\./\([a-z]*\)/\(.*\)|\2.o \1 \2|' >"$scratch/homes"
"$nm" -A "$archive" | awk -v homes="$scratch/homes" '
    BEGIN { while ((getline line < homes) > 0) { split(line, f, " "); home[f[1]] = f[2] " " f[3] } }
    {
        n = split($1, path, ":"); object = path[n - 1] == "" ? path[n] : path[n - 1]
        for (i = 1; i <= n; ++i) if (path[i] ~ /\.o$/) object = path[i]
        kind = $(NF - 1); symbol = $NF
        if (kind ~ /^[TDBRVWiu]$/ && !(symbol in defined)) defined[symbol] = object
        if (kind == "U") needs[++count] = object " " symbol
    }
    END {
        for (i = 1; i <= count; ++i) {
            split(needs[i], f, " ")
            if (f[2] in defined && defined[f[2]] != f[1]) print home[f[1]], home[defined[f[2]]]
        }
    }' | sort -u >"$scratch/symbols"

status=0
for kind in includes symbols; do
    [ -s "$scratch/$kind" ] || { echo "no $kind were found"; status=1; }
    echo "$folders" | awk -v edges="$scratch/$kind" -v kind="$kind" '
        { rank[$1] = NR }
        END {
            while ((getline < edges) > 0) {
                ++seen
                if (!($3 in rank) || rank[$3] < rank[$1]) {
                    print kind ": " $1 "/" $2 " reaches up to " $3 "/" $4
                    ++bad
                }
            }
            print seen " " kind " between files, " bad + 0 " upwards"
            exit bad > 0
        }' || status=1
done
exit "$status"
