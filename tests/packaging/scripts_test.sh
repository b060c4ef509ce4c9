#!/usr/bin/env bash
# scripts/run and scripts/sandbox as a user calls them, over the programs of build/release.
#
#   scripts_test.sh SOURCE_DIRECTORY
set -euo pipefail
source=$1
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

expect() {
    local title=$1 expected=$2 got=$3
    [ "$got" = "$expected" ] || { printf '%s: expected\n%s\ngot\n%s\n' "$title" "$expected" "$got"; exit 1; }
}

search() {
    "$source/scripts/run" "$work/docs" --search tomatoes 2>"$work/log" | sort ||
        { cat "$work/log"; exit 1; }
}

help=$("$source/scripts/run" --help 2>/dev/null)
for word in --search @eaDir namespace; do
    [[ $help == *$word* ]] || { echo "--help does not tell of $word"; exit 1; }
done

# The second run starts from the index of the first, and knows what changed in between.
mkdir "$work/docs"
echo tomatoes >"$work/docs/a.txt"
echo tomatoes >"$work/docs/b.txt"
expect "first run" "$work/docs/a.txt"$'\n'"$work/docs/b.txt" "$(search)"
index=$(stat -c '%i %w' "$work/docs/@eaDir/fileindex/db")
rm "$work/docs/b.txt"
echo tomatoes >"$work/docs/c.txt"
expect "second run" "$work/docs/a.txt"$'\n'"$work/docs/c.txt" "$(search)"
expect "index of the second run" "$index" "$(stat -c '%i %w' "$work/docs/@eaDir/fileindex/db")"
rm -r "$work/docs/@eaDir/fileindex"
expect "without its index" "$work/docs/a.txt"$'\n'"$work/docs/c.txt" "$(search)"
mv "$work/docs" "$work/moved"
ln -s moved "$work/docs"
expect "moved" "$work/moved/a.txt"$'\n'"$work/moved/c.txt" "$(search)"

mkdir -p "$work/outer/inner"
touch "$work/outer/inner/file"
expect "a folder and its parent" file \
    "$("$source/scripts/sandbox" --bind "$work/outer/inner" --bind "$work/outer" ls "$work/outer/inner")"
for place in / /tmp /var; do
    if said=$("$source/scripts/sandbox" --bind "$place" true 2>&1); then
        echo "--bind $place was taken"
        exit 1
    fi
    [[ $said == *"must stay private"* ]] || { echo "--bind $place: $said"; exit 1; }
done
