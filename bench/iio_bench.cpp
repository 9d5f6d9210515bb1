#include <fcntl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

// What a session of 400 Hz on three axes costs, as a multiple of what libiio's
// own iio_readdev takes to read the same blocks from the same buffer. The
// device is the one that scripts/fake-iio sets up.

namespace {

constexpr int kRounds = 3;
constexpr int kBlock = 8;  // samples, 20 ms

struct Scan {
  std::array<int16_t, 4> values;
  int64_t time;
};

// Writes a block of samples each 20 ms, as a kernel's buffer hands them out.
[[noreturn]] void feed() {
  const int fifo = open("/dev/iio:device0", O_RDWR | O_NONBLOCK);
  timespec next;
  clock_gettime(CLOCK_MONOTONIC, &next);
  for (int64_t number = 0;;) {
    std::array<Scan, kBlock> block = {};
    for (Scan& scan : block) {
      const auto noise = static_cast<int16_t>(number * 7919 % 1000);
      const auto other = static_cast<int16_t>(number * 104729 % 1000);
      scan = {{noise, other, 981, 0}, number++ * 2'500'000};
    }
    // One that is full has lost its reader.
    if (write(fifo, &block, sizeof block) < 0) _exit(1);
    next.tv_nsec += 20'000'000;
    next.tv_sec += next.tv_nsec / 1'000'000'000;
    next.tv_nsec %= 1'000'000'000;
    clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &next, nullptr);
  }
}

// What a shell command took, fed meanwhile.
rusage run(const std::string& command) {
  const pid_t feeder = fork();
  if (feeder == 0) feed();
  const pid_t pid = fork();
  if (pid == 0) {
    const std::string quiet = "exec " + command + " >/dev/null 2>&1";
    _exit(execl("/bin/sh", "sh", "-c", quiet.c_str(), nullptr));
  }
  rusage used = {};
  int status = 0;
  wait4(pid, &status, 0, &used);
  kill(feeder, SIGKILL);
  waitpid(feeder, nullptr, 0);
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
  return FENNICK_PROGRAM " -r400 -n" + std::to_string(samples) + " accel";
}

std::string reader(int samples) {
  return "iio_readdev -b " + std::to_string(kBlock) + " -s " +
         std::to_string(samples) +
         " iio:device0 accel_x accel_y accel_z timestamp";
}

// The least of some rounds: what else the machine does only adds to it. Less
// what it costs to start and to end.
double cost(std::string (*command)(int)) {
  double least = 1e9;
  double start = 1e9;
  for (int round = 0; round < kRounds; ++round) {
    least = std::min(least, seconds(run(command(2000 + kBlock))));
    start = std::min(start, seconds(run(command(kBlock))));
  }
  return least - start;
}

}  // namespace

int main() {
  const double floor = cost(reader);
  const double session = cost(tool);
  std::printf("5 s of 400 Hz on three axes\n");
  std::printf("  processor         %6.2f %% of a core  %5.2f times the floor\n",
              session / 5 * 100, session / floor);
  std::printf("  largest memory    %6ld KiB after 5 s  %ld KiB after 15 s\n",
              run(tool(2000)).ru_maxrss, run(tool(6000)).ru_maxrss);
}
