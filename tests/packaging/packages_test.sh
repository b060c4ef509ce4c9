#!/usr/bin/env bash
# The Debian packages' whole life, in a machine of their own: installed into an image, booted, used,
# upgraded, disabled, masked, removed and purged. Exit status 77 where no such machine can be had.
#
#   packages_test.sh SOURCE_DIRECTORY      after scripts/package; keeps build/machine-*.tar
set -euo pipefail
source=$1
packages=$source/build/packages
units=(kestoelasticd.service kestotifyd.service pkg-Quivra-fileindexd.service)
work=$(mktemp -d)
root=$work/root
booted=
trap 'stop_machine; rm -rf "$work"' EXIT

fail() {
    echo "packages_test: $1"
    exit 1
}

skip() {
    echo "packages_test: not run: $1"
    exit 77
}

quietly() {
    "$@" >"$work/log" 2>&1 || { cat "$work/log"; fail "failed: $*"; }
}

# --- the machine --------------------------------------------------------------------------------

make_root() {
    local cache mirror names
    names=$(for file in "$packages"/{libfileindex1,fileindex}_*.deb; do
        dpkg-deb -f "$file" Depends
    done | tr ',' '\n' | sed 's/^ *//;s/[ (|].*//' | grep -v fileindex | sort -u | paste -sd,)
    # Made once for each set of dependencies.
    cache=$source/build/machine-$(cksum <<<"$names" | cut -d' ' -f1).tar
    if [ ! -e "$cache" ]; then
        # Where this machine gets its own packages from.
        mirror=$(apt-get indextargets --format '$(REPO_URI)' 'Created-By: Packages' | head -n 1)
        quietly debootstrap --variant=minbase --include="systemd,systemd-sysv,$names" bookworm \
            "$work/base" "$mirror"
        tar -C "$work/base" -cf "$cache.new" .
        mv "$cache.new" "$cache"
        rm -r "$work/base"
    fi
    mkdir "$root"
    tar -C "$root" -xpf "$cache"
}

boot() {
    systemd-nspawn --quiet --register=no --keep-unit --private-network --console=pipe -b -D "$root" \
        </dev/null >"$work/console" 2>&1 &
    booted=$!
    local i
    for ((i = 0; i < 600; i++)); do
        init=$(pgrep -P "$booted" 2>/dev/null | head -n 1 || true)
        if [ -n "$init" ] && [ -S "/proc/$init/root/run/systemd/private" ]; then
            in_machine systemctl is-system-running --wait >"$work/state" 2>&1 || true
            grep -qE 'running|degraded' "$work/state" && return
        fi
        kill -0 "$booted" 2>/dev/null || break
        sleep 0.1
    done
    cat "$work/console"
    skip "the machine does not boot here"
}

in_machine() {
    nsenter --target "$init" --all --root --wdns=/ env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin \
        DEBIAN_FRONTEND=noninteractive LC_ALL=C.UTF-8 "$@"
}

stop_machine() {
    [ -n "$booted" ] || return 0
    in_machine systemctl poweroff --force >/dev/null 2>&1 || true
    local i
    for ((i = 0; i < 100; i++)); do
        kill -0 "$booted" 2>/dev/null || break
        sleep 0.1
    done
    kill -9 "$booted" 2>/dev/null || true
    wait "$booted" 2>/dev/null || true
    booted=
}

expect_state() {
    local question=$1 unit=$2 expected=$3 got=
    local i
    for ((i = 0; i < 100; i++)); do
        got=$(in_machine systemctl "$question" "$unit" 2>&1) || true
        [ "$got" = "$expected" ] && return
        sleep 0.1
    done
    in_machine journalctl -u "$unit" --no-pager -n 20 || true
    fail "$unit $question: $got, expected $expected"
}

# --- the steps ----------------------------------------------------------------------------------

check_form() {
    lintian --fail-on error "$packages"/*.deb >"$work/lintian" 2>&1 ||
        { cat "$work/lintian"; fail "lintian found errors"; }
    local unit level
    for unit in "${units[@]}"; do
        level=$(systemd-analyze security --offline=true "$source/packaging/systemd/$unit" |
            sed -n 's/.*exposure level[^:]*: \([0-9]\).*/\1/p')
        [ "${level:-9}" -lt 3 ] || fail "$unit: exposure level $level"
    done
}

install_into_image() {
    printf '#!/bin/sh\nexit 101\n' >"$root/usr/sbin/policy-rc.d"
    chmod +x "$root/usr/sbin/policy-rc.d"
    cp "$packages"/{libfileindex1,fileindex}_*.deb "$root/root"
    quietly chroot "$root" sh -c 'dpkg -i /root/*.deb'
    rm "$root/usr/sbin/policy-rc.d"
    printf '[photo]\npath = /srv/photo\n' >>"$root/etc/kesto/shares.conf"
    mkdir -p "$root/srv/photo"
    echo "a garden of tomatoes" >"$root/srv/photo/first.txt"
}

find_file() {
    local i
    for ((i = 0; i < 100; i++)); do
        in_machine fileindexctl search --paths tomatoes 2>/dev/null | grep -qx "$1" && return
        sleep 0.1
    done
    in_machine fileindexctl status || true
    in_machine journalctl --no-pager -n 40 || true
    fail "not found: $1"
}

use_it() {
    local unit lock
    for unit in "${units[@]}"; do
        expect_state is-active "$unit" active
    done
    for lock in folder fi_status; do
        [ "$(in_machine stat -c '%U %a' "/tmp/quivra_cfg_$lock.lock")" = "root 600" ] ||
            fail "the lock of $lock"
    done
    quietly in_machine fileindexctl folder add /photo
    find_file /srv/photo/first.txt
    in_machine sh -c 'echo more tomatoes >/srv/photo/second.txt'
    find_file /srv/photo/second.txt
}

# The same packages as the next version, unpacked and put together again.
upgrade() {
    local package
    mkdir -p "$root/root/next"
    for package in libfileindex1 fileindex; do
        rm -rf "$work/next"
        dpkg-deb -R "$packages/$package"_*.deb "$work/next"
        sed -i 's/^Version: .*/&.1/' "$work/next/DEBIAN/control"
        quietly dpkg-deb -b "$work/next" "$root/root/next/$package.deb"
    done
    quietly in_machine sh -c 'dpkg -i /root/next/*.deb'
}

upgrade_keeps_choices() {
    quietly in_machine systemctl disable --now kestotifyd.service
    quietly in_machine systemctl mask --now kestoelasticd.service
    upgrade
    expect_state is-enabled kestotifyd.service disabled
    expect_state is-enabled kestoelasticd.service masked
    expect_state is-enabled pkg-Quivra-fileindexd.service enabled
    expect_state is-active kestoelasticd.service inactive
    [ "$(in_machine dpkg-query -W -f '${db:Status-Status}' fileindex)" = installed ] ||
        fail "an upgrade with a masked unit breaks dpkg"
    in_machine grep -q 'path = /srv/photo' /etc/kesto/shares.conf || fail "shares.conf was overwritten"
    quietly in_machine systemctl unmask kestoelasticd.service
    quietly in_machine systemctl enable --now "${units[@]}"
    find_file /srv/photo/second.txt
}

remove_and_purge() {
    local unit
    quietly in_machine dpkg --remove fileindex
    for unit in "${units[@]}"; do
        expect_state is-active "$unit" inactive
    done
    in_machine test -e /etc/kesto/shares.conf -a -d /var/lib/kesto || fail "remove took settings away"
    quietly in_machine dpkg --purge fileindex
    grep -q '/srv/photo/@eaDir/fileindex' "$work/log" || { cat "$work/log"; fail "purge is silent"; }
    local left
    for left in /etc/kesto/shares.conf /var/lib/kesto /var/packages/Quivra \
        /tmp/quivra_cfg_folder.lock; do
        ! in_machine test -e "$left" || fail "purge leaves $left"
    done
    in_machine test -d /srv/photo/@eaDir/fileindex || fail "purge took the index away"
}

[ "$(id -u)" = 0 ] || skip "needs root"
[ -e "$(echo "$packages"/fileindex_*.deb)" ] || skip "no packages; run scripts/package first"
check_form
make_root
install_into_image
boot
use_it
upgrade_keeps_choices
remove_and_purge
echo "packages work"
