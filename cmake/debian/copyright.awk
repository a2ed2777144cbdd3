# Prints LICENSE as a Debian copyright file. Line 1 of LICENSE names the licence, line 3 the owners.
# Variable: name, that of the project.
NR == 1 {
    print "Format: https://www.debian.org/doc/packaging-manuals/copyright-format/1.0/"
    print "Upstream-Name: " name
    print ""
    print "Files: *"
}
NR == 3 {
    sub(/^Copyright \(c\) /, "")
    print "Copyright: " $0
    print "License: Expat"
}
NR > 4 { print $0 == "" ? " ." : " " $0 }
