#!/usr/bin/env bash
# A share gets a new name as docs/operating.md says, then a new place; files are found throughout. To
# be run in the sandbox.
#
#   share_moves_test.sh BUILD_DIRECTORY SOURCE_DIRECTORY
set -euo pipefail
[ -n "${FILEINDEX_SANDBOX:-}" ] || { echo "run it by scripts/sandbox"; exit 1; }
PATH=$1/bin:$PATH
source=$2
daemons=()
trap 'kill "${daemons[@]}" 2>/dev/null || true' EXIT

mkdir -p /etc/kesto /var/packages/Quivra/etc /var/lib/kesto /volume1/photo /volume2
printf '[photo]\npath = /volume1/photo\n' >/etc/kesto/shares.conf
echo tomatoes >/volume1/photo/old.txt
for daemon in kestoelasticd fileindexd kestotifyd; do
    "$daemon" &
    daemons+=($!)
    for ((i = 0; i < 600; i++)); do
        [ -S "/var/run/$daemon.sock" ] && break
        sleep 0.05
    done
done

expect_found() {
    local expected=$1 found= i
    for ((i = 0; i < 100; i++)); do
        found=$(fileindexctl search --paths tomatoes 2>/dev/null | sort | xargs) || true
        [ "$found" = "$expected" ] && return
        sleep 0.1
    done
    echo "found $found, expected $expected"
    exit 1
}

fileindexctl folder add /photo
expect_found /volume1/photo/old.txt

steps=$(sed -n '/^## A new name/,/^## /{/^```sh$/,/^```$/{/^```/!p}}' "$source/docs/operating.md")
bash -ec "$steps"
echo tomatoes >/volume1/pictures/new.txt
expect_found "/volume1/pictures/new.txt /volume1/pictures/old.txt"

fileindexctl share pause pictures
mv /volume1/pictures /volume2/
sed -i 's|/volume1|/volume2|' /etc/kesto/shares.conf
fileindexctl share migrate pictures /volume1/pictures
fileindexctl share resume pictures
rm /volume2/pictures/old.txt
expect_found /volume2/pictures/new.txt
