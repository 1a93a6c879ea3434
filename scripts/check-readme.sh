#!/usr/bin/env bash
# Each program that the README shows is a file, which is compiled: a block of C++ stands behind a
# line "<!-- FILE -->" and is that file without its opening comment.
set -euo pipefail
cd "$(dirname "$0")/.."

mapfile -t files < <(sed -n 's/^<!-- \(examples\/.*\.cpp\) -->$/\1/p' README.md)
if [ "$(grep -c '^```cpp$' README.md)" -ne "${#files[@]}" ]; then
    echo "README.md: a block of C++ does not say which file it is." >&2
    exit 1
fi
for file in "${files[@]}"; do
    diff --label README.md --label "$file" -u \
        <(sed -n "\\|^<!-- $file -->\$|,/^\`\`\`\$/p" README.md | sed '1,2d;$d') <(sed 1,2d "$file")
done
