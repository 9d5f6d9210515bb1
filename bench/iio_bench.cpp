#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>

// What a session at 250 Hz on three axes costs, as a multiple of what libiio's
// own iio_readdev takes to read the same blocks from the same buffer, in the
// virtual machine of scripts/kernel.

namespace {

const std::string kDevice = "/sys/bus/iio/devices/iio:device0";
constexpr int kRounds = 3;
constexpr int kRate = 250;                 // Hz
constexpr int kBlock = kRate * 20 / 1000;  // samples, in 20 ms

// What a shell command took.
rusage run(const std::string& command) {
  const pid_t pid = fork();
  if (pid == 0) {
    const std::string quiet = "exec " + command + " >/dev/null 2>&1";
    _exit(execl("/bin/sh", "sh", "-c", quiet.c_str(), nullptr));
  }
  rusage used = {};
  int status = 0;
  wait4(pid, &status, 0, &used);
  if (status == 0) return used;
  std::fprintf(stderr, "failed: %s\n", command.c_str());
  std::exit(1);
}

double seconds(const rusage& used) {
  const auto of = [](const timeval& time) {
    return static_cast<double>(time.tv_sec) +
           static_cast<double>(time.tv_usec) * 1e-6;
  };
  return of(used.ru_utime) + of(used.ru_stime);
}

std::string tool(int samples) {
  return FENNICK_PROGRAM " -r" + std::to_string(kRate) + " -n" +
         std::to_string(samples) + " accel";
}

std::string reader(int samples) {
  return "iio_readdev -b " + std::to_string(kBlock) + " -s " +
         std::to_string(samples) +
         " iio:device0 accel_x accel_y accel_z timestamp";
}

// What five seconds take, less what it takes to start and to end. The least of
// some rounds counts: what else the machine does only adds to it.
double cost(std::string (*command)(int)) {
  double least = 1e9;
  double start = 1e9;
  for (int round = 0; round < kRounds; ++round) {
    least = std::min(least, seconds(run(command(5 * kRate + kBlock))));
    start = std::min(start, seconds(run(command(kBlock))));
  }
  return least - start;
}

}  // namespace

int main() {
  // The tool sets the rate itself, the other does not.
  std::ofstream(kDevice + "/in_accel_sampling_frequency") << kRate;
  const double floor = cost(reader);
  const double session = cost(tool);
  std::printf("5 s of %d Hz on three axes\n", kRate);
  std::printf("  processor         %6.2f %% of a core  %5.2f times the floor\n",
              session / 5 * 100, session / floor);
  std::printf("  largest memory    %6ld KiB after 5 s  %ld KiB after 15 s\n",
              run(tool(5 * kRate)).ru_maxrss, run(tool(15 * kRate)).ru_maxrss);
}
