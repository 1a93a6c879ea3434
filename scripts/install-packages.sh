#!/usr/bin/env bash
# Installs the missing Debian packages for the given jobs: build, tools, test, lint, package, docs, abi,
# bench, fuzz, cross, coverage. Without root rights it prints the command that installs them, and fails.
# docs/contributing.md says how large `test` is.
set -euo pipefail

packages=()
for job in "$@"; do
    case $job in
        build) packages+=(g++ cmake ninja-build libcli11-dev) ;;
        tools) packages+=(zlib1g-dev libzstd-dev libdw-dev libiberty-dev libfmt-dev nlohmann-json3-dev) ;;
        test) packages+=(liblua5.4-dev lua5.4 libsqlite3-dev sqlite3 libxml2-dev duktape-dev libexpat1-dev libgmock-dev zlib1g-dev libzstd-dev libdw-dev libiberty-dev libfmt-dev nlohmann-json3-dev libjs-d3 chromium chromium-driver python3-selenium python3-pil clang libclang-rt-14-dev lld binutils pkg-config gdb pandoc python3 valgrind) ;;
        lint) packages+=(git clang-format clang-tidy shellcheck) ;;
        package) packages+=(git dpkg-dev file lintian mmdebstrap) ;;
        docs) packages+=(doxygen) ;;
        abi) packages+=(abigail-tools) ;;
        bench) packages+=(liblua5.4-dev libsqlite3-dev libxml2-dev duktape-dev libmruby-dev libbenchmark-dev libmimalloc-dev zlib1g-dev libzstd-dev libmimalloc2.0 libjemalloc2 libtcmalloc-minimal4
            libboost-dev gnuplot-nox python3) ;;
        cross) packages+=(g++-aarch64-linux-gnu g++-riscv64-linux-gnu qemu-user-static googletest) ;;
        coverage) packages+=(libgmock-dev gcovr python3 valgrind) ;;
        fuzz) packages+=(libgmock-dev zlib1g-dev libzstd-dev clang libclang-rt-14-dev) ;;
        *)
            echo "install-packages.sh: unknown job '$job'" >&2
            exit 2
            ;;
    esac
done

missing=()
for package in "${packages[@]}"; do
    state=$(dpkg-query --show --showformat='${db:Status-Status}' "$package" 2>/dev/null || true)
    [ "$state" = installed ] || missing+=("$package")
done
if [ ${#missing[@]} -eq 0 ]; then
    exit 0
fi

if [ "$(id -u)" -ne 0 ]; then
    echo "Some packages are missing. Install them with:" >&2
    echo "    sudo apt-get update && sudo apt-get install --no-install-recommends ${missing[*]}" >&2
    exit 1
fi
echo "Installing ${missing[*]}"
export DEBIAN_FRONTEND=noninteractive
apt-get update -q
apt-get install -q -y --no-install-recommends "${missing[@]}"
