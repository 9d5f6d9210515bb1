#ifndef BENCH_RATIOS_H_
#define BENCH_RATIOS_H_

#include <benchmark/benchmark.h>

#include <string>

// A benchmark here is measured against others of the same run, above all a
// floor: what the same work costs at least. The absolute times depend on the
// machine; the ratios hardly do.

/// Runs the registered benchmarks, several times in turns, then prints the
/// ratio of the best time of each benchmark "NAME" to that of each benchmark
/// "NAME/OTHER", by name.
int run_with_ratios(int argc, char** argv);

/// Heap allocations of this process so far.
long allocation_count();

#endif  // BENCH_RATIOS_H_
