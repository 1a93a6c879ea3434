# A filter that turns plain comments of a header into doxygen's. A comment before declarations documents all of
# them up to the next empty line. A comment after a declaration, on its line, may continue on the next lines. The
# first comment of a file documents the file. Other comments, and those in functions, do not change.

# The braces that the line opens, less those that it closes.
function opened(line) { return gsub(/\{/, "", line) - gsub(/\}/, "", line) }

function for_doxygen(text, mark) {
    sub(/\/\//, mark, text)
    if (text !~ /#include/) { gsub(/<MemPool[A-Za-z]*>/, "`&`", text) }
    return text
}

/^ *\/\/ -\*-/   { print "/// \\file"; isOfFile = 1; next }
/^ *\/\/ NOLINT/ { print ""; next }

# The body of a function, up to its last brace.
depth > 0 {
    print
    depth += opened($0)
    isComplete = 1
    next
}

# A line with only a comment.
/^ *\/\// && beside && index($0, "//") > 9 { print for_doxygen($0, "///<"); next }
/^ *\/\// {
    plain = plain $0 "\n"
    documented = documented for_doxygen($0, "///") "\n"
    next
}

# The line after a comment shows what the comment documents.
plain != "" {
    printf "%s", isOfFile || !/^ *$/ ? documented : plain
    block = /^ *$/ ? "" : documented
    plain = documented = ""
    isOfFile = isComplete = 0
}

{ beside = 0 }
/^ *$/ { block = "" }

# A further declaration with the same comment.
/= delete;$/ { print "/// Not to be called."; isComplete = 0 }
block != "" && isComplete { printf "%s", block }

/[;,{a-z] +\/\/ / { beside = 1; $0 = for_doxygen($0, "///<"); block = "" }
{
    print
    isComplete = /;( *\/\/.*)?$|\{.*\} *$/
    if (/^ *((typedef )?(class|struct|enum|namespace) .*|extern "C" )\{$/) { block = "" }
    else if (!/^ *\}/) { depth = opened($0) }
}
