#include <cmath>
#include <thread>

#include "streamer/sensor_streamer.h"
#include "tests/support.h"

namespace {

// ---- Payloads -------------------------------------------------------------

const std::string kBroken = "\xff";  // no message

std::string standard(const Floats& values, int status = 3) {
  sns_std_sensor_event event;
  event.mutable_data()->Add(values.begin(), values.end());
  event.set_status(static_cast<sns_std_sensor_sample_status>(status));
  return event.SerializeAsString();
}

std::string proximity(int type, uint32_t raw, int status,
                      const Floats& values) {
  sns_proximity_event event;
  event.set_event_type(static_cast<sns_proximity_event_type>(type));
  event.set_raw_value(raw);
  event.set_status(static_cast<sns_std_sensor_sample_status>(status));
  event.mutable_values()->Add(values.begin(), values.end());
  return event.SerializeAsString();
}

template <typename Event>
std::string state(int32_t value) {
  Event event;
  event.set_state(value);
  return event.SerializeAsString();
}

std::string configured(float rate) {
  sns_std_sensor_physical_config_event event;
  event.set_sample_rate(rate);
  return event.SerializeAsString();
}

struct Event {
  uint64_t ticks = 25;  // 1000 ns
  std::string payload = standard({});
  int msg_id = 1025;
};

sns_client_event_msg delivery(uint64_t uid, const std::vector<Event>& events) {
  sns_client_event_msg message;
  message.mutable_suid()->set_suid_low(uid);
  for (const Event& event : events) {
    sns_client_event* added = message.add_events();
    added->set_msg_id(event.msg_id);
    added->set_timestamp(event.ticks);
    added->set_payload(event.payload);
  }
  return message;
}

// A streamer that the tests can wake as the library might, for no reason, and
// that does something after each delivery.
struct OpenStreamer : SensorStreamer {
  using SensorStreamer::SensorStreamer;
  void Wake() { cv_.notify_all(); }
  void OnEvent(const sns_client_event_msg& msg) override {
    SensorStreamer::OnEvent(msg);
    if (then) then();
  }
  Action then;
};

// A streamer, which the tests mostly deliver to by hand.
class StreamerTest : public HubTest {
 protected:
  StreamerTest() {
    Connect();
    vesk::setLogLevel(vesk::kError);
    Renew();
  }

  void Renew() {
    streamer_ = std::make_unique<OpenStreamer>(connection_.get());
  }

  void Add(const std::string& datatype, char endpoint = 's') {
    streamer_->SetStreamType(endpoint);
    EXPECT_EQ(streamer_->AddSensor(datatype), 0);
  }

  // What a delivery prints and logs.
  std::string Deliver(uint64_t uid, const std::vector<Event>& events) {
    const sns_client_event_msg message = delivery(uid, events);
    const auto deliver = [&] { return streamer_->OnEvent(message), 0; };
    const Outcome outcome = capture(deliver);
    return outcome.out + outcome.err;
  }

  std::unique_ptr<OpenStreamer> streamer_;
};

// ---- Events ---------------------------------------------------------------

TEST_F(StreamerTest, DecodesEveryMessageId) {
  const auto data = [](const std::string& values) {
    return "TS: 1000 Data:" + values + '\n';
  };
  sns_camera_vsync_interrupt_info vsync;
  vsync.set_value1(16777217);
  vsync.set_value2(~0ul);
  const struct {
    int msg_id;  // a number, as on the wire
    std::string payload;
    std::string shown;
  } kRows[] = {
      {768, "", ""},
      {768, configured(10), ""},
      {768, configured(0), warning("Configured accel.s for 0.0 Hz")},
      {768, configured(50), warning("Configured accel.s for 50.0 Hz")},
      {768, kBroken, ""},
      {769, proximity(0, ~0u, 2, {0.25f}),
       data(" 5.000000 4294967296.000000 0.250000")},
      {769, proximity(-1, 0, 3, {}), data(" 0.000000 0.000000")},
      {769, proximity(0, 0, 1, {}), ""},
      {769, kBroken, ""},
      {778, state<sns_activity_event>(-7), data(" -7.000000")},
      {778, kBroken, error("failed to parse received activity event")},
      {779, state<sns_inactivity_event>(-7), data(" -7.000000")},
      {779, kBroken, error("failed to parse received inactivity event")},
      {1025, standard({1, -2.5f}, 2), data(" 1.000000 -2.500000")},
      {1025, standard({}, 99), data("")},
      {1025, standard({1}, 1), ""},
      {1025, standard({1}, -1), ""},
      {1025, kBroken, ""},
      {1041, vsync.SerializeAsString(),
       data(" 16777216.000000 18446744073709551616.000000 0.000000")},
      {1041, kBroken, ""},
      {770, "", info("Unexpected message id 770")},
      {777, "", info("Unexpected message id 777")},
      {-1, "", info("Unexpected message id -1")},
  };
  streamer_->SetMinimumAccuracy(SNS_SAMPLE_STATUS_MEDIUM);
  Add("accel");
  vesk::setLogLevel(vesk::kDebug);
  for (const auto& row : kRows) {
    EXPECT_EQ(Deliver(1, {{25, row.payload, row.msg_id}}), row.shown)
        << row.msg_id;
  }
  vesk::setLogLevel(vesk::kInfo);  // at which it is not shown
  EXPECT_EQ(Deliver(1, {{25, "", 770}}), "");
  // A rate is of no interest to a sensor that does not stream.
  Add("light", 'c');
  EXPECT_EQ(Deliver(3, {{25, configured(5), 768}}), "");
}

TEST_F(StreamerTest, PrintsTimestampsAndDeltas) {
  streamer_->SetShowTimestampDiffs();
  Add("accel");
  // An event that is no sample does not count for the delta.
  EXPECT_EQ(Deliver(1, {{0, standard({}, 0)},
                        {3},
                        {9, kBroken},
                        {9, kBroken, 769},
                        {25000001, standard({-0.0f, 1e9f})},
                        {25000000, standard({NAN, INFINITY, -INFINITY})},
                        {~0ul, standard({0.5e-6f})}}),
            "TS: 0 Delta: 0 Data:\n"
            "TS: 120 Delta: 120 Data:\n"
            "TS: 1000000040 Delta: 999999920 Data: -0.000000 "
            "1000000000.000000\n"
            "TS: 1000000000 Delta: -40 Data: nan inf -inf\n"
            "TS: 9223372036854775807 Delta: 9223372035854775807 "
            "Data: 0.000000\n");
}

// Also for events, even without samples, of a sensor that was not asked for.
TEST_F(StreamerTest, PrefixesLinesOnceThereAreTwoSensors) {
  Add("accel", 'x');  // an unknown endpoint is streaming
  EXPECT_EQ(Deliver(1, {{}}), "TS: 1000 Data:\n");
  EXPECT_EQ(Deliver(99, {}), "");
  EXPECT_EQ(Deliver(1, {{}}), "Sensor: accel.s TS: 1000 Data:\n");
  EXPECT_EQ(Deliver(99, {{}}), "Sensor: .s TS: 1000 Data:\n");
}

TEST_F(StreamerTest, DropsTheRestOfAMessageAtTheLimit) {
  // Limits, and how many of three samples are printed.
  const std::pair<uint32_t, int> kLimits[] = {{2, 2}, {3, 3},   {4, 3},
                                              {0, 3}, {~0u, 3}, {1, 1}};
  for (const auto& [limit, samples] : kLimits) {
    streamer_->SetSampleLimit(limit);
    Add("accel");
    EXPECT_EQ(Deliver(1, {{}, {}, {}}), repeat("TS: 1000 Data:\n", samples));
  }
  // Past the limit every sample reaches it again.
  vesk::setLogLevel(vesk::kFunction);
  const std::string name =
      " virtual void SensorStreamer::OnEvent(const sns_client_event_msg &)";
  EXPECT_EQ(Deliver(1, {{}, {}}),
            "TS: 1000 Data:\n" + info("-->" + name) + info("<--" + name));
}

// ---- The session ----------------------------------------------------------

TEST_F(StreamerTest, SumsUpWhatWasPrinted) {
  Add("gyro");
  Add("accel");
  Add("light", 'c');
  Add("motion", 'o');
  streamer_->SetMinimumAccuracy(SNS_SAMPLE_STATUS_LOW);
  Deliver(1, {{0, standard({1, 10, 5})},
              {1, standard({100}, 0)},
              {25, standard({2, 20, 5})},
              {26, kBroken},
              {101, standard({4, 0, 5, INFINITY})}});
  Deliver(2, {{7, standard({-2.5f, -0.0f, -NAN})}});
  // Equal values, whose variance comes out below zero.
  Deliver(3, std::vector<Event>(54, {7, standard({0.1f})}));
  faults_ = {{"SendRequests", 5, 1}};  // the session itself ends at once
  streamer_->SetSampleLimit(0);
  EXPECT_EQ(capture([&] { return streamer_->Stream(); }),
            (Outcome{5,
                     "Sampling from sensor type accel.s: imu.\n"
                     "Sampling from sensor type gyro.s: imu.\n"
                     "Sampling from sensor type light.c: light.\n"
                     "Sampling from sensor type motion.o: core.\n"
                     "\nTime: 0.500000 seconds\n"
                     "accel.s 3 samples @ ~6.0 Hz, average period = 2020\n"
                     "gyro.s 1 samples @ ~2.0 Hz\nlight.c 54 samples\n"
                     "motion.o 0 samples\n"
                     "\nAverage:\naccel.s  2.333333 10.000000 5.000000 inf\n"
                     "gyro.s  -2.500000 -0.000000 nan\nlight.c  0.100000\n"
                     "\nStandard Deviation:\n"
                     "accel.s  1.527525 10.000000 0.000000 nan\n"
                     "light.c  0.000000\n"}));
}

// The one sample that reaches the limit comes at every moment from the
// registration on, and then no other.
TEST_F(StreamerTest, EndsAtTheLimitWheneverItIsReached) {
  constexpr int kRounds = 20000;
  const sns_client_event_msg sample = delivery(4, {{}});
  const Outcome outcome = capture([&] {
    int status = 0;
    for (int round = 0; round < kRounds; ++round) {
      Renew();
      streamer_->SetSampleLimit(1);
      if (round % 2 == 0) streamer_->SetTimeLimit(100000);
      streamer_->SetStreamType('o');
      streamer_->AddSensor("motion");
      const int moment = round / 2 % 5;
      const int wakes = moment >= 3 && round % 2 == 1 ? round % 7 : 0;
      std::thread other;
      bool delivered = false;
      platform::probe().observer = [&](const std::string& call) {
        // No delivery is running once the client is unregistered.
        if (call == "UnregisterClient" && other.joinable()) other.join();
        if (call != (moment == 0 ? "RegisterClient" : "SendRequests")) return;
        if (std::exchange(delivered, true)) return;
        if (moment <= 1) return streamer_->OnEvent(sample);
        other = std::thread([=, this, &sample] {
          for (int i = 0; i < wakes; ++i) streamer_->Wake();
          for (int i = 0; i < round % 11; ++i) std::this_thread::yield();
          streamer_->OnEvent(sample);
        });
      };
      status |= streamer_->Stream();
      platform::probe().observer = nullptr;  // it refers to this round
    }
    return status;
  });
  const std::string each =
      "Sampling from sensor type motion.o: core.\nTS: 1000 Data:\n"
      "\nTime: 0.500000 seconds\nmotion.o 1 samples\n"
      "\nAverage:\nmotion.o \n\nStandard Deviation:\n";
  EXPECT_EQ(outcome.status, 0);
  EXPECT_TRUE(outcome.out == repeat(each, kRounds)) << outcome.out.size();
}

// Loss of the hub ends a timed wait with the library's status; only a limit
// ends the count wait.
TEST_F(StreamerTest, LosesTheHubInTheMiddleOfAWait) {
  auto* const hub =
      static_cast<platform::VirtualHub*>(platform::hub_of(connection_.get()));
  for (const bool timed : {false, true}) {
    Renew();
    streamer_->then = [=] {
      hub->SetLink(false);
      hub->SetLink(!timed);
    };
    streamer_->SetSampleLimit(timed ? ~0u : 2);
    if (timed) streamer_->SetTimeLimit(100000);
    Add("accel");
    const Outcome outcome = capture([&] { return streamer_->Stream(); });
    EXPECT_EQ(outcome.status, timed ? -ENOTCONN : 0);
    EXPECT_THAT(outcome.out,
                HasSubstr(timed ? "accel.s 0 " : "average period = 100000000"));
  }
}

}  // namespace
