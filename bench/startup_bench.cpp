#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "bench/ratios.h"

// Whole processes, from their start to their end, against a program that is
// linked with the same libraries and does nothing.

namespace {

using Words = std::vector<std::string>;

// Runs a program, silenced, and returns what it used.
rusage run_process(const Words& words) {
  std::vector<char*> argv;
  for (const std::string& word : words) {
    argv.push_back(const_cast<char*>(word.c_str()));
  }
  argv.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 1, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addopen(&actions, 2, "/dev/null", O_WRONLY, 0);
  pid_t pid = 0;
  if (posix_spawn(&pid, argv[0], &actions, nullptr, argv.data(), environ) !=
      0) {
    std::abort();
  }
  posix_spawn_file_actions_destroy(&actions);
  int status = 0;
  rusage used = {};
  wait4(pid, &status, 0, &used);
  if (status != 0) std::abort();
  return used;
}

void run_processes(benchmark::State& state, const Words& words) {
  for (auto _ : state) run_process(words);
}

void print_memory(const char* what, const Words& words) {
  std::fprintf(stderr, "%-44s %6ld KiB at its peak\n", what,
               run_process(words).ru_maxrss);
}

}  // namespace

int main(int argc, char** argv) {
  const Words kEmpty = {EMPTY_PROGRAM};
  const std::vector<Words> kRuns = {{FENNICK_PROGRAM, "--version"},
                                    {FENNICK_PROGRAM, "list", "nosuch"}};
  for (const Words& words : kRuns) {
    std::string name = "fennick";
    for (size_t i = 1; i < words.size(); ++i) name += ' ' + words[i];
    benchmark::RegisterBenchmark((name + "/floor").c_str(), run_processes,
                                 kEmpty);
    benchmark::RegisterBenchmark(name.c_str(), run_processes, words);
  }
  const int status = run_with_ratios(argc, argv);
  print_memory("empty program", kEmpty);
  print_memory("fennick -t 5 accel gyro",
               {FENNICK_PROGRAM, "-t", "5", "accel", "gyro"});
  return status;
}
