# shellcheck shell=sh disable=SC2034 # who sources it reads `failed`
# expect.sh: for tests in shell, which source it. `failed` is 1 once an expectation was not met, and
# `scratch` is a folder that is removed at the end.
set -eu
failed=0
scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
expect() {  # WHAT EXPECTED FOUND
    [ "$2" = "$3" ] && return
    printf '%s\n  expected: %s\n  found:    %s\n' "$1" "$2" "$3"
    failed=1
}
