#!/usr/bin/env bash
# Installs what is missing, builds, and runs every test. Run from anywhere.
#  1. a release build and its tests, including the integration test on the
#     sample photographs (fetched from Debian's archive into .cache/);
#  2. the example host built against the installed package;
#  3. the suite again under AddressSanitizer and UndefinedBehaviorSanitizer,
#     built with the scalar colour kernels only, so that the suite runs on
#     both the vector and the scalar path (VORA_SANITIZE=0 skips this pass;
#     the corpus test runs in pass 1 only);
#  4. four threads sharing one facade under ThreadSanitizer (VORA_TSAN=0 skips);
#  5. every fuzz target for a minute from its seeds, under AddressSanitizer and
#     UndefinedBehaviorSanitizer (scripts/fuzz.sh; VORA_FUZZ_SECONDS sets the
#     time, VORA_FUZZ=0 skips).
set -euo pipefail
root="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
cd "$root"
jobs="$(nproc)"

bash scripts/install-deps.sh

echo "== Release build and tests"
cmake -S . -B build -DCMAKE_BUILD_TYPE=Release -DVORA_BUILD_TESTS=ON -DVORA_BUILD_TOOLS=ON -DVORA_BUILD_BENCHMARKS=ON >/dev/null
cmake --build build -j "$jobs"
VORA_QRES_EXTRACT="$root/build/tools/vora-qres-extract" bash scripts/fetch-photos.sh
bash scripts/fetch-network.sh
ctest --test-dir build --output-on-failure -j "$jobs"

echo "== Example host against the installed package"
rm -rf build/install build/host
cmake --install build --prefix "$root/build/install" >/dev/null
cmake -S examples/host -B build/host -DCMAKE_PREFIX_PATH="$root/build/install" >/dev/null
cmake --build build/host -j "$jobs" >/dev/null
# A real run: the installed tool builds a small model from eight sample
# photos, and the host restyles a portrait with it.
mkdir -p build/host/styles
# No "| head" here: under pipefail the writer it cuts off fails with SIGPIPE.
mapfile -t photos < <(find .cache/photos/styles -maxdepth 1 -type f | LC_ALL=C sort)
cp "${photos[@]:0:8}" build/host/styles/
build/install/bin/vora build-model --styles build/host/styles --out build/host/model --force >/dev/null
LD_LIBRARY_PATH="$root/build/install/lib" build/host/vora_host build/host/model/ \
    .cache/photos/content/grace_hopper.jpg build/host/restyled.png 256
test -s build/host/restyled.png

if [ "${VORA_SANITIZE:-1}" = "1" ]; then
    echo "== Sanitizer build and tests"
    cmake -S . -B build-asan -DCMAKE_BUILD_TYPE=Debug -DVORA_SANITIZE=ON -DVORA_FORCE_SCALAR=ON -DVORA_BUILD_BENCHMARKS=OFF >/dev/null
    cmake --build build-asan -j "$jobs"
    ctest --test-dir build-asan --output-on-failure -j "$jobs" -E 'Retrieval.SampleCorpusFindsAlteredCopies'
fi

if [ "${VORA_TSAN:-1}" = "1" ]; then
    echo "== ThreadSanitizer: one facade shared by four threads"
    cmake -S . -B build-tsan -DCMAKE_BUILD_TYPE=RelWithDebInfo -DVORA_THREAD_SANITIZER=ON \
        -DVORA_BUILD_TOOLS=OFF -DVORA_BUILD_BENCHMARKS=OFF >/dev/null
    cmake --build build-tsan -j "$jobs" --target vora_api_tests
    ctest --test-dir build-tsan --output-on-failure -R 'SharedFacade\.'
fi

if [ "${VORA_FUZZ:-1}" = "1" ]; then
    echo "== Fuzzing"
    bash scripts/fuzz.sh
fi
