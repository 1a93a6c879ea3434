#!/usr/bin/env bash
# Checks that each program in the README is an example, which the build compiles. A line "<!-- FILE -->"
# precedes each block of C++, and the block is FILE without its first comment.
set -euo pipefail
cd "$(dirname "$0")/.."

mapfile -t files < <(sed -n 's/^<!-- \(examples\/.*\.cpp\) -->$/\1/p' README.md)
if [ "$(grep -c '^```cpp$' README.md)" -ne "${#files[@]}" ]; then
    echo "README.md: a block of C++ has no line that names its file." >&2
    exit 1
fi
for file in "${files[@]}"; do
    diff --label README.md --label "$file" -u \
        <(sed -n "\\|^<!-- $file -->\$|,/^\`\`\`\$/p" README.md | sed '1,2d;$d') <(sed 1,2d "$file")
done
