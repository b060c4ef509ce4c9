#!/usr/bin/env bash
# Makes the Debian packages, unpacks them into a scratch root, runs the front end from there, and
# builds a program outside the tree against them, with CMake's find_package and with pkg-config.
#
#   packages_test.sh BUILD_DIRECTORY SOURCE_DIRECTORY
set -euo pipefail
build=$1
source=$2
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
root=$work/root

(cd "$build" && cpack -G DEB -B "$work/packages") >"$work/cpack.log" 2>&1 ||
    { cat "$work/cpack.log"; exit 1; }
for package in libfileindex1 libfileindex-dev fileindex; do
    dpkg-deb -x "$work"/packages/"$package"_*.deb "$root"
done
depends=$(dpkg-deb -f "$work"/packages/fileindex_*.deb Depends)
case $depends in
    *libfileindex1*libxapian30*) ;;
    *) echo "fileindex depends on: $depends"; exit 1 ;;
esac

for file in usr/bin/fileindexctl usr/sbin/{fileindexd,kestoelasticd,kestotifyd} \
    usr/kesto/bin/kestokosnotify lib/systemd/system/pkg-Quivra-fileindexd.service \
    etc/kesto/shares.conf usr/share/man/man1/fileindexctl.1 \
    usr/share/bash-completion/completions/fileindexctl; do
    [ -e "$root/$file" ] || [ -e "$root/usr/$file" ] || { echo "not packaged: $file"; exit 1; }
done

# Unpacked, not installed: tell the loader where the libraries are.
LD_LIBRARY_PATH=$(dirname "$(find "$root" -name 'libfileindex.so.1')")
export LD_LIBRARY_PATH
printf '%s\n' '{"event":64,"path":"/v/s/a"}' '{"event":2,"path":"/v/s/a"}' >"$work/queue"
expected=$'[02] /v/s/a\nconsumed: 2'
check() {
    local output
    output=$("$@")
    [ "$output" = "$expected" ] || { echo "$1 printed: $output"; exit 1; }
}
check "$root/usr/bin/fileindexctl" queue show "$work/queue"

cmake -S "$source/tests/packaging/consumer" -B "$work/consumer" -G Ninja \
    -DCMAKE_PREFIX_PATH="$root/usr" -DCMAKE_BUILD_TYPE=Release >"$work/cmake.log" 2>&1 &&
    cmake --build "$work/consumer" >>"$work/cmake.log" 2>&1 || { cat "$work/cmake.log"; exit 1; }
check "$work/consumer/consumer" "$work/queue"

PKG_CONFIG_PATH=$(dirname "$(find "$root" -name 'quivra-fileindex.pc')")
export PKG_CONFIG_PATH
# shellcheck disable=SC2046  # flags are words
c++ -std=c++20 "$source/tests/packaging/consumer/consumer.cpp" -o "$work/by-pkg-config" \
    $(pkg-config --cflags --libs quivra-fileindex) -Wl,-rpath-link,"$LD_LIBRARY_PATH"
check "$work/by-pkg-config" "$work/queue"

# No header includes one that was left behind.
# shellcheck disable=SC2046
find "$root/usr/include/quivra" -name '*.h' -printf '#include "%P"\n' |
    c++ -std=c++20 -fsyntax-only $(pkg-config --cflags quivra-fileindex) -x c++ -
echo "packages work"
