# shellcheck shell=bash
# Functions for the commands of this folder, which source this file.

# Installs the missing ones of the named Debian packages, and prints their names.
need_packages()
{
    local missing=() package as_root=()
    command -v dpkg-query >/dev/null || {
        echo "Not a Debian system: assuming that these are installed: $*"
        return
    }
    for package in "$@"; do
        dpkg-query -W -f '${db:Status-Status}' "$package" 2>/dev/null | grep -qx installed ||
            missing+=("$package")
    done
    ((${#missing[@]})) || return 0

    echo "Installing ${missing[*]}"
    ((EUID == 0)) || as_root=(sudo)
    quietly "${as_root[@]}" apt-get update
    quietly "${as_root[@]}" env DEBIAN_FRONTEND=noninteractive \
        apt-get install --yes --no-install-recommends "${missing[@]}"
}

# Runs a command and prints its output only if it fails.
quietly()
{
    local log status=0
    log=$(mktemp)
    "$@" >"$log" 2>&1 || status=$?
    ((status == 0)) || cat "$log" >&2
    rm -f "$log"
    return "$status"
}
