#include <fcntl.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include "bench/ratios.h"
#include "platform/library/output.h"
#include "platform/library/stand_in.h"
#include "streamer/sensor_streamer.h"

// The event path: from a delivery of samples of three floats to the line at
// the reader. The floor parses each payload, formats each line with a single
// snprintf and writes each delivery with a single write.

namespace {

struct Case {
  int samples;  // per delivery
  int sensors;
  bool deltas;
  bool pipe;  // to a reader that keeps up, else to /dev/null

  std::string Name() const {
    return std::to_string(samples) + "_per_delivery/" +
           std::to_string(sensors) + "_sensors/" +
           (deltas ? "deltas/" : "plain/") + (pipe ? "pipe" : "null");
  }
};

// Standard output, led elsewhere while this exists.
class Sink {
 public:
  explicit Sink(bool to_pipe) : saved_(dup(STDOUT_FILENO)) {
    std::array<int, 2> ends = {-1, open("/dev/null", O_WRONLY)};
    if (to_pipe) {
      if (pipe(ends.data()) != 0) std::abort();
      fcntl(ends[1], F_SETPIPE_SZ, 1 << 20);
      reader_ = fork();
      if (reader_ == 0) {
        close(ends[1]);
        close(saved_);
        close(STDOUT_FILENO);
        std::vector<char> chunk(1 << 20);
        while (read(ends[0], chunk.data(), chunk.size()) > 0) {
        }
        _exit(0);
      }
      close(ends[0]);
    }
    dup2(ends[1], STDOUT_FILENO);
    close(ends[1]);
  }
  ~Sink() {
    dup2(saved_, STDOUT_FILENO);
    close(saved_);
    if (reader_ > 0) waitpid(reader_, nullptr, 0);
  }

 private:
  int saved_;
  pid_t reader_ = -1;
};

// Deliveries whose values differ, so that no formatting is favoured.
std::vector<sns_client_event_msg> make_deliveries(const Case& c) {
  std::vector<sns_client_event_msg> deliveries(64);
  uint64_t time = 1'000'000'000'000;
  for (size_t d = 0; d < deliveries.size(); ++d) {
    deliveries[d].mutable_suid()->set_suid_low(1 + d % size_t(c.sensors));
    for (int i = 0; i < c.samples; ++i) {
      sns_std_sensor_event sample;
      for (const float base : {0.12f, -0.31f, 9.79f}) {
        sample.add_data(base + static_cast<float>(time % 9973) * 1e-5f);
      }
      sample.set_status(SNS_SAMPLE_STATUS_HIGH);
      sns_client_event* event = deliveries[d].add_events();
      event->set_msg_id(1025);
      event->set_timestamp(time += 250'003);
      event->set_payload(sample.SerializeAsString());
    }
  }
  return deliveries;
}

void run_floor(benchmark::State& state, const Case& c) {
  const auto deliveries = make_deliveries(c);
  const Sink sink(c.pipe);
  std::array<char, 65536> text;
  long last = 0;
  size_t at = 0;
  for (auto _ : state) {
    const sns_client_event_msg& delivery = deliveries[at++ % deliveries.size()];
    size_t used = 0;
    for (const sns_client_event& event : delivery.events()) {
      sns_std_sensor_event sample;
      if (!sample.ParseFromString(event.payload())) std::abort();
      const auto ns = static_cast<long>(static_cast<double>(event.timestamp()) /
                                        25e6 * 1e9);
      const auto value = [&](int i) { return double{sample.data(i)}; };
      char* out = text.data() + used;
      const size_t room = text.size() - used;
      int size = 0;
      if (c.sensors > 1 && c.deltas) {
        size = std::snprintf(
            out, room, "Sensor: %s.%c TS: %ld Delta: %ld Data: %f %f %f\n",
            "accel", 's', ns, ns - last, value(0), value(1), value(2));
      } else if (c.sensors > 1) {
        size =
            std::snprintf(out, room, "Sensor: %s.%c TS: %ld Data: %f %f %f\n",
                          "accel", 's', ns, value(0), value(1), value(2));
      } else if (c.deltas) {
        size = std::snprintf(out, room, "TS: %ld Delta: %ld Data: %f %f %f\n",
                             ns, ns - last, value(0), value(1), value(2));
      } else {
        size = std::snprintf(out, room, "TS: %ld Data: %f %f %f\n", ns,
                             value(0), value(1), value(2));
      }
      used += static_cast<size_t>(size);
      last = ns;
    }
    if (write(STDOUT_FILENO, text.data(), used) < 0) std::abort();
  }
}

void run_tool(benchmark::State& state, const Case& c) {
  platform::stand_in().model = platform::default_hub();
  std::unique_ptr<vesk::Connection> connection;
  if (vesk::Connection::Create(&connection) != 0) std::abort();
  SensorStreamer streamer(connection.get());
  streamer.SetSampleRate(100);
  if (c.deltas) streamer.SetShowTimestampDiffs();
  auto deliveries = make_deliveries(c);
  const Sink sink(c.pipe);
  // The first deliveries make the sensors known and all buffers large enough.
  const auto deliver = [&](const sns_client_event_msg& delivery) {
    platform::begin_delivery();
    streamer.OnEvent(delivery);
    platform::end_delivery();
  };
  for (const auto& delivery : deliveries) deliver(delivery);
  size_t at = 0;
  const long before = allocation_count();
  for (auto _ : state) deliver(deliveries[at++ % deliveries.size()]);
  state.counters["allocations_per_sample"] =
      static_cast<double>(allocation_count() - before) /
      static_cast<double>(state.iterations() * c.samples);
}

}  // namespace

int main(int argc, char** argv) {
  signal(SIGPIPE, SIG_IGN);
  for (const bool pipe : {false, true}) {
    for (const int samples : {1, 32}) {
      for (const int sensors : {1, 2}) {
        for (const bool deltas : {false, true}) {
          const Case c = {samples, sensors, deltas, pipe};
          benchmark::RegisterBenchmark((c.Name() + "/floor").c_str(), run_floor,
                                       c);
          benchmark::RegisterBenchmark(c.Name().c_str(), run_tool, c);
        }
      }
    }
  }
  return run_with_ratios(argc, argv);
}
