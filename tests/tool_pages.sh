#!/bin/bash
# tool_pages.sh PROGRAM PAGES COMPLETION: the manual pages of the tool's commands and its completion
# have what `--help` has, no less and no more, and the pages explain what is printed as JSON.
set -eu
program=$1 pages=$2
# shellcheck source=/dev/null
. "$(dirname "$0")/expect.sh"
# shellcheck source=/dev/null
source "$3"

scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
sorted() { sort -u | tr '\n' ' '; }
options_of_help() { "$program" "$@" --help | sed -n 's/^  \(--[a-z-]*\).*/\1/p'; }
options_of_page() { sed -n 's/^\.It Fl Fl \([a-z-]*\).*/--\1/p' "$1"; }
options_of_synopsis() {
    sed -n '/^\.Sh SYNOPSIS/,/^\.Sh DESC/s/^\.\(Op \)*Fl Fl \([a-z-]*\).*/--\2/p' "$1"
}
operands_of_help() {
    "$program" "$1" --help | sed -n 's/^  \([A-Z]*\) .*REQUIRED.*/\1/p' | sorted
}
operands_of_page() {
    sed -n '/^\.Sh SYNOPSIS/,/^\.Sh DESC/s/^\.Ar \([A-Z ]*\).*/\1/p' "$1" | tr ' ' '\n' |
        grep . | sorted
}
values_of_help() {  # COMMAND OPTION: those of "a, b or c (default ..."
    "$program" "$1" --help | sed -n "s/^  $2 [A-Z]*  *\([a-z, ]*[a-z]\) (default.*/\1/p" |
        sed 's/ or /, /; s/, /\n/g' | sorted
}
offered() {  # WORD...: what completion offers for the last of them
    COMP_WORDS=("$@") COMP_CWORD=$(($# - 1)) COMPREPLY=()
    _imgfile
    printf '%s\n' "${COMPREPLY[@]}" | sorted
}

commands=$("$program" --help | sed -n '/^Commands/,/^$/s/^  \([a-z]*\) .*/\1/p')
expect 'commands' 'check compare convert create info preview stats ' "$(echo "$commands" | sorted)"
expect 'options that all have' "$(options_of_help | sorted)" \
    "$(options_of_page "$pages/imgfile.1" | sorted)"
expect 'commands in imgfile.1' "$(echo "$commands" | sorted)" \
    "$(sed -n 's/^\.It Cm //p' "$pages/imgfile.1" | sorted)"
expect 'pages of commands' "$(echo "$commands" | sorted)" \
    "$(find "$pages" -name 'imgfile-*.1' | sed 's/.*imgfile-//; s/\.1$//' | sorted)"
expect 'commands of the completion' "$(echo "$commands" | sorted)" "$(offered imgfile '')"
expect 'options of the completion' "$(options_of_help | sorted)" "$(offered imgfile --)"
for command in $commands; do
    page=$pages/imgfile-$command.1
    described=$("$program" --help | sed -n "s/^  $command  *//p")
    said=$(sed -n 's/^\.Nd //p' "$page")
    expect "description of $command" "${described,}" "$said"
    expect "$command in imgfile.1" "$said" \
        "$(sed -n "/^\.It Cm $command/{n;p;}" "$pages/imgfile.1")"
    expect "options of $command" "$(options_of_help "$command" | sorted)" \
        "$(options_of_page "$page" | sorted)"
    expect "synopsis of $command" "$(options_of_page "$page" | grep -vx -e --help | sorted)" \
        "$(options_of_synopsis "$page" | sorted)"
    expect "operands of $command" "$(operands_of_help "$command")" "$(operands_of_page "$page")"
    expect "completion of $command" "$(options_of_help "$command" | sorted)" \
        "$(offered imgfile "$command" --)"
done

cd "$scratch"
touch 'with blank.img'
expect 'files of the completion' 'with blank.img ' "$(offered imgfile info wi)"
expect 'formats of the completion' "$(values_of_help convert --format)" \
    "$(offered imgfile convert a b --format '')"
expect 'formats after =' 'pgm png ppm ' "$(offered imgfile convert a b --format = p)"
expect 'types of the completion' "$(values_of_help create --type)" \
    "$(offered imgfile create --type '')"

"$program" create a.img --lines 8 --samples 8 --bytes 2 --tile 8
for command in info stats; do
    printed=$("$program" $command a.img --json | sed -n 's/^ *"\([a-z_]*\)":.*/\1/p')
    # Those of an object within an object are named in its text.
    explained=$(sed -n '/^\.It Li file/,/^\.El/s/^\.\(It \)*Li \([a-z_]*\).*/\2/p' \
        "$pages/imgfile-$command.1")
    expect "JSON of $command" "$(echo "$printed" | sorted)" "$(echo "$explained" | sorted)"
done
exit "${failed:?}"
