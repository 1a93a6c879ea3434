#!/usr/bin/env bash
# Makes the Debian packages, as Debian builds its own, in build/packages; twice, in two folders, to
# see that both times the same comes out; lets lintian judge them; and installs them in a bare Debian
# of their own, where foreign hosts are built with them and run. That needs root; without it they are
# only unpacked, and gdb is not tried.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

step "Packages"
scripts/install-packages.sh build test package
top=$PWD/build/packages
root=$top/root
mkdir -p "$top"

# The bare Debian has what the hosts and the tools need. It takes a minute, which the builds share,
# and stays for the next time.
inRoot=(g++ clang cmake make pkg-config gdb libdw1)
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

# in_folder NAME COMMAND...: in that folder, with the flags by which Debian builds. What the command
# tells is shown only if it fails.
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

# make_packages NAME: in a folder of that name, of what git tracks here.
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

step "Twice the same"
packages=("$top"/one/build/package/*.deb)
[ ${#packages[@]} -eq 3 ]
for package in "${packages[@]}"; do
    cmp "$package" "$top/another-folder/build/package/${package##*/}"
    cp "$package" "$top"
done
(cd "$top" && sha256sum ./*.deb)

step "Nothing is left out"
# An install rule without a component is in no package.
cd "$top/one/build/package"
DESTDIR=$top/whole cmake --install . >/dev/null
diff <(cd "$top/whole" && find . ! -type d | sort) \
    <(for package in "${packages[@]}"; do dpkg-deb --contents "$package"; done |
        awk '$1 !~ /^d/ && $6 !~ "/usr/share/(doc|lintian)/" { print $6 }' | sort)
rm -rf "$top/whole"
cd - >/dev/null

step "Lintian"
# What is known of its findings is told in cmake/lintian. Root may run it, which it does not like.
lintian --fail-on error,warning --tag-display-limit 0 "${packages[@]}" 2>/dev/null

wait
if $isBare && [ ! -f "$top/root.made" ]; then
    cat "$top/root.log"
    echo "No bare Debian could be made."
    isBare=false
fi
hosts=$top/hosts
if $isBare; then
    step "Hosts on the packages installed in a bare Debian"
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
    # A failure may leave something behind there: it is made anew then. Its mounts go with the shell.
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
    step "Hosts on the packages, unpacked only"
    for package in "${packages[@]}"; do dpkg-deb --extract "$package" "$hosts/unpacked"; done
    library=$hosts/unpacked/usr/lib/$(dpkg-architecture -qDEB_HOST_MULTIARCH)
    cd "$hosts"
    CMAKE_PREFIX_PATH=$hosts/unpacked/usr PKG_CONFIG_PATH=$library/pkgconfig LD_LIBRARY_PATH=$library \
        PATH=$hosts/unpacked/usr/bin:$PATH sh hosts.sh "$hosts" unpacked
fi
