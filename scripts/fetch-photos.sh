#!/usr/bin/env bash
# Fetches the sample photographs from Debian's archive into .cache/ (never
# committed) and lays them out for the sample model and the demo:
#   .cache/photos/styles/   graded wallpapers and the photographs of an
#                           educational data package (style photos)
#   .cache/photos/content/  two public-domain portraits (content photos)
# Credits and licences: docs/photo-credits.md. Safe to run again: a complete
# layout is left alone, and downloaded packages are kept in .cache/debs/.
#
# Environment: VORA_QRES_EXTRACT, the extractor to use (default: the one in
# build/, built on demand).
set -euo pipefail
root="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
cache="$root/.cache"
debs="$cache/debs"
unpacked="$cache/unpacked"
photos="$cache/photos"
# Bump when the selection below changes, so an old layout is redone.
layout_version="1"
stamp="$photos/.complete-$layout_version"

if [ -f "$stamp" ]; then
    exit 0
fi

fail() { echo "fetch-photos: $*" >&2; exit 1; }

packages=(lomiri-wallpapers-16.04 gcompris-qt-data python3-imageio python-matplotlib-data)

# Activities of the data package whose images are photographs; the others
# hold drawings, icons and paintings.
activities=(erase explore_farm_animals explore_monuments explore_world_animals explore_world_music clickgame)

mkdir -p "$debs"
missing=()
for p in "${packages[@]}"; do
    compgen -G "$debs/${p}_*.deb" >/dev/null || missing+=("$p")
done
if [ ${#missing[@]} -gt 0 ]; then
    echo "fetch-photos: downloading ${missing[*]}"
    if ! (cd "$debs" && apt-get download "${missing[@]}" >/dev/null 2>"$cache/apt.log"); then
        # A fresh machine may not have the package lists yet.
        sudo=""
        if [ "$(id -u)" -ne 0 ]; then sudo="sudo"; fi
        $sudo apt-get update -qq >/dev/null
        (cd "$debs" && apt-get download "${missing[@]}" >/dev/null 2>"$cache/apt.log") ||
            fail "apt-get download failed, see $cache/apt.log"
    fi
fi

rm -rf "$unpacked"
for p in "${packages[@]}"; do
    deb=$(compgen -G "$debs/${p}_*.deb" | sort | tail -n 1)
    [ -n "$deb" ] || fail "no package file for $p in $debs"
    mkdir -p "$unpacked/$p"
    dpkg-deb -x "$deb" "$unpacked/$p"
done

extract="${VORA_QRES_EXTRACT:-$root/build/tools/vora-qres-extract}"
if [ ! -x "$extract" ]; then
    echo "fetch-photos: building the resource extractor"
    cmake -S "$root" -B "$root/build" -DCMAKE_BUILD_TYPE=Release >/dev/null
    cmake --build "$root/build" --target vora-qres-extract -j "$(nproc)" >/dev/null
fi
[ -x "$extract" ] || fail "no extractor at $extract"

staging="$photos.new"
rm -rf "$staging"
mkdir -p "$staging/styles" "$staging/content"

# Graded wallpapers.
wallpapers="$unpacked/lomiri-wallpapers-16.04/usr/share/backgrounds"
count=0
for f in "$wallpapers"/*.jpg; do
    [ -f "$f" ] || continue
    cp "$f" "$staging/styles/wall-$(basename "$f")"
    count=$((count + 1))
done
[ "$count" -ge 14 ] || fail "expected at least 14 wallpapers in $wallpapers, found $count"

# Photographs inside the data package's resource archives.
rcc="$unpacked/gcompris-qt-data/usr/share/gcompris-qt/rcc"
extracted="$unpacked/gcompris-photos"
for a in "${activities[@]}"; do
    [ -f "$rcc/$a.rcc" ] || fail "missing $rcc/$a.rcc"
    "$extract" "$rcc/$a.rcc" "$extracted/$a" --photos || fail "cannot extract $rcc/$a.rcc"
done
count=0
declare -A seen=()
while IFS= read -r -d '' f; do
    # The same picture may serve two activities: keep it once.
    sum=$(sha256sum "$f" | cut -c1-64)
    [ -z "${seen[$sum]:-}" ] || continue
    seen[$sum]=1
    activity=$(realpath --relative-to="$extracted" "$f" | cut -d/ -f1)
    cp "$f" "$staging/styles/gc-$activity-$(basename "$f")"
    count=$((count + 1))
done < <(find "$extracted" -type f -print0 | sort -z)
[ "$count" -ge 100 ] || fail "expected about 120 photographs in the data package, found $count"

# Content photos for the demo.
astronaut="$unpacked/python3-imageio/usr/lib/python3/dist-packages/imageio/resources/images/astronaut.png"
hopper="$unpacked/python-matplotlib-data/usr/share/matplotlib/mpl-data/sample_data/grace_hopper.jpg"
[ -f "$astronaut" ] || fail "missing $astronaut"
[ -f "$hopper" ] || fail "missing $hopper"
cp "$astronaut" "$hopper" "$staging/content/"

rm -rf "$photos"
mv "$staging" "$photos"
touch "$stamp"
echo "fetch-photos: $(ls "$photos/styles" | wc -l) style photos and $(ls "$photos/content" | wc -l) content photos in $photos"
