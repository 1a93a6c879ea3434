# A filter for doxygen: the comments of the headers become its own. One ahead of declarations is about
# all of them up to the next empty line, one beside a declaration may go on in lines of its own, and
# the first one of a file is about the file. Other comments, and those in functions, stay what they
# are.

# How many braces the line opens, those that it closes taken off.
function opened(line) { return gsub(/\{/, "", line) - gsub(/\}/, "", line) }

function for_doxygen(text, mark) {
    sub(/\/\//, mark, text)
    if (text !~ /#include/) { gsub(/<MemPool[A-Za-z]*>/, "`&`", text) }
    return text
}

/^ *\/\/ -\*-/   { print "/// \\file"; isOfFile = 1; next }
/^ *\/\/ NOLINT/ { print ""; next }

# The body of a function, up to the brace that ends it.
depth > 0 {
    print
    depth += opened($0)
    isComplete = 1
    next
}

# A line of comment alone.
/^ *\/\// && beside && index($0, "//") > 9 { print for_doxygen($0, "///<"); next }
/^ *\/\// {
    plain = plain $0 "\n"
    documented = documented for_doxygen($0, "///") "\n"
    next
}

# What stands behind a comment tells what it is about.
plain != "" {
    printf "%s", isOfFile || !/^ *$/ ? documented : plain
    block = /^ *$/ ? "" : documented
    plain = documented = ""
    isOfFile = isComplete = 0
}

{ beside = 0 }
/^ *$/ { block = "" }

# The next declaration of several with one comment.
/= delete;$/ { print "/// Not to be called."; isComplete = 0 }
block != "" && isComplete { printf "%s", block }

/[;,{a-z] +\/\/ / { beside = 1; $0 = for_doxygen($0, "///<"); block = "" }
{
    print
    isComplete = /;( *\/\/.*)?$|\{.*\} *$/
    if (/^ *(class|struct|enum|namespace) .*\{$/) { block = "" }
    else if (!/^ *\}/) { depth = opened($0) }
}
