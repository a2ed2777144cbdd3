#!/bin/bash
# tool_pages.sh PROGRAM PAGES COMPLETION: the manual pages of the tool's commands and its completion
# have what `--help` has, no less and no more, and the pages explain what is printed as JSON.
# shellcheck source=tests/expect.sh
. "$(dirname "$0")/expect.sh"
program=$1 pages=$2
# shellcheck source=/dev/null
source "$3"

sorted() { sort -u | tr '\n' ' '; }
options_of_help() { "$program" "$@" --help | sed -n 's/^  \(--[a-z-]*\).*/\1/p' | sorted; }
values_of_help() {  # COMMAND OPTION: those of "a, b or c (default ..."
    "$program" "$1" --help | sed -n "s/^  $2 [A-Z]*  *\([a-z, ]*[a-z]\) (default.*/\1/p" |
        sed 's/ or /, /; s/, /\n/g' | sorted
}
offered() {  # WORD...: what completion offers for the last of them
    COMP_WORDS=("$@") COMP_CWORD=$(($# - 1)) COMPREPLY=()
    _imgfile
    printf '%s\n' "${COMPREPLY[@]}" | sorted
}
# What a command's help and its page have in common, in the same words.
facts_of_help() {
    "$program" "$1" --help | awk '
        NR == 1 { print "description: " tolower(substr($0, 1, 1)) substr($0, 2) }
        /^  [A-Z]+ .*REQUIRED/ { print "operand " $1 }
        /^  --/ { print "option " $1 }
        /^  --/ && $1 != "--help" { print "option in the synopsis " $1 }' | sort
}
facts_of_page() {
    awk '
        /^\.Sh/ { synopsis = $2 == "SYNOPSIS" }
        /^\.Nd/ { print "description: " substr($0, 5) }
        /^\.Ar/ && synopsis { for (i = 2; i <= NF && $i != "..."; ++i) print "operand " $i }
        /^\.It Fl Fl/ { print "option --" $4 }
        sub(/^\.(Op )?Fl Fl /, "") && synopsis { print "option in the synopsis --" $1 }' "$1" | sort
}

commands=$("$program" --help | sed -n '/^Commands/,/^$/s/^  \([a-z]*\) .*/\1/p' | sorted)
expect 'commands' 'check compare convert create info preview stats ' "$commands"
expect 'options that all have' "$(options_of_help)" \
    "$(sed -n 's/^\.It Fl Fl \([a-z-]*\).*/--\1/p' "$pages/imgfile.1" | sorted)"
expect 'pages of commands' "$commands" \
    "$(find "$pages" -name 'imgfile-*.1' | sed 's/.*imgfile-//; s/\.1$//' | sorted)"
expect 'commands of the completion' "$commands" "$(offered imgfile '')"
expect 'options of the completion' "$(options_of_help)" "$(offered imgfile --)"
in_all=$("$program" --help | sed -n '/^Commands/,/^$/s/^  \([a-z]*\)  *\(.\)/.It Cm \1\n.Nd \l\2/p')
expect 'commands in imgfile.1' "$in_all" "$(sed -n '/^\.It Cm/{N;s/\n/\n.Nd /p;}' "$pages/imgfile.1")"
for command in $commands; do
    expect "page of $command" "$(facts_of_help "$command")" "$(facts_of_page "$pages/imgfile-$command.1")"
    expect "completion of $command" "$(options_of_help "$command")" \
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
