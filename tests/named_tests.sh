#!/bin/sh
# named_tests.sh DOCUMENT TESTS: the tests that the document names exist.
set -eu
existing=$("$2" --gtest_list_tests | awk '/^[^ ]/ { suite = $1; sub(".*/", "", suite) } /^ / { sub("/.*", "", $1); print suite $1 }')
# shellcheck disable=SC2016 # the pattern has backquotes
named=$(grep -Eo '`[A-Z][A-Za-z]+\.[A-Z][A-Za-z0-9]+`' "$1" | tr -d '`' | sort -u)
[ -n "$named" ]
failed=0
for name in $named; do
    echo "$existing" | grep -qx "$name" || { echo "$1 names no test: $name" && failed=1; }
done
exit "$failed"
