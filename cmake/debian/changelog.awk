# Prints CHANGELOG.md as a Debian changelog, in lines of at most 78 characters. Variables: source;
# maintainer; now, the date of an unreleased version, in seconds since 1970.
function print_item(    words, count, i, line) {
    count = split(item, words)
    line = "  *"
    for (i = 1; i <= count; ++i) {
        if (length(line) + 1 + length(words[i]) > 78) {
            print line
            line = "   "
        }
        line = line " " words[i]
    }
    if (count) print line
    item = ""
}
function close_version(    command, stamp) {
    print_item()
    if (!version) return
    command = "LC_ALL=C date -uR -d '" day "'"
    command | getline stamp
    close(command)
    printf "\n -- %s  %s\n\n", maintainer, stamp
}
/^## / {
    close_version()
    version = $2
    day = $4 == "unreleased" ? "@" now : $4
    printf "%s (%s) unstable; urgency=medium\n\n", source, version
}
version && /^- / {
    print_item()
    item = substr($0, 3)
}
version && /^  / { item = item $0 }
END { close_version() }
