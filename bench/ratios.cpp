#include "bench/ratios.h"

#include <algorithm>
#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <iostream>
#include <map>
#include <new>
#include <vector>

namespace {

std::atomic<long> allocations = 0;

constexpr char kFloor[] = "/floor";

// Keeps the best time of each benchmark.
class BestTimes : public benchmark::ConsoleReporter {
 public:
  BestTimes() : ConsoleReporter(OO_None) {}

  void ReportRuns(const std::vector<Run>& runs) override {
    ConsoleReporter::ReportRuns(runs);
    for (const Run& run : runs) {
      if (run.run_type != Run::RT_Iteration) continue;
      const std::string& name = run.run_name.function_name;
      const auto [entry, added] =
          best_.emplace(name, run.GetAdjustedRealTime());
      if (added) names_.push_back(name);
      entry->second = std::min(entry->second, run.GetAdjustedRealTime());
    }
  }

  void PrintRatios() const {
    for (const std::string& name : names_) {
      const auto floor = best_.find(name + kFloor);
      if (floor == best_.end()) continue;
      std::fprintf(stderr, "%-44s %6.2f times the floor\n", name.c_str(),
                   best_.at(name) / floor->second);
    }
  }

 private:
  std::map<std::string, double> best_;
  std::vector<std::string> names_;
};

}  // namespace

int run_with_ratios(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  BestTimes reporter;
  // Standard output may be what is measured.
  reporter.SetOutputStream(&std::cerr);
  reporter.SetErrorStream(&std::cerr);
  benchmark::RunSpecifiedBenchmarks(&reporter);
  reporter.PrintRatios();
  return 0;
}

long allocation_count() { return allocations; }

void* operator new(size_t size) {
  ++allocations;
  void* memory = std::malloc(size);
  if (memory == nullptr) std::abort();
  return memory;
}

void operator delete(void* memory) noexcept { std::free(memory); }
void operator delete(void* memory, size_t /*size*/) noexcept {
  std::free(memory);
}
