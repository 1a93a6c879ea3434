#!/usr/bin/env bash
# Builds the Debian packages in build/packages, with Debian's own compiler flags. Builds them in a second
# folder too, to check that they are reproducible; runs lintian; and installs them in a bare Debian below
# build/packages, where it builds and runs programs that use them. That needs root rights. Without them it
# unpacks the packages here, and does not test gdb.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

step "Packages"
scripts/install-packages.sh build test package
top=$PWD/build/packages
root=$top/root
mkdir -p "$top"

# The bare Debian has what the programs and the tools need. It is made while the packages are built, and
# kept for the next run.
inRoot=(g++ clang cmake make pkg-config gdb libdw1 libfmt9)
isBare=true
[ "$(id -u)" -eq 0 ] || isBare=false
if $isBare && [ "$(cat "$top/root.made" 2>/dev/null)" != "${inRoot[*]}" ]; then
    rm -rf "$root" "$top/root.made"
    (
        timeout 1200 mmdebstrap --mode=root --variant=minbase \
            --include="$(IFS=, && echo "${inRoot[*]}")" --dpkgopt=force-unsafe-io \
            --dpkgopt='path-exclude=/usr/share/doc/*' \
            "$(. /etc/os-release && echo "$VERSION_CODENAME")" "$root" >"$top/root.log" 2>&1 &&
            echo "${inRoot[*]}" >"$top/root.made"
    ) &
fi

# in_folder NAME COMMAND...: runs the command in that folder with Debian's compiler flags. Shows its output
# only if it fails.
SOURCE_DATE_EPOCH=$(git log -1 --format=%ct)
export SOURCE_DATE_EPOCH
in_folder() (
    cd "$top/$1"
    shift
    export DEB_BUILD_MAINT_OPTIONS=hardening=+all DEB_CXXFLAGS_MAINT_STRIP=-g
    CXXFLAGS="$(dpkg-buildflags --get CXXFLAGS) $(dpkg-buildflags --get CPPFLAGS)"
    LDFLAGS=$(dpkg-buildflags --get LDFLAGS)
    export CXXFLAGS LDFLAGS
    "$@" >"$PWD.log" 2>&1 || { cat "$PWD.log"; exit 1; }
)

# make_packages NAME: builds the packages in a folder of that name, from the files that git tracks.
make_packages() {
    step "Build in $1"
    rm -rf "${top:?}/$1"
    mkdir "$top/$1"
    git ls-files -z | tar --create --null --files-from=- | tar --extract --directory="$top/$1"
    in_folder "$1" cmake --preset package
    in_folder "$1" cmake --build --preset package
    in_folder "$1/build/package" cpack -G DEB
}
make_packages one
CCACHE_DISABLE=1 make_packages another-folder

step "The library's tests with Debian's flags"
in_folder one cmake --preset package -B build/tests -DOBR_MEMPOOL_TESTS=ON -DOBR_MEMPOOL_TOOLS=OFF
in_folder one cmake --build build/tests
in_folder one ctest --test-dir build/tests -j 2 --output-on-failure --no-tests=error \
    --exclude-regex 'Consumer|Gdb|Parts'
tail -n 3 "$top/one.log"

step "Reproducible"
packages=("$top"/one/build/package/*.deb)
[ ${#packages[@]} -eq 3 ]
for package in "${packages[@]}"; do
    cmp "$package" "$top/another-folder/build/package/${package##*/}"
    cp "$package" "$top"
done
(cd "$top" && sha256sum ./*.deb)

step "Complete"
# No package has the files of an install rule without a component.
cd "$top/one/build/package"
DESTDIR=$top/whole cmake --install . >/dev/null
diff <(cd "$top/whole" && find . ! -type d ! -path './usr/share/doc/*' | sort) \
    <(for package in "${packages[@]}"; do dpkg-deb --contents "$package"; done |
        awk '$1 !~ /^d/ && $6 !~ "/usr/share/(doc|lintian)/" { print $6 }' | sort)
rm -rf "$top/whole"
cd - >/dev/null

step "Lintian"
# cmake/lintian has the known findings. Standard error has only a warning that root runs it.
lintian --fail-on error,warning --tag-display-limit 0 "${packages[@]}" 2>/dev/null

wait
if $isBare && [ ! -f "$top/root.made" ]; then
    cat "$top/root.log"
    echo "The bare Debian could not be made."
    isBare=false
fi
hosts=$top/hosts
if $isBare; then
    step "Programs with the packages, in a bare Debian"
    hosts=$root/hosts
fi
rm -rf "$hosts"
mkdir "$hosts"
cp -r tests/packages/hosts.sh "$hosts"
mkdir "$hosts/tests"
cp -r tests/consumer "$hosts/tests"
cp -r examples "$hosts"
if $isBare; then
    cp "${packages[@]}" "$hosts"
    # After a failure the bare Debian is made again. Its mounts end with the shell.
    rm "$top/root.made"
    in_root() { timeout 600 unshare --mount sh -c "mount -t proc proc '$root/proc' &&
        exec env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin chroot '$root' sh -euc '$1'"; }
    in_root 'dpkg --install /hosts/*.deb >/dev/null && cd /hosts && sh hosts.sh /hosts'
    # shellcheck disable=SC2016
    in_root 'dpkg --purge mempool-tools libobrmempool-dev libobrmempool1 >/dev/null
        left=$(find /usr /etc /var -iname "*obrmempool*"; ldconfig -p | grep ObrMemPool) || true
        [ -z "$left" ] || { echo "Left behind: $left"; exit 1; }'
    echo "${inRoot[*]}" >"$top/root.made"
else
    step "Programs with the packages, unpacked only"
    for package in "${packages[@]}"; do dpkg-deb --extract "$package" "$hosts/unpacked"; done
    library=$hosts/unpacked/usr/lib/$(dpkg-architecture -qDEB_HOST_MULTIARCH)
    cd "$hosts"
    CMAKE_PREFIX_PATH=$hosts/unpacked/usr PKG_CONFIG_PATH=$library/pkgconfig LD_LIBRARY_PATH=$library \
        PATH=$hosts/unpacked/usr/bin:$PATH sh hosts.sh "$hosts" unpacked
fi
