#include <cmath>

#include "tests/support.h"

namespace {

using testing::Pair;

class VirtualHubTest : public HubTest {};

// As the tool shows it, by the timestamps of its samples. Rates at which
// nothing can run are ignored; the accuracy of the gyro rises.
TEST_F(VirtualHubTest, DeliversOnAnExactGrid) {
  auto& model = *setup_.model;
  model[0].attributes[SNS_ATTR_RATES] =
      Floats{50, NAN, 12.5f, 0, 40, INFINITY, 1e9f};
  model[0].attributes[SNS_ATTR_FIFO_SIZE] = 3L;
  model[0].resident_rate = 10;
  model[1].seconds_per_accuracy = 0.025f;
  model[2].change_period = 0.4f;
  model[3].change_period = 0.3f;
  for (auto& sensor : model) sensor.axes.clear();
  const struct {
    Words words;
    Words milliseconds;
    platform::Ticks late;  // by how much the hub wakes up too late
  } kRows[] = {
      {{"-n3", "-r25.1", "accel"}, {"25", "50", "75"}, 0},
      {{"-n2", "-r1000", "accel"}, {"20", "40"}, 0},
      {{"-n4", "-r50", "accel"}, {"80", "100", "120"}, 2525000},
      {{"-n2", "-r50", "-p", "accel"}, {"80", "160"}, 0},
      {{"-n2", "-r50", "-a3", "gyro"}, {"80", "100"}, 0},
      {{"-n3", "-c", "light"}, {"", "400", "800"}, 0},
      {{"-n1", "-o", "motion"}, {"300"}, 0},
  };
  for (const auto& row : kRows) {
    SimulatedClock clock(kTicksPerSecond, row.late);
    setup_.clock = &clock;
    std::string samples = ".\n";
    for (const std::string& time : row.milliseconds) {
      samples += "TS: " + (time.empty() ? "0" : time + "000000") + " Data:\n";
    }
    EXPECT_THAT(run_tool(row.words).out, HasSubstr(samples));
  }
}

// By the sensor's name for people, if it has one.
TEST_F(VirtualHubTest, NamesWhatItRefuses) {
  auto& attributes = (*setup_.model)[1].attributes;
  attributes[SNS_ATTR_DISPLAY_NAME] = "Gyroscope";
  EXPECT_EQ(run_tool({"-rinf", "-n1", "accel"}).err,
            error("accel: rate: Invalid argument"));
  attributes[SNS_ATTR_RATES] = Floats{};
  EXPECT_EQ(run_tool({"-r1", "-n1", "gyro"}).err,
            error("Gyroscope: rate: Invalid argument"));
}

// Two clients of one sensor, at a rate that does not divide the tick rate. A
// sample is delivered once, whatever is requested at its very tick; everybody
// hears of the rate at which the sensor runs now.
TEST_F(VirtualHubTest, SharesASensor) {
  (*setup_.model)[0].attributes[SNS_ATTR_RATES] = Floats{30, 50};
  SimulatedClock endless;
  platform::VirtualHub hub(*setup_.model, &endless);
  const auto enable = [&](const char* client, float rate) {
    sns_client_request_msg request;
    request.mutable_suid()->set_suid_low(1);
    request.mutable_config()->set_sample_rate(rate);
    size_t done = 0;
    EXPECT_EQ(hub.Request(client, {request}, &done), 0);
  };
  // To whom the next events go, each with a sample's ticks or a rate.
  const auto next = [&] {
    std::vector<std::pair<const void*, double>> events;
    platform::Hub::Delivery delivery;
    hub.Wait();
    while (hub.Take(&delivery)) {
      for (const sns_client_event& event : delivery.message.events()) {
        sns_std_sensor_physical_config_event config;
        config.ParseFromString(event.payload());
        const auto ticks = static_cast<double>(event.timestamp());
        events.emplace_back(delivery.client,
                            event.msg_id() == vesk::kPhysicalConfigEvent
                                ? config.sample_rate()
                                : ticks);
      }
    }
    return events;
  };
  const char* const kFirst = "first";
  const char* const kSecond = "second";
  enable(kFirst, 30);
  EXPECT_THAT(next(), ElementsAre(Pair(kFirst, 30)));
  for (int i = 1; i <= 3000; ++i) {
    ASSERT_THAT(next(), ElementsAre(Pair(
                            kFirst, std::round(i * kTicksPerSecond / 30.0))));
    enable(kFirst, 30);
    enable(kSecond, 20);
    ASSERT_THAT(next(), ElementsAre(Pair(kSecond, 30)));
    hub.Forget(kSecond);
  }
  enable(kSecond, 31);
  EXPECT_THAT(next(), ElementsAre(Pair(kFirst, 50), Pair(kSecond, 50)));
  hub.Forget(kSecond);
  EXPECT_THAT(next(), ElementsAre(Pair(kFirst, 30)));
}

}  // namespace
