#!/usr/bin/env bash
# The demo: installs what is missing, builds, fetches the sample photographs
# and the detector network whose features group them by subject, builds the
# sample model once (cached in .cache/sample-model/), and proposes
# styles for the astronaut photo with its face detected. Prints where the
# contact sheet is. A second run reuses the build, the photos and the model.
#
#   bash scripts/demo.sh [PHOTO]      (default: the astronaut photo)
#   VORA_REBUILD_MODEL=1 bash scripts/demo.sh    rebuilds the sample model
set -euo pipefail
root="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
cd "$root"

step() { printf '\n== %s\n' "$*"; }
timed() {
    local start end
    start=$(date +%s%N)
    "$@"
    end=$(date +%s%N)
    local ms=$(( (end - start) / 1000000 ))
    printf '   (%d.%01d s)\n' $((ms / 1000)) $(((ms % 1000) / 100))
}

step "Installing dependencies (only what is missing)"
timed bash scripts/install-deps.sh

step "Building"
cmake -S . -B build -DCMAKE_BUILD_TYPE=Release >/dev/null
timed cmake --build build -j"$(nproc)" --target vora_cli vora-qres-extract

step "Fetching the sample photographs"
export VORA_QRES_EXTRACT="$root/build/tools/vora-qres-extract"
timed bash scripts/fetch-photos.sh

step "Fetching the detector network the sample model uses"
timed bash scripts/fetch-network.sh

vora="$root/build/tools/vora"
model="$root/.cache/sample-model/"
# A model left by an older demo, built with the scene descriptor, is rebuilt.
if [ "${VORA_REBUILD_MODEL:-0}" = "1" ] || ! "$vora" inspect "$model" >/dev/null 2>&1 ||
    ! grep -q vora_nanodet_backbone "$model/net/deploy2.prototxt"; then
    step "Building the sample model from $(ls .cache/photos/styles | wc -l) style photos"
    timed "$vora" build-model --styles .cache/photos/styles --network nanodet --out "$model" --force
else
    step "Reusing the sample model in .cache/sample-model/"
fi

photo="${1:-.cache/photos/content/astronaut.png}"
out="$root/out/demo"
step "Proposing styles for $photo"
timed "$vora" suggest "$photo" --model "$model" --faces auto --out "$out" --force

echo
echo "Contact sheet: $out/contact-sheet.png"
echo "Proposals and transfers.json are beside it."
