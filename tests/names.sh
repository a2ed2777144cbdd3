#!/bin/sh
# names.sh SOURCE_DIR: file names are unique; every header of src/ has its source by name and every
# source its test, unless names.txt says otherwise; every test opens with a line that says what it
# tests.
# shellcheck source=tests/expect.sh
. "$(dirname "$0")/expect.sh"
cd "$1"

expect 'names of more than one file' '' "$(find src include tests tools examples fuzz bench cmake scripts -type f \
    \( -name '*.cpp' -o -name '*.[ch]' -o -name '*.sh' -o -name '*.cmake' \) | sed 's|.*/||' | sort | uniq -d)"
for file in src/*/*.cpp src/*/*.h; do
    name=$(basename "$file")
    case $name in
    *.cpp) named=tests/${name%.cpp}_test.cpp ;;
    *.h) named=${file%.h}.cpp ;;
    esac
    [ -e "$named" ] || [ -e "${file%.h}_posix.cpp" ] || grep -qE "^[^#]*: (.* )?$name( |$)" tests/names.txt ||
        expect "$file, or a line of names.txt" "$named" ''
done
for test in $(sed -n 's/^\(.*_test\):.*/tests\/\1.cpp/p' tests/names.txt) tests/*_test.cpp; do
    expect "first words of $test" '// ' "$(head -c 3 "$test")"
done
exit "${failed:?}"
