#include <fcntl.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "bench/ratios.h"
#include "platform/library/output.h"
#include "streamer/sensor_streamer.h"

// The event path: from a delivery of samples of three floats to the line at
// the reader, by the tool and in three other ways.

namespace {

struct Case {
  int samples = 1;  // per delivery
  int sensors = 1;
  bool deltas = false;
  bool pipe = false;  // to a reader that keeps up, else to /dev/null

  std::string Name() const {
    return std::to_string(samples) + "_per_delivery/" +
           std::to_string(sensors) + "_sensors/" +
           (deltas ? "deltas/" : "plain/") + (pipe ? "pipe" : "null");
  }
};

constexpr char kDatatype[] = "accel";

// A way from deliveries to lines.
class Way {
 public:
  explicit Way(const Case& c) : case_(c) {}
  virtual ~Way() = default;
  virtual void Deliver(const sns_client_event_msg& delivery) = 0;

 protected:
  static long Nanoseconds(const sns_client_event& event) {
    return static_cast<long>(static_cast<double>(event.timestamp()) / 25e6 *
                             1e9);
  }

  static void Parse(const sns_client_event& event,
                    sns_std_sensor_event* sample) {
    if (!sample->ParseFromString(event.payload())) std::abort();
  }

  void Write(const char* end) {
    const auto size = static_cast<size_t>(end - text_.data());
    if (write(STDOUT_FILENO, text_.data(), size) < 0) std::abort();
  }

  const Case case_;
  std::array<char, 65536> text_;
  long last_ = 0;
};

class Tool : public Way {
 public:
  explicit Tool(const Case& c) : Way(c) {
    if (vesk::Connection::Create(&connection_) != 0) std::abort();
    streamer_ = std::make_unique<SensorStreamer>(connection_.get());
    if (c.deltas) streamer_->SetShowTimestampDiffs();
  }

  void Deliver(const sns_client_event_msg& delivery) override {
    platform::begin_delivery();
    streamer_->OnEvent(delivery);
    platform::end_delivery();
  }

 private:
  std::unique_ptr<vesk::Connection> connection_;
  std::unique_ptr<SensorStreamer> streamer_;
};

// The floor: a fresh message for each payload, one snprintf for each line and
// one write for each delivery.
class Snprintf : public Way {
 public:
  using Way::Way;

  void Deliver(const sns_client_event_msg& delivery) override {
    char* out = text_.data();
    for (const sns_client_event& event : delivery.events()) {
      sns_std_sensor_event sample;
      Parse(event, &sample);
      out += Print(Nanoseconds(event), sample, out);
    }
    Write(out);
  }

 private:
  int Print(long ns, const sns_std_sensor_event& sample, char* out) {
    const double x = sample.data(0);
    const double y = sample.data(1);
    const double z = sample.data(2);
    const auto room = static_cast<size_t>(text_.data() + text_.size() - out);
    const long delta = ns - last_;
    last_ = ns;
    if (case_.sensors > 1 && case_.deltas) {
      return std::snprintf(out, room,
                           "Sensor: %s.%c TS: %ld Delta: %ld Data: %f %f %f\n",
                           kDatatype, 's', ns, delta, x, y, z);
    }
    if (case_.sensors > 1) {
      return std::snprintf(out, room, "Sensor: %s.%c TS: %ld Data: %f %f %f\n",
                           kDatatype, 's', ns, x, y, z);
    }
    if (case_.deltas) {
      return std::snprintf(out, room, "TS: %ld Delta: %ld Data: %f %f %f\n", ns,
                           delta, x, y, z);
    }
    return std::snprintf(out, room, "TS: %ld Data: %f %f %f\n", ns, x, y, z);
  }
};

// The practical limit: one message for all payloads, nothing but conversions
// and copies for each line and one write for each delivery.
class ToChars : public Way {
 public:
  using Way::Way;

  void Deliver(const sns_client_event_msg& delivery) override {
    char* out = text_.data();
    for (const sns_client_event& event : delivery.events()) {
      Parse(event, &sample_);
      const long ns = Nanoseconds(event);
      if (case_.sensors > 1) {
        out = Put(out, "Sensor: ");
        out = Put(out, kDatatype);
        out = Put(out, ".s ");
      }
      out = PutNumber(Put(out, "TS: "), ns);
      if (case_.deltas) out = PutNumber(Put(out, " Delta: "), ns - last_);
      last_ = ns;
      out = Put(out, " Data:");
      for (const double value : sample_.data()) {
        out = PutNumber(Put(out, " "), value, std::chars_format::fixed, 6);
      }
      out = Put(out, "\n");
    }
    Write(out);
  }

 private:
  static char* Put(char* out, std::string_view text) {
    std::memcpy(out, text.data(), text.size());
    return out + text.size();
  }

  template <typename... Arguments>
  char* PutNumber(char* out, Arguments... arguments) {
    return std::to_chars(out, text_.data() + text_.size(), arguments...).ptr;
  }

  sns_std_sensor_event sample_;
};

// What is usual: a fresh message for each payload, one printf for each field
// and, as standard output does by itself on a terminal, one write for each
// line.
class Printf : public Way {
 public:
  explicit Printf(const Case& c) : Way(c) {
    std::setvbuf(stdout, nullptr, _IOLBF, BUFSIZ);
  }

  void Deliver(const sns_client_event_msg& delivery) override {
    for (const sns_client_event& event : delivery.events()) {
      sns_std_sensor_event sample;
      Parse(event, &sample);
      const long ns = Nanoseconds(event);
      if (case_.sensors > 1) std::printf("Sensor: %s.%c ", kDatatype, 's');
      std::printf("TS: %ld ", ns);
      if (case_.deltas) std::printf("Delta: %ld ", ns - last_);
      last_ = ns;
      std::printf("Data:");
      for (const double value : sample.data()) std::printf(" %f", value);
      std::printf("\n");
    }
  }
};

template <typename T>
std::unique_ptr<Way> make(const Case& c) {
  return std::make_unique<T>(c);
}

constexpr struct {
  const char* name;
  std::unique_ptr<Way> (*make)(const Case& c);
} kWays[] = {{"", make<Tool>},
             {"/floor", make<Snprintf>},
             {"/limit", make<ToChars>},
             {"/stdio", make<Printf>}};

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
      event->set_msg_id(vesk::kSensorEvent);
      event->set_timestamp(time += 250'003);
      event->set_payload(sample.SerializeAsString());
    }
  }
  return deliveries;
}

void run(benchmark::State& state, const Case& c,
         std::unique_ptr<Way> (*make_way)(const Case& c)) {
  const auto deliveries = make_deliveries(c);
  const Sink sink(c.pipe);
  const auto way = make_way(c);
  // These make the sensors known and all buffers large enough.
  for (const auto& delivery : deliveries) way->Deliver(delivery);
  size_t at = 0;
  const long before = allocation_count();
  for (auto _ : state) way->Deliver(deliveries[at++ % deliveries.size()]);
  state.counters["allocations_per_sample"] =
      static_cast<double>(allocation_count() - before) /
      static_cast<double>(state.iterations() * c.samples);
}

// What is counted from outside: `rounds` times all deliveries in the way of
// that name, with nothing around it.
int run_rounds(const std::string& name, int samples, int rounds) {
  const Case c = {.samples = samples};
  const auto deliveries = make_deliveries(c);
  const Sink sink(c.pipe);
  for (const auto& way : kWays) {
    if (name != way.name) continue;
    const auto made = way.make(c);
    for (int round = 0; round < rounds; ++round) {
      for (const auto& delivery : deliveries) made->Deliver(delivery);
    }
    return 0;
  }
  return 1;
}

}  // namespace

// rounds WAY SAMPLES ROUNDS, or options of the benchmark.
int main(int argc, char** argv) {
  signal(SIGPIPE, SIG_IGN);
  if (argc == 5 && std::string_view(argv[1]) == "rounds") {
    return run_rounds(argv[2], std::atoi(argv[3]), std::atoi(argv[4]));
  }
  for (const bool pipe : {false, true}) {
    for (const int samples : {1, 32}) {
      for (const int sensors : {1, 2}) {
        for (const bool deltas : {false, true}) {
          const Case c = {samples, sensors, deltas, pipe};
          for (const auto& way : kWays) {
            benchmark::RegisterBenchmark((c.Name() + way.name).c_str(), run, c,
                                         way.make);
          }
        }
      }
    }
  }
  return run_with_ratios(argc, argv);
}
