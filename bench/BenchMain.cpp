// The one main of vora_bench: every bench/*.cpp is linked into it.
#include <benchmark/benchmark.h>

BENCHMARK_MAIN();
