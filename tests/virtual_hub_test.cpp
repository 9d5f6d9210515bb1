#include "platform/virtual/virtual_hub.h"

#include <algorithm>
#include <cmath>
#include <thread>

#include "tests/support.h"

namespace {

using platform::Hub;
using platform::Ticks;

// A hub that is asked and read by hand. Clients are any addresses.
class VirtualHubTest : public HubTest {
 protected:
  struct Event {
    const void* client;
    uint64_t ticks;
    float rate = 0;  // of a report of the rate
    bool operator==(const Event&) const = default;
  };

  void MakeHub(platform::HubClock* clock, const Floats& rates) {
    auto model = *setup_.model;
    model[0].attributes[SNS_ATTR_RATES] = rates;
    model[2].change_period = 0.1f;
    hub_ = std::make_unique<platform::VirtualHub>(model, clock);
  }

  int Enable(const void* client, uint64_t uid, float rate) {
    sns_client_request_msg request;
    request.mutable_suid()->set_suid_low(uid);
    request.mutable_config()->set_sample_rate(rate);
    size_t done = 0;
    return hub_->Request(client, {request}, &done);
  }

  // What there is to be delivered next.
  std::vector<Event> Next() {
    hub_->Wait();
    std::vector<Event> events;
    while (hub_->Take(&delivery_)) {
      for (const sns_client_event& event : delivery_.message.events()) {
        sns_std_sensor_physical_config_event config;
        if (event.msg_id() == 768) config.ParseFromString(event.payload());
        events.push_back(
            {delivery_.client, event.timestamp(), config.sample_rate()});
      }
    }
    return events;
  }

  // Changes something while the delivery thread sleeps; it has to wake.
  void ChangeAsleep(const Action& change) {
    const long before = hub_->sleep_count();
    std::thread thread([this] { hub_->Wait(); });
    while (hub_->sleep_count() == before) std::this_thread::yield();
    change();
    thread.join();
  }

  const int a_ = 0;
  const int b_ = 0;
  std::unique_ptr<platform::VirtualHub> hub_;
  Hub::Delivery delivery_;
};

// As the tool shows it, by the timestamps of its samples. Rates at which
// nothing can run are none.
TEST_F(VirtualHubTest, DeliversOnAnExactGrid) {
  auto& model = *setup_.model;
  model[0].attributes[SNS_ATTR_RATES] =
      Floats{50, NAN, 12.5f, 0, 40, INFINITY, 1e9f};
  model[0].attributes[SNS_ATTR_FIFO_SIZE] = 3L;
  model[0].resident_rate = 10;
  model[2].change_period = 0.4f;
  model[3].change_period = 0.3f;
  for (auto& sensor : model) sensor.axes.clear();
  const struct {
    Words words;
    Words milliseconds;
    Ticks late;  // by how much the hub wakes up too late
  } kRows[] = {
      {{"-n3", "-r25.1", "accel"}, {"25", "50", "75"}, 0},
      {{"-n2", "-r1000", "accel"}, {"20", "40"}, 0},
      {{"-n4", "-r50", "accel"}, {"80", "100", "120"}, 2525000},
      {{"-n2", "-r50", "-p", "accel"}, {"80", "160"}, 0},
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

// Also at a rate that does not divide the tick rate, and whatever is requested
// at the very tick of a sample.
TEST_F(VirtualHubTest, DeliversASampleOnce) {
  SimulatedClock endless;
  MakeHub(&endless, {30});
  Enable(&a_, 1, 30);
  EXPECT_THAT(Next(), ElementsAre(Event{&a_, 0, 30}));
  for (int i = 1; i <= 3000; ++i) {
    const auto due =
        static_cast<uint64_t>(std::llround(i * (kTicksPerSecond / 30.0)));
    ASSERT_THAT(Next(), ElementsAre(Event{&a_, due}));
    Enable(&a_, 1, 30);
    Enable(&b_, 1, 20);
    ASSERT_THAT(Next(), ElementsAre(Event{&b_, 0, 30}));
    hub_->Forget(&b_);
  }
  hub_->Forget(&a_);
  // The current value, and then one for each change.
  std::vector<uint64_t> times;
  for (int i = 0; i < 20; ++i) {
    Enable(&a_, 3, -1);
    for (const Event& event : Next()) times.push_back(event.ticks);
  }
  EXPECT_TRUE(std::is_sorted(times.begin(), times.end(), std::less_equal<>()));
}

// Every client hears of the rate at which its sensor runs now, and at once.
TEST_F(VirtualHubTest, TellsOfEveryChange) {
  SimulatedClock still(0);
  MakeHub(&still, {50, 10});
  Enable(&a_, 1, 10);
  EXPECT_THAT(Next(), ElementsAre(Event{&a_, 0, 10}));
  ChangeAsleep([&] { Enable(&b_, 1, 11); });
  EXPECT_THAT(Next(), ElementsAre(Event{&a_, 0, 50}, Event{&b_, 0, 50}));
  Enable(&a_, 1, 10);  // the highest request counts
  EXPECT_FALSE(hub_->Take(&delivery_));
  ChangeAsleep([&] { hub_->Forget(&b_); });
  EXPECT_THAT(Next(), ElementsAre(Event{&a_, 0, 10}));
  // Of several changes before a slow reader gets to them the last one counts.
  Enable(&b_, 1, 50);
  hub_->Forget(&b_);
  EXPECT_THAT(Next(), ElementsAre(Event{&a_, 0, 10}));
  // Of the link, all do.
  ChangeAsleep([&] { hub_->SetLink(false); });
  EXPECT_EQ(Enable(&a_, 1, 10), -ENOTCONN);
  sns_suid_event found;
  EXPECT_EQ(hub_->LookUp("", &found), -ENOTCONN);
  hub_->SetLink(true);
  for (const auto kind : {Hub::Delivery::kHubLost, Hub::Delivery::kHubFound}) {
    ASSERT_TRUE(hub_->Take(&delivery_));
    EXPECT_EQ(delivery_.kind, kind);
  }
  EXPECT_FALSE(hub_->Take(&delivery_));
}

// The accuracy of the magnetometer rises from 0 to 3 in two seconds.
TEST_F(VirtualHubTest, RaisesTheAccuracy) {
  SimulatedClock endless;
  setup_ = {.clock = &endless};
  const std::string first[] = {"100000000", "700000000", "1300000000",
                               "1900000000"};
  for (size_t level = 0; level < 4; ++level) {
    EXPECT_THAT(run_tool({"-n1", "-a", std::to_string(level), "mag"}).out,
                HasSubstr("Magnetometer A.\nTS: " + first[level]));
  }
}

}  // namespace
