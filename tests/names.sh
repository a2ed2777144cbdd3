#!/bin/sh
# names.sh SOURCE_DIR: file names are unique; every header of src/ has its source by name, or stands in
# names.txt with the reason; every source has its test by name, or stands there with the tests that
# test it; every test opens with a line that says what it tests.
set -eu
cd "$1"
failed=0
complain() {
    echo "$1"
    failed=1
}

for name in $(find src include tests tools examples fuzz bench cmake scripts -type f \
    \( -name '*.cpp' -o -name '*.[ch]' -o -name '*.sh' -o -name '*.cmake' \) | sed 's|.*/||' | sort | uniq -d); do
    complain "more than one file is named $name"
done
for source in src/*/*.cpp; do
    name=$(basename "$source" .cpp)
    tests=$(sed -n "s/^$name: //p" tests/names.txt)
    [ -e "tests/${name}_test.cpp" ] && tests="$tests ${name}_test"
    [ -n "$tests" ] || complain "$source has no test tests/${name}_test.cpp"
    for test in $tests; do
        [ -e "tests/$test.cpp" ] || complain "$source: no test tests/$test.cpp"
    done
done
for header in src/*/*.h; do
    [ -e "${header%.h}.cpp" ] || [ -e "${header%.h}_posix.cpp" ] ||
        grep -q "^$(basename "$header"): " tests/names.txt || complain "$header has no source of its name"
done
for test in tests/*_test.cpp; do
    head -n 1 "$test" | grep -q '^// ' || complain "$test does not say what it tests"
done
exit "$failed"
