#include <fcntl.h>
#include <unistd.h>

#include <bit>
#include <cfloat>
#include <climits>
#include <cmath>
#include <cstdarg>
#include <regex>
#include <thread>

#include "platform/format.h"
#include "platform/output.h"
#include "platform/virtual_hub.h"
#include "tests/support.h"

namespace {

using platform::kNever;
using platform::Ticks;
using platform::VirtualHub;

constexpr Ticks kMs = platform::kTicksPerSecond / 1000;

// ---- The virtual hub, by hand; all times in milliseconds -------------------

class HubDriver {
 public:
  explicit HubDriver(platform::HubModel model) : hub(std::move(model)) {}

  // A rate of 0 disables.
  int Request(int client, uint64_t uid, float rate, Ticks ms,
              bool passive = false) {
    sns_client_request_msg request;
    request.mutable_suid()->set_suid_low(uid);
    request.mutable_disable();
    if (rate != 0) request.mutable_config()->set_sample_rate(rate);
    if (rate != 0) request.mutable_config()->set_passive(passive);
    return hub.Request(&clients[client], request.SerializeAsString(), ms * kMs);
  }

  // What is due, as text: "1@100" a sample of client 1 of the time 100, "1:50"
  // a rate of 50 Hz reported to it, each delivery in brackets.
  std::string At(Ticks ms) {
    std::string text;
    for (VirtualHub::Delivery due; hub.TakeDue(ms * kMs, &due);) {
      sns_client_event_msg message;
      EXPECT_TRUE(message.ParseFromString(due.message));
      text += '[';
      for (const sns_client_event& event : message.events()) {
        sns_std_sensor_physical_config_event config;
        const bool is_config =
            event.msg_id() == 768 && config.ParseFromString(event.payload());
        const long value = is_config
                               ? std::lround(config.sample_rate())
                               : static_cast<long>(event.timestamp()) / kMs;
        text += std::to_string(static_cast<const char*>(due.client) - clients) +
                (is_config ? ':' : '@') + std::to_string(value) + ' ';
      }
      text.back() = ']';
    }
    return text;
  }

  VirtualHub hub;
  char clients[4] = {};
};

TEST(VirtualHub, RunsOnAnExactGrid) {
  auto sensor = make_sensor(1, "accel", "imu", 0);
  sensor.attributes[SNS_ATTR_RATES] = std::vector<float>{50, 12.5f, 0, 30};
  HubDriver hub({sensor});
  EXPECT_EQ(hub.hub.NextDue(), kNever);
  EXPECT_EQ(hub.Request(1, 1, 25.1f, 1000), 0);  // 30 Hz is the next above
  EXPECT_EQ(hub.At(1000), "[1:30]");
  EXPECT_EQ(hub.hub.NextDue(), 1000 * kMs + 833333);
  EXPECT_EQ(hub.At(1101), "[1@1033 1@1066 1@1100]");  // late, but exact
  EXPECT_EQ(hub.Request(1, 1, 1000, 1110), 0);        // above all: the largest
  EXPECT_EQ(hub.At(1140), "[1:50 1@1130]");
  EXPECT_EQ(hub.Request(1, 1, 0, 1150), 0);
  EXPECT_EQ(hub.At(9999), "");
}

TEST(VirtualHub, SharesASensorAmongItsClients) {
  auto sensor = make_sensor(1, "accel", "imu", 0);
  sensor.resident_rate = 10;
  sensor.attributes[SNS_ATTR_FIFO_SIZE] = 3L;
  HubDriver hub({sensor});
  EXPECT_EQ(hub.Request(1, 1, 50, 0, true), 0);  // passive: the rate that is
  EXPECT_EQ(hub.At(100), "[1:10 1@100]");
  EXPECT_EQ(hub.Request(2, 1, 20, 105), 0);
  EXPECT_EQ(hub.At(126), "[1:50 1@125][2:50 2@125]");
  hub.hub.Forget(&hub.clients[2], 130 * kMs);
  EXPECT_EQ(hub.At(240), "[1:10 1@230]");
  EXPECT_EQ(hub.At(1000), "[1@730 1@830 1@930]");  // as the FIFO holds

  sensor.resident_rate = 0;
  HubDriver idle({sensor});
  EXPECT_EQ(idle.Request(1, 1, 50, 0, true), 0);
  EXPECT_EQ(idle.At(1000), "");  // nobody keeps it on
}

TEST(VirtualHub, DeliversChangesAndOneShots) {
  auto on_change = make_sensor(1, "light", "light", 0, 1);
  on_change.change_period = 0.4f;
  auto one_shot = make_sensor(2, "motion", "core", 0, 2);
  one_shot.change_period = 0.3f;
  HubDriver hub({on_change, one_shot});
  EXPECT_EQ(hub.Request(1, 1, -1, 500) + hub.Request(1, 2, -1, 500), 0);
  EXPECT_EQ(hub.At(500), "[1@500]");
  EXPECT_EQ(hub.At(1600), "[1@800 1@1200 1@1600][1@800]");
  EXPECT_EQ(hub.Request(1, 1, 0, 1600), 0);
  EXPECT_EQ(hub.hub.NextDue(), kNever);
}

TEST(VirtualHub, RejectsWhatItCannotDo) {
  HubDriver hub({make_sensor(1, "accel", "imu", 0)});
  for (const float rate : {-1.0f, INFINITY, NAN}) {
    EXPECT_EQ(hub.Request(1, 1, rate, 0), -EINVAL);
  }
  EXPECT_EQ(hub.Request(1, 7, 10, 0), -ENODEV);
  EXPECT_EQ(hub.hub.Request(&hub, "\xff", 0), -EBADMSG);
  EXPECT_EQ(hub.At(1000), "");
}

TEST(DefaultHub, CarriesEveryAttributeAndKindOfEvent) {
  std::set<int> found;
  for (const auto& sensor : platform::default_hub()) {
    for (const auto& [id, value] : sensor.attributes) found.insert(id);
    found.insert(sensor.msg_id);
  }
  EXPECT_EQ(found.size(), 28u + 5);
}

// ---- The connection --------------------------------------------------------

// A client that unregisters itself inside its first delivery.
class LeavingClient : public vesk::Client {
 public:
  using vesk::Client::Client;
  void OnEvent(const sns_client_event_msg& /*msg*/) override {
    ++deliveries;
    connection_->UnregisterClient(this);
    left = true;
    left.notify_all();
  }
  int Enable() {
    return SendRequests({MakeConfigRequest({1, 0}, 50, false)}, nullptr);
  }
  std::atomic<int> deliveries = 0;
  std::atomic<bool> left = false;
};

class ConnectionTest : public HubTest {};

TEST_F(ConnectionTest, DeliversWhileRegisteredOnly) {
  hub_.model = {make_sensor(1, "accel", "imu", 0)};
  const auto connection = Connect();
  LeavingClient client(connection.get());
  LeavingClient later(connection.get());
  EXPECT_EQ(client.Enable(), -EPERM);
  connection->RegisterClient(&client);
  connection->RegisterClient(&client);
  connection->UnregisterClient(&client);
  EXPECT_EQ(client.Enable(), 0);
  client.left.wait(false);
  connection->RegisterClient(&later);
  EXPECT_EQ(later.Enable(), 0);
  later.left.wait(false);
  EXPECT_EQ(client.deliveries, 1);
  connection->RegisterClient(&later);
  platform::set_link(connection.get(), false);
  EXPECT_EQ(later.Enable(), -ENOTCONN);
  connection->UnregisterClient(&later);
}

// ---- Output and log --------------------------------------------------------

std::string simple(const char* format, ...) {
  char text[400];
  va_list args;
  va_start(args, format);
  char* const end =
      platform::format_simple(text, text + sizeof text, format, args);
  va_end(args);
  if (end == nullptr) return "null";
  return {static_cast<char*>(text), end};
}

TEST(Format, PrintsNumbersAsPrintfDoes) {
  std::vector<double> values = {0,      -0.0,    0.5e-6,    1.5e-6,
                                2.5e-6, 0.25,    9.9999995, 1e22,
                                -1e300, DBL_MIN, DBL_MAX,   -FLT_MIN};
  uint32_t bits = 1;
  for (int i = 0; i < 100000; ++i) {
    bits = bits * 1664525 + 1013904223;
    const float value = std::bit_cast<float>(bits);
    if (std::isfinite(value)) values.push_back(value);
  }
  for (const char* format : {" %f", "%.1f", "%lf;", "%.0f"}) {
    for (const double value : values) {
      char text[400];
      std::snprintf(text, sizeof text, format, value);
      ASSERT_EQ(simple(format, value), text) << format;
    }
  }
}

TEST(Format, LeavesTheRestToPrintf) {
  EXPECT_EQ(simple("%s.%c %u%% %d %ld", "a", 's', ~0u, -1, LONG_MIN),
            "a.s 4294967295% -1 -9223372036854775808");
  EXPECT_EQ(simple("%s", std::string(401, 'x').c_str()), "null");
  EXPECT_EQ(simple("%f", HUGE_VAL), "null");
  for (const char* format : {"%5d", "%-3d", "%x", "%lu", "%.3d", "%", "%.*d"}) {
    EXPECT_EQ(simple(format, 3, 4), "null") << format;
  }
}

// Standard output is a pipe that keeps each write apart.
TEST(Output, WritesOncePerDelivery) {
  int ends[2];
  ASSERT_EQ(pipe2(ends, O_DIRECT | O_NONBLOCK), 0);
  const int saved = dup(STDOUT_FILENO);
  dup2(ends[1], STDOUT_FILENO);
  std::string writes;
  const auto note_writes = [&] {
    char text[4096];
    ssize_t size = 0;
    while ((size = read(ends[0], text, sizeof text)) > 0) {
      writes += '[' + std::string(text, static_cast<size_t>(size)) + ']';
    }
    writes += '.';
  };
  vesk::say("part of ");
  note_writes();
  vesk::say("%s%d\n", "a line ", 1);
  note_writes();
  platform::begin_delivery();
  vesk::say("line %d\nline", 2);
  std::thread([] { vesk::say(" %.2f\n", 3.0); }).join();
  note_writes();
  platform::end_delivery();
  note_writes();
  dup2(saved, STDOUT_FILENO);
  for (const int fd : {saved, ends[0], ends[1]}) close(fd);
  EXPECT_EQ(writes, ".[part of a line 1\n]..[line 2\nline 3.00\n].");
}

TEST(Output, LosesNothingOfLongTexts) {
  const std::string kLong(200000, 'x');
  const Captured captured = capture([&] {
    platform::begin_delivery();
    for (int i = 0; i < 3; ++i) vesk::say("%d<%s>", i, kLong.c_str());
    platform::end_delivery();
  });
  EXPECT_EQ(captured.out, "0<" + kLong + ">1<" + kLong + ">2<" + kLong + ">");
}

TEST(Log, FiltersAndMarks) {
  const std::string path = testing::TempDir() + "fennick_log_test";
  unlink(path.c_str());
  EXPECT_FALSE(vesk::openLogFile((path + "/no/such").c_str()));
  ASSERT_TRUE(vesk::openLogFile(path.c_str()));
  const Captured captured = capture([] {
    for (const int verbosity : {1, 2, 4}) {
      vesk::setLogLevel(vesk::log_level(verbosity));
      for (const int level : {0, 1, 2, 3}) {
        vesk::log(vesk::log_level(level), "%d%%", level);
      }
      vesk::logFunc("f", "-->");
    }
    vesk::closeLogFile();
    vesk::log(vesk::kError, "not in the file");
    vesk::setLogLevel(vesk::kInfo);
  });
  std::string lines =
      "error: 0%\nwarning: 1%\nerror: 0%\nwarning: 1%\ninfo: 2%\nerror: 0%\n"
      "warning: 1%\ninfo: 2%\ndebug: 3%\ntrace: --> f\n";
  char text[4096];
  const int file = open(path.c_str(), O_RDONLY);
  const ssize_t size = read(file, text, sizeof text);
  close(file);
  const std::regex kStamp(R"(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{6}Z \d+ )");
  EXPECT_EQ(std::regex_replace(std::string(text, static_cast<size_t>(size)),
                               kStamp, ""),
            lines);
  lines = std::regex_replace(lines, std::regex("(info|debug|trace): "), "");
  lines = std::regex_replace(lines, std::regex("(.+)\n"), "fennick: $1\n");
  EXPECT_EQ(captured.err, lines + "fennick: error: not in the file\n");
}

}  // namespace
