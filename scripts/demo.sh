#!/usr/bin/env bash
# Builds the library and runs its first host, WordPools, on real texts: the files given, or some
# that every Debian has. Then the same without pools, for the time that it takes.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

files=("$@")
if [ ${#files[@]} -eq 0 ]; then
    files=(/usr/share/common-licenses/{GPL-3,LGPL-2.1,Apache-2.0} README.md)
else
    # The build starts elsewhere: keep the names that the user gave.
    for index in "${!files[@]}"; do
        case ${files[index]} in
            - | /*) ;;
            *) files[index]=$OLDPWD/${files[index]} ;;
        esac
    done
fi

step "Packages"
scripts/install-packages.sh build
build release WordPools
step "WordPools with pools"
build/release/examples/WordPools "${files[@]}"
if [[ " ${files[*]} " != *" - "* ]]; then
    step "WordPools without pools"
    build/release/examples/WordPools --heap "${files[@]}" | tail -n 1
fi
