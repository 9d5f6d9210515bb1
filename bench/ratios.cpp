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

// Keeps the best time of each benchmark.
class BestTimes : public benchmark::ConsoleReporter {
 public:
  BestTimes() : ConsoleReporter(OO_None) {}

  void ReportRuns(const std::vector<Run>& runs) override {
    ConsoleReporter::ReportRuns(runs);
    for (const Run& run : runs) {
      if (run.run_type != Run::RT_Iteration) continue;
      const std::string& name = run.run_name.function_name;
      const double time = run.GetAdjustedRealTime();
      const auto entry = best_.emplace(name, time).first;
      entry->second = std::min(entry->second, time);
    }
  }

  void PrintRatios() const {
    for (const auto& [name, time] : best_) {
      const size_t end = name.rfind('/');
      const auto measured = best_.find(name.substr(0, end));
      if (end == name.npos || measured == best_.end()) continue;
      std::fprintf(stderr, "%-44s %6.2f times the %s\n",
                   measured->first.c_str(), measured->second / time,
                   name.c_str() + end + 1);
    }
  }

 private:
  std::map<std::string, double> best_;
};

}  // namespace

int run_with_ratios(int argc, char** argv) {
  // In turns and repeatedly, because the best times count; the user's own
  // options come later and win.
  std::vector<std::string> words = {
      "benchmark", "--benchmark_repetitions=5", "--benchmark_min_time=0.1",
      "--benchmark_enable_random_interleaving=true"};
  words.insert(words.end(), argv + 1, argv + argc);
  std::vector<char*> arguments;
  for (std::string& word : words) arguments.push_back(word.data());
  int count = static_cast<int>(arguments.size());
  benchmark::Initialize(&count, arguments.data());
  if (benchmark::ReportUnrecognizedArguments(count, arguments.data())) {
    return 1;
  }
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
