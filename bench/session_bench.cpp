#include <fcntl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>
#include <utils/SystemClock.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "hub/vesk.h"
#include "platform/library/probe.h"
#include "platform/virtual/virtual_hub.h"
#include "streamer/sensor_streamer.h"

// Whole sessions in real time: what they cost while little happens, and how
// late a sample's line is at the reader. The floor is a thread that sleeps
// until the same times and writes finished lines.

namespace {

constexpr int kSeconds = 5;
constexpr int kRounds = 3;

double cpu_seconds() {
  rusage used;
  getrusage(RUSAGE_SELF, &used);
  const auto seconds = [](const timeval& time) {
    return static_cast<double>(time.tv_sec) +
           static_cast<double>(time.tv_usec) * 1e-6;
  };
  return seconds(used.ru_utime) + seconds(used.ru_stime);
}

// Standard output as a pipe, read by another process, while `work` runs.
// Returns for each line the time from its timestamp to its reading, in
// microseconds.
std::vector<double> read_latencies(const std::function<void()>& work) {
  std::array<int, 2> lines;
  std::array<int, 2> results;
  if (pipe(lines.data()) != 0 || pipe(results.data()) != 0) std::abort();
  const pid_t reader = fork();
  if (reader == 0) {
    close(lines[1]);
    std::array<char, 65536> text;
    for (ssize_t size = 0;
         (size = read(lines[0], text.data(), text.size() - 1)) > 0;) {
      const int64_t now = android::elapsedRealtimeNano();
      text[static_cast<size_t>(size)] = '\0';
      for (const char* at = text.data();
           (at = std::strstr(at, "TS: ")) != nullptr; ++at) {
        const long due = std::strtol(at + 4, nullptr, 10);
        const double latency = static_cast<double>(now - due) * 1e-3;
        if (write(results[1], &latency, sizeof latency) < 0) _exit(1);
      }
    }
    _exit(0);
  }
  const int saved = dup(STDOUT_FILENO);
  dup2(lines[1], STDOUT_FILENO);
  close(lines[1]);
  close(lines[0]);
  close(results[1]);
  fcntl(results[0], F_SETPIPE_SZ, 1 << 20);  // holds all of them
  work();
  dup2(saved, STDOUT_FILENO);
  close(saved);
  std::vector<double> latencies;
  for (double latency = 0;
       read(results[0], &latency, sizeof latency) == sizeof latency;) {
    latencies.push_back(latency);
  }
  close(results[0]);
  waitpid(reader, nullptr, 0);
  return latencies;
}

struct Cost {
  double cpu_percent = 1e9;
  size_t samples = 0;
  double median = 0;  // of the latencies
  double p99 = 0;
};

// Keeps the cheaper of `*best` and another round: what else the machine does
// only adds to the cost.
void measure(const std::function<void()>& work, Cost* best) {
  const double before = cpu_seconds();
  std::vector<double> latencies = read_latencies(work);
  const double cpu_percent = (cpu_seconds() - before) / kSeconds * 100;
  if (latencies.empty()) std::abort();
  if (cpu_percent >= best->cpu_percent) return;
  std::sort(latencies.begin(), latencies.end());
  *best = {cpu_percent, latencies.size(), latencies[latencies.size() / 2],
           latencies[latencies.size() * 99 / 100]};
}

// A line for each sensor, at the rate that a session has.
void run_floor(int rate, int sensors) {
  const int64_t period = 1'000'000'000 / rate;
  int64_t due = android::elapsedRealtimeNano() + period;
  for (int i = 0; i < rate * kSeconds; ++i, due += period) {
    timespec until = {due / 1'000'000'000, due % 1'000'000'000};
    clock_nanosleep(CLOCK_BOOTTIME, TIMER_ABSTIME, &until, nullptr);
    std::array<char, 512> lines;
    size_t size = 0;
    for (int sensor = 0; sensor < sensors; ++sensor) {
      size += static_cast<size_t>(
          std::snprintf(lines.data() + size, lines.size() - size,
                        "Sensor: accel.s TS: %ld Data: 0.1 0.2 9.8\n", due));
    }
    if (write(STDOUT_FILENO, lines.data(), size) < 0) std::abort();
  }
}

// Returns how often the delivery thread slept.
long run_session(int rate, const std::vector<std::string>& datatypes) {
  std::unique_ptr<vesk::Connection> connection;
  if (vesk::Connection::Create(&connection) != 0) std::abort();
  SensorStreamer streamer(connection.get());
  streamer.SetSampleRate(static_cast<float>(rate));
  streamer.SetTimeLimit(kSeconds);
  for (const std::string& datatype : datatypes) streamer.AddSensor(datatype);
  if (streamer.Stream() != 0) std::abort();
  return static_cast<platform::VirtualHub*>(platform::hub_of(connection.get()))
      ->sleep_count();
}

void compare(int rate, const std::vector<std::string>& datatypes) {
  const int sensors = static_cast<int>(datatypes.size());
  Cost floor;
  Cost tool;
  long sleeps = 0;
  for (int round = 0; round < kRounds; ++round) {
    measure([&] { run_floor(rate, sensors); }, &floor);
    measure([&] { sleeps = run_session(rate, datatypes); }, &tool);
  }
  std::printf(
      "%d Hz, %d sensor(s)\n"
      "  processor         %6.2f %% of a core  %5.2f times the floor\n"
      "  latency, median   %6.0f us           %5.2f times the floor\n"
      "  latency, 99 %%     %6.0f us           %5.2f times the floor\n"
      "  sleeps            %6ld for %zu samples\n",
      rate, sensors, tool.cpu_percent, tool.cpu_percent / floor.cpu_percent,
      tool.median, tool.median / floor.median, tool.p99, tool.p99 / floor.p99,
      sleeps, tool.samples);
}

}  // namespace

int main() {
  vesk::setLogLevel(vesk::kWarning);
  compare(200, {"accel", "gyro", "accel.1"});
  compare(100, {"accel"});
  compare(400, {"accel"});
}
