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
using platform::kTicksPerSecond;
using platform::Ticks;
using platform::VirtualHub;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr Ticks kMs = kTicksPerSecond / 1000;

// ---- The virtual hub, by hand ----------------------------------------------

// What a hub delivers, as text: "1@100" a sample of client 1 that was due
// after 100 ms, "1:50" a rate of 50 Hz reported to it; messages in brackets.
class HubDriver {
 public:
  explicit HubDriver(platform::HubModel model) : hub_(std::move(model)) {}

  int Enable(int client, uint64_t uid, float rate, Ticks ms,
             bool passive = false) {
    sns_client_request_msg request;
    request.mutable_suid()->set_suid_low(uid);
    request.mutable_config()->set_sample_rate(rate);
    request.mutable_config()->set_passive(passive);
    return hub_.Request(&clients_[client], request.SerializeAsString(),
                        ms * kMs);
  }
  int Disable(int client, uint64_t uid, Ticks ms) {
    sns_client_request_msg request;
    request.mutable_suid()->set_suid_low(uid);
    request.mutable_disable();
    return hub_.Request(&clients_[client], request.SerializeAsString(),
                        ms * kMs);
  }
  // Everything that is due at `ms`.
  std::string At(Ticks ms) {
    std::string text;
    VirtualHub::Delivery delivery;
    while (hub_.TakeDue(ms * kMs, &delivery)) {
      sns_client_event_msg message;
      EXPECT_TRUE(message.ParseFromString(delivery.message));
      const auto client =
          std::to_string(static_cast<const char*>(delivery.client) - clients_);
      text += '[';
      for (const sns_client_event& event : message.events()) {
        sns_std_sensor_physical_config_event config;
        const auto ticks = static_cast<Ticks>(event.timestamp());
        if (event.msg_id() != 768) {
          text += client + '@' + std::to_string(ticks / kMs) + ' ';
        } else if (config.ParseFromString(event.payload())) {
          text += client + ':' +
                  std::to_string(static_cast<int>(config.sample_rate())) + ' ';
        }
      }
      text.back() = ']';
    }
    return text;
  }
  VirtualHub& hub() { return hub_; }
  const void* client(int number) { return &clients_[number]; }

 private:
  VirtualHub hub_;
  char clients_[4] = {};
};

TEST(VirtualHub, RunsOnAnExactGrid) {
  auto sensor = make_sensor(1, "accel", "imu", 0);
  sensor.attributes[SNS_ATTR_RATES] = std::vector<float>{50, 12.5f, 0, 30};
  HubDriver hub({sensor});
  EXPECT_EQ(hub.hub().NextDue(), kNever);
  EXPECT_EQ(hub.Enable(1, 1, 25.1f, 1000), 0);  // 30 Hz is the next above
  EXPECT_EQ(hub.At(1000), "[1:30]");
  EXPECT_EQ(hub.hub().NextDue(), 1000 * kMs + 833333);
  EXPECT_EQ(hub.At(1033), "");
  EXPECT_EQ(hub.At(1034), "[1@1033]");
  EXPECT_EQ(hub.At(1101), "[1@1066 1@1100]");  // late, with exact timestamps
  EXPECT_EQ(hub.Enable(1, 1, 1000, 1110), 0);  // above all: the largest
  EXPECT_EQ(hub.At(1140), "[1:50 1@1130]");
  EXPECT_EQ(hub.Disable(1, 1, 1150), 0);
  EXPECT_EQ(hub.At(9999), "");
}

TEST(VirtualHub, SharesASensorAmongItsClients) {
  auto sensor = make_sensor(1, "accel", "imu", 0);
  sensor.resident_rate = 10;
  HubDriver hub({sensor});
  EXPECT_EQ(hub.Enable(1, 1, 50, 0, true), 0);  // passive: the rate that is
  EXPECT_EQ(hub.At(100), "[1:10 1@100]");
  EXPECT_EQ(hub.Enable(2, 1, 20, 105), 0);
  EXPECT_EQ(hub.At(126), "[1:50 1@125][2:50 2@125]");
  hub.hub().Forget(hub.client(2), 130 * kMs);
  EXPECT_EQ(hub.At(230), "[1:10 1@230]");

  hub.hub() = VirtualHub({make_sensor(1, "accel", "imu", 0)});
  EXPECT_EQ(hub.Enable(1, 1, 50, 0, true), 0);
  EXPECT_EQ(hub.At(1000), "");  // nobody keeps it on
  EXPECT_EQ(hub.Enable(2, 1, 10, 1000), 0);
  EXPECT_EQ(hub.At(1100), "[1:10 1@1100][2:10 2@1100]");
}

TEST(VirtualHub, KeepsWhatTheFifoHolds) {
  auto sensor = make_sensor(1, "accel", "imu", 0);
  sensor.attributes[SNS_ATTR_FIFO_SIZE] = 3L;
  HubDriver hub({sensor});
  EXPECT_EQ(hub.Enable(1, 1, 10, 0), 0);
  EXPECT_EQ(hub.At(550), "[1:10 1@300 1@400 1@500]");
  EXPECT_EQ(hub.At(600), "[1@600]");
}

TEST(VirtualHub, DeliversChangesAndOneShots) {
  auto on_change = make_sensor(1, "light", "light", 0, 1);
  on_change.change_period = 0.4f;
  auto one_shot = make_sensor(2, "motion", "core", 0, 2);
  one_shot.change_period = 0.3f;
  HubDriver hub({on_change, one_shot});
  EXPECT_EQ(hub.Enable(1, 1, -1, 500), 0);
  EXPECT_EQ(hub.Enable(1, 2, -1, 500), 0);
  EXPECT_EQ(hub.At(500), "[1@500]");
  EXPECT_EQ(hub.At(800), "[1@800][1@800]");
  EXPECT_EQ(hub.At(1600), "[1@1200 1@1600]");
  EXPECT_EQ(hub.Disable(1, 1, 1600), 0);
  EXPECT_EQ(hub.hub().NextDue(), kNever);
  EXPECT_EQ(hub.Enable(1, 2, -1, 2000), 0);
  EXPECT_EQ(hub.At(9000), "[1@2300]");
}

TEST(VirtualHub, RejectsWhatItCannotDo) {
  HubDriver hub({make_sensor(1, "accel", "imu", 0)});
  for (const float rate : {0.0f, -1.0f, std::numeric_limits<float>::infinity(),
                           std::numeric_limits<float>::quiet_NaN()}) {
    EXPECT_EQ(hub.Enable(1, 1, rate, 0), -EINVAL);
  }
  EXPECT_EQ(hub.Enable(1, 7, 10, 0), -ENODEV);
  EXPECT_EQ(hub.Disable(1, 7, 0), -ENODEV);
  EXPECT_EQ(hub.hub().Request(hub.client(1), "\xff", 0), -EBADMSG);
  sns_client_request_msg empty;
  empty.mutable_suid()->set_suid_low(1);
  EXPECT_EQ(hub.hub().Request(hub.client(1), empty.SerializeAsString(), 0),
            -EBADMSG);
  std::string encoded;
  EXPECT_EQ(hub.hub().LoadAttributes({7, 0}, &encoded), -ENODEV);
  EXPECT_EQ(hub.At(1000), "");
}

// ---- The default hub -------------------------------------------------------

TEST(DefaultHub, CarriesEveryAttributeAndKindOfEvent) {
  std::set<int> attributes;
  std::set<int> ids;
  std::set<vesk::SensorUid> uids;
  for (const auto& sensor : platform::default_hub()) {
    for (const auto& [id, value] : sensor.attributes) attributes.insert(id);
    ids.insert(sensor.msg_id);
    uids.insert(sensor.uid);
  }
  EXPECT_EQ(attributes.size(), 28u);
  EXPECT_THAT(ids, ElementsAre(769, 778, 779, 1025, 1041));
  EXPECT_EQ(uids.size(), 21u);
}

TEST(DefaultHub, LetsTheMagnetometersAccuracyRise) {
  for (const auto& sensor : platform::default_hub()) {
    if (sensor.datatype != "mag") continue;
    int last = -1;
    for (Ticks ms = 0; ms <= 2000; ms += 50) {
      sns_std_sensor_event event;
      ASSERT_TRUE(event.ParseFromString(
          platform::encode_sample(sensor, (5000 + ms) * kMs, 5000 * kMs)));
      EXPECT_GE(event.status(), last);
      EXPECT_LE(event.status(), last + 1);
      last = event.status();
    }
    EXPECT_EQ(last, 3);
  }
}

// ---- The connection --------------------------------------------------------

class ConnectionTest : public HubTest {
 protected:
  ConnectionTest() { hub_.model = {make_sensor(1, "accel", "imu", 0)}; }
};

// A client that unregisters itself inside a delivery.
class LeavingClient : public vesk::Client {
 public:
  using vesk::Client::Client;
  void OnEvent(const sns_client_event_msg& /*msg*/) override {
    ++deliveries;
    connection_->UnregisterClient(this);
    left = true;
    left.notify_all();
  }
  std::vector<std::string> Requests() {
    return {MakeConfigRequest({1, 0}, 50, false)};
  }
  int deliveries = 0;
  std::atomic<bool> left = false;
};

TEST_F(ConnectionTest, DeliversWhileRegisteredOnly) {
  const auto connection = Connect();
  LeavingClient client(connection.get());
  EXPECT_EQ(client.SendRequests(client.Requests(), nullptr), -EPERM);
  connection->RegisterClient(&client);
  connection->RegisterClient(&client);
  connection->UnregisterClient(&client);
  EXPECT_EQ(client.SendRequests(client.Requests(), nullptr), 0);
  client.left.wait(false);
  // What is still due is not delivered any more.
  LeavingClient later(connection.get());
  connection->RegisterClient(&later);
  EXPECT_EQ(later.SendRequests(later.Requests(), nullptr), 0);
  later.left.wait(false);
  EXPECT_EQ(client.deliveries, 1);
  EXPECT_EQ(later.deliveries, 1);
}

TEST_F(ConnectionTest, GetsNothingThroughWithoutALink) {
  const auto connection = Connect();
  LeavingClient client(connection.get());
  connection->RegisterClient(&client);
  platform::set_link(connection.get(), false);
  std::vector<vesk::SensorUid> suids;
  sns_std_attr_event attrs;
  EXPECT_EQ(vesk::SuidUtil(connection.get()).Lookup("accel", &suids),
            -ENOTCONN);
  EXPECT_EQ(vesk::AttrUtil(connection.get()).LoadAttributes({1, 0}, &attrs),
            -ENOTCONN);
  EXPECT_EQ(client.SendRequests(client.Requests(), nullptr), -ENOTCONN);
  connection->UnregisterClient(&client);
}

// ---- Output and log --------------------------------------------------------

// The text of format_simple, or "null".
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
  std::vector<double> values = {0,         -0.0,    0.5e-6,  1.5e-6,  2.5e-6,
                                0.05,      0.25,    0.35,    1e22,    -1e300,
                                9.9999995, DBL_MIN, DBL_MAX, FLT_MAX, -FLT_MIN};
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
  EXPECT_EQ(simple("%f", std::numeric_limits<double>::infinity()), "null");
  for (const char* format : {"%5d", "%-3d", "%x", "%lu", "%.3d", "%", "%.*d"}) {
    EXPECT_EQ(simple(format, 3, 4), "null") << format;
  }
}

// Output that goes to a pipe which keeps each write apart.
TEST(Output, WritesOncePerDelivery) {
  int ends[2];
  ASSERT_EQ(pipe2(ends, O_DIRECT | O_NONBLOCK), 0);
  const int saved = dup(STDOUT_FILENO);
  dup2(ends[1], STDOUT_FILENO);
  const auto read_one = [&] {
    char text[4096];
    const ssize_t size = read(ends[0], text, sizeof text);
    return std::string(text, size > 0 ? static_cast<size_t>(size) : 0);
  };
  vesk::say("part of ");
  EXPECT_EQ(read_one(), "");
  vesk::say("%s%d\n", "a line ", 1);
  EXPECT_EQ(read_one(), "part of a line 1\n");
  platform::begin_delivery();
  vesk::say("line %d\nline", 2);
  std::thread([] { vesk::say(" %.2f\n", 3.0); }).join();
  EXPECT_EQ(read_one(), "");
  platform::end_delivery();
  EXPECT_EQ(read_one(), "line 2\nline 3.00\n");
  dup2(saved, STDOUT_FILENO);
  close(saved);
  close(ends[0]);
  close(ends[1]);
}

TEST(Output, LosesNothingOfLongTexts) {
  const std::string kLong(200000, 'x');
  const std::string out = capture([&] {
                            platform::begin_delivery();
                            for (int i = 0; i < 3; ++i) {
                              vesk::say("%d", i);
                              vesk::say("<%s>", kLong.c_str());
                            }
                            platform::end_delivery();
                          }).out;
  EXPECT_EQ(out, "0<" + kLong + ">1<" + kLong + ">2<" + kLong + ">");
}

TEST(Log, FiltersAndMarks) {
  const std::string path = testing::TempDir() + "fennick_log_test";
  unlink(path.c_str());
  EXPECT_FALSE(vesk::openLogFile((path + "/no/such").c_str()));
  ASSERT_TRUE(vesk::openLogFile(path.c_str()));
  ASSERT_TRUE(vesk::openLogFile(path.c_str()));  // appends
  const std::string err =
      capture([] {
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
      }).err;
  const std::string kAll =
      "error: 0%\nwarning: 1%\nerror: 0%\nwarning: 1%\ninfo: 2%\nerror: 0%\n"
      "warning: 1%\ninfo: 2%\ndebug: 3%\ntrace: --> f\n";
  std::string on_terminal =
      std::regex_replace(kAll, std::regex("(info|debug|trace): "), "");
  on_terminal =
      std::regex_replace(on_terminal, std::regex("(.+)\n"), "fennick: $1\n");
  EXPECT_EQ(err, on_terminal + "fennick: error: not in the file\n");
  const int file = open(path.c_str(), O_RDONLY);
  char text[4096];
  const ssize_t size = read(file, text, sizeof text);
  close(file);
  unlink(path.c_str());
  const std::regex kStamp(R"(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{6}Z \d+ )");
  EXPECT_EQ(std::regex_replace(std::string(text, static_cast<size_t>(size)),
                               kStamp, ""),
            kAll);
}

}  // namespace
