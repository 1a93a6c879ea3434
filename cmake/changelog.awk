# Converts the newest version in CHANGELOG.md to a Debian changelog. Rewraps each list item to Debian's
# width. Takes version, maintainer and date.

function put_item(    n, words, i, line) {
    if (item == "") { return }
    gsub(/`/, "", item)
    n = split(item, words, " ")
    line = "  *"
    for (i = 1; i <= n; ++i) {
        if (length(line " " words[i]) > 78) { print line; line = "   " }
        line = line " " words[i]
    }
    print line
    item = ""
}

/^#/   { put_item() }
/^## / { ++versions }
versions != 1 { next }
/^- /  { put_item(); item = substr($0, 3) }
/^  /  { item = item " " $0 }

BEGIN { print "obrmempool (" version ") unstable; urgency=medium\n" }
END   { put_item(); print "\n -- " maintainer "  " date }
