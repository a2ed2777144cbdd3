#!/bin/sh
# named_tests.sh DOCUMENT TESTS: prints the tests that the document names and that do not exist.
set -eu
existing=$("$2" --gtest_list_tests | awk '/^[^ ]/ { suite = $1; sub(".*/", "", suite) } /^ / { sub("/.*", "", $1); print suite $1 }')
# shellcheck disable=SC2016 # the pattern has backquotes
named=$(grep -Eo '`[A-Z][A-Za-z]+\.[A-Z][A-Za-z0-9]+`' "$1" | tr -d '`')
! echo "$named" | grep -vxF -e "$existing"
