#!/bin/sh
# check_output.sh EXPECTED PROGRAM: runs PROGRAM in an empty folder and compares its output with the
# file EXPECTED.
set -eu
expected=$1 program=$2

folder=$(mktemp -d)
trap 'rm -rf "$folder"' EXIT
cd "$folder"
"$program" >output 2>&1 || { cat output; exit 1; }
diff -u "$expected" output
