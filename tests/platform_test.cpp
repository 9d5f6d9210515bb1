#include <unistd.h>

#include <bit>
#include <cfloat>
#include <climits>
#include <cmath>
#include <fstream>

#include "platform/virtual_hub.h"
#include "tests/support.h"

namespace {

class PlatformTest : public HubTest {};

// ---- The virtual hub -------------------------------------------------------

// As the tool shows it, by the timestamps of its samples. The rate is the one
// at which the sensor is reported to run.
TEST_F(PlatformTest, DeliversOnAnExactGrid) {
  hub_.model =
      make_sensors("1,accel,imu,0 2,light,light,0,1 3,motion,core,0,2");
  (*hub_.model)[0].attributes[SNS_ATTR_RATES] =
      std::vector<float>{50, 12.5f, 0, 30};
  (*hub_.model)[0].resident_rate = 10;
  (*hub_.model)[1].change_period = 0.4f;
  (*hub_.model)[2].change_period = 0.3f;
  for (auto& sensor : *hub_.model) sensor.axes.clear();
  platform::SimulatedClock clock(platform::kTicksPerSecond);
  hub_.clock = &clock;
  hub_.observer = nullptr;  // which would keep the warnings back
  for (const auto& [command_line, times, rate] : table<3>(R"(
-n3 -r25.1 accel  | 33333320 66666680 100000000 | 30.0
-n2 -r1000 accel  | 20000000 40000000           | 50.0
-n2 -r50 -p accel | 80000000 160000000          | 12.5
-n3 -c light      | 0 400000000 800000000       |
-n1 -o motion     | 300000000                   |
)")) {
    std::string samples = ".\n";
    for (const std::string& time : split(times)) {
      samples += "TS: " + time + " Data:\n";
    }
    expect_run(command_line, 0, HasSubstr(samples),
               HasSubstr(rate.empty() ? "" : "for " + rate + " Hz"));
  }
}

// By hand, since the second client joins later and deliveries are late.
TEST_F(PlatformTest, SharesASensorAmongItsClients) {
  constexpr platform::Ticks kMs = platform::kTicksPerSecond / 1000;
  auto model = make_sensors("1,accel,imu,0");
  model[0].resident_rate = 10;
  model[0].attributes[SNS_ATTR_FIFO_SIZE] = 3L;
  platform::VirtualHub hub(model);
  const auto connection = Connect();
  vesk::AttrUtil encoder(connection.get());
  const char clients[3] = {};  // only their addresses count
  const auto enable = [&](int client, float rate, bool passive, long ms) {
    const std::string request =
        encoder.MakeConfigRequest({1, 0}, rate, passive);
    return hub.Request(&clients[client], request, ms * kMs);
  };
  // The samples that are due, each as its client and its time.
  const auto due = [&](long ms) {
    std::string text;
    for (platform::VirtualHub::Delivery next;
         hub.TakeDue(ms * kMs, ms * kMs, &next);) {
      sns_client_event_msg message;
      EXPECT_TRUE(message.ParseFromString(next.message));
      for (const sns_client_event& event : message.events()) {
        if (event.msg_id() == 768) continue;  // a change of rate
        const auto client = static_cast<const char*>(next.client) - clients;
        const auto time = static_cast<long>(event.timestamp()) / kMs;
        text += std::to_string(client) + '@' + std::to_string(time) + ' ';
      }
    }
    return text;
  };
  EXPECT_EQ(enable(1, 50, true, 0), 0);  // passive: at the rate that is
  EXPECT_EQ(due(100), "1@100 ");
  EXPECT_EQ(enable(2, 20, false, 105), 0);
  EXPECT_EQ(due(126), "1@125 2@125 ");
  hub.Forget(&clients[2], 130 * kMs);
  EXPECT_EQ(due(240), "1@230 ");
  EXPECT_EQ(due(1000), "1@730 1@830 1@930 ");  // as the FIFO holds
  for (const float rate : {-1.0f, INFINITY, NAN}) {
    EXPECT_EQ(enable(2, rate, false, 1000), -EINVAL);
  }
  EXPECT_EQ(hub.Request(&clients[2], "\xff", 0), -EBADMSG);
  EXPECT_EQ(due(1100), "1@1030 ");
}

// ---- The connection --------------------------------------------------------

// A client that unregisters itself inside its first delivery.
class LeavingClient : public vesk::Client {
 public:
  using vesk::Client::Client;
  void OnEvent(const sns_client_event_msg& /*msg*/) override {
    connection_->UnregisterClient(this);
    ++deliveries;
    deliveries.notify_all();
  }
  int Enable(int registrations) {
    while (registrations-- > 0) connection_->RegisterClient(this);
    return SendRequests({MakeConfigRequest({1, 0}, 50, false)}, nullptr);
  }
  std::atomic<int> deliveries = 0;
};

TEST_F(PlatformTest, DeliversWhileRegisteredOnly) {
  hub_.model = make_sensors("1,accel,imu,0");
  const auto connection = Connect();
  LeavingClient client(connection.get());
  LeavingClient later(connection.get());
  EXPECT_EQ(client.Enable(0), -EPERM);
  EXPECT_EQ(client.Enable(2), 0);
  while (client.deliveries < 2) client.deliveries.wait(client.deliveries);
  EXPECT_EQ(later.Enable(1), 0);
  later.deliveries.wait(0);
  EXPECT_EQ(client.deliveries, 2);  // as often as it was registered
  platform::set_link(connection.get(), false);
  EXPECT_EQ(later.Enable(0), -ENOTCONN);
}

// ---- Output and log --------------------------------------------------------

// What say prints, whichever of its formatters does it.
TEST(Output, FormatsAsPrintfDoes) {
  std::vector<double> values = {0,    -0.0, 0.5e-6, 1.5e-6,  2.5e-6,  0.25,
                                1e22, NAN,  -1e300, DBL_MIN, DBL_MAX, HUGE_VAL};
  for (uint32_t i = 1, bits = 1; i < 100000; ++i) {
    bits = bits * 1664525 + 1013904223;
    values.push_back(std::bit_cast<float>(bits));
  }
  std::string expected;
  const auto print = [&expected](const char* format, auto... arguments) {
    char text[400];
    std::snprintf(text, sizeof text, format, arguments...);
    expected += text;
    vesk::say(format, arguments...);
  };
  const Outcome outcome = capture([&] {
    for (const char* format : {" %f", "%.1f", "%lf;", "%.0f\n", "%9.2f"}) {
      for (const double value : values) print(format, value);
    }
    for (const char* format : {"%5d", "%-3d", "%x", "%u%%", "%.3d", "%.*d"}) {
      print(format, -3, 4);
    }
    print("%s.%c %ld %lu\n", "", 's', LONG_MIN, ~0ul);
    return 0;
  });
  EXPECT_EQ(outcome.out, expected);
}

TEST(Log, FiltersAndMarks) {
  const std::string path = testing::TempDir() + "fennick_log_test";
  unlink(path.c_str());
  EXPECT_FALSE(vesk::openLogFile((path + "/no/such").c_str()));
  ASSERT_TRUE(vesk::openLogFile(path.c_str()));
  const Outcome outcome = capture([] {
    for (const int level : {0, 1, 2, 3, 4}) {
      vesk::setLogLevel(vesk::log_level(level));
      vesk::log(vesk::log_level(4 - level), "%d%%", 4 - level);
      vesk::logFunc("f", "-->");
    }
    vesk::closeLogFile();
    vesk::log(vesk::kError, "not in the file");
    return 0;
  });
  EXPECT_EQ(outcome.err,
            logged("2%;warning: 1%;error: 0%;--> f;error: not in the file"));
  std::ifstream file(path);
  EXPECT_THAT(std::string(std::istreambuf_iterator<char>(file), {}),
              testing::ContainsRegex(
                  "^[-0-9]{10}T[0-9]{2}:[0-9]{2}:[0-9]{2}\\.[0-9]{6}Z [0-9]+ "
                  "info: 2%\n.+Z [0-9]+ warning: 1%\n.+Z [0-9]+ error: 0%\n"
                  ".+Z [0-9]+ trace: --> f\n$"));
}

}  // namespace
