#!/usr/bin/env bash
# Installs below a prefix of its own, and builds README's sample against that, with CMake's
# find_package and with pkg-config. Then the same with the prefix moved to another place.
#
#   install_test.sh BUILD_DIRECTORY SOURCE_DIRECTORY
set -euo pipefail
build=$1
source=$2
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

fail() {
    echo "$1"
    exit 1
}

quietly() {
    "$@" >"$work/log" 2>&1 || { cat "$work/log"; exit 1; }
}

# The manifest lists every file that was written.
quietly cmake --install "$build" --prefix "$work/prefix"
outside=$(grep -v "^$work/prefix/" "$build/install_manifest.txt" || true)
rm -f "$build/install_manifest.txt"
[ -z "$outside" ] || fail "installed outside of the prefix: $outside"
[ ! -e "$work/prefix/etc" ] || fail "installed configuration"

sed -n '/^```cpp$/,/^```$/{/^```/!p}' "$source/README.md" >"$work/sample.cpp"
printf '%s\n' '{"event":64,"path":"/v/s/a"}' '{"event":2,"path":"/v/s/a"}' >"$work/queue"
cp "$work/queue" "$work/queue.before"
check() {
    local output
    output=$("$@" "$work/queue")
    [ "$output" = '[02] /v/s/a' ] || fail "$1 printed: $output"
    cmp -s "$work/queue" "$work/queue.before" || fail "$1 changed the queue"
}

build_against() {
    local prefix=$1
    rm -rf "$work/consumer"
    quietly cmake -S "$source/tests/packaging/consumer" -B "$work/consumer" -G Ninja \
        -DCMAKE_PREFIX_PATH="$prefix" -DSAMPLE="$work/sample.cpp"
    quietly cmake --build "$work/consumer"
    check "$work/consumer/consumer"

    PKG_CONFIG_PATH=$(dirname "$(find "$prefix" -name quivra-fileindex.pc)")
    export PKG_CONFIG_PATH
    # shellcheck disable=SC2046  # flags are words
    c++ -std=c++20 "$work/sample.cpp" -o "$work/by-pkg-config" \
        $(pkg-config --cflags --libs quivra-fileindex) \
        -Wl,-rpath,"$(pkg-config --variable=libdir quivra-fileindex)"
    check "$work/by-pkg-config"
}

build_against "$work/prefix"
mv "$work/prefix" "$work/moved"
build_against "$work/moved"
"$work/moved/bin/fileindexctl" queue show "$work/queue" | grep -q '/v/s/a' ||
    fail "the installed front end does not show a queue"

# No header includes one that was left behind.
# shellcheck disable=SC2046
find "$work/moved/include/quivra" -name '*.h' -printf '#include "%P"\n' |
    c++ -std=c++20 -fsyntax-only $(pkg-config --cflags quivra-fileindex) -x c++ -
