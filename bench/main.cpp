// The one entry point of the benchmark program; each bench/*.cpp file only
// registers its benchmarks.
#include <benchmark/benchmark.h>

BENCHMARK_MAIN();
