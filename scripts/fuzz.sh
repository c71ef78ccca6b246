#!/usr/bin/env bash
# Builds the libFuzzer targets with clang under AddressSanitizer and
# UndefinedBehaviorSanitizer, and runs each for a fixed time (default 60 s;
# VORA_FUZZ_SECONDS to change) from its seeds in tests/fuzz/corpus/<target>/.
# New inputs go to build-fuzz/corpus/<target>/; a crash is written to
# build-fuzz/findings/ and fails the script. Prints each target's executions.
set -euo pipefail
root="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
cd "$root"
seconds="${VORA_FUZZ_SECONDS:-60}"
targets=(fuzz_definition fuzz_cluster_file fuzz_style_file fuzz_score_files fuzz_weights fuzz_transfers)

cmake -S . -B build-fuzz -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_CXX_COMPILER=clang++-14 -DVORA_FUZZ=ON \
    -DVORA_BUILD_TESTS=OFF -DVORA_BUILD_TOOLS=OFF -DVORA_BUILD_BENCHMARKS=OFF >/dev/null
cmake --build build-fuzz -j "$(nproc)" --target "${targets[@]}"

# Leaks inside dependencies are not findings (tests/fuzz/lsan.supp says which).
export LSAN_OPTIONS="suppressions=$root/tests/fuzz/lsan.supp${LSAN_OPTIONS:+:$LSAN_OPTIONS}"

mkdir -p build-fuzz/findings
total=0
failed=()
for target in "${targets[@]}"; do
    work="build-fuzz/corpus/$target"
    mkdir -p "$work"
    log="build-fuzz/$target.log"
    # Seeds are read, never written: new inputs go to the work folder.
    if build-fuzz/tests/fuzz/"$target" "$work" "tests/fuzz/corpus/$target" -max_total_time="$seconds" \
        -max_len=65536 -rss_limit_mb=2048 -timeout=10 -print_final_stats=1 \
        -artifact_prefix="build-fuzz/findings/$target-" >"$log" 2>&1; then
        status=ok
    else
        status=FAILED
        failed+=("$target")
    fi
    runs="$(sed -n 's/^stat::number_of_executed_units: *//p' "$log" | tail -1)"
    total=$((total + ${runs:-0}))
    printf '%-20s %10s executions  %s\n' "$target" "${runs:-?}" "$status"
done
printf '%-20s %10s executions\n' total "$total"
if [ "${#failed[@]}" -gt 0 ]; then
    echo "findings in: ${failed[*]} (inputs in build-fuzz/findings/, logs in build-fuzz/<target>.log)" >&2
    exit 1
fi
