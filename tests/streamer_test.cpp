#include <fcntl.h>
#include <malloc.h>
#include <unistd.h>

#include <cmath>
#include <limits>
#include <map>
#include <thread>

#include "streamer/sensor_streamer.h"
#include "tests/support.h"

namespace {

using testing::HasSubstr;

// A delivery, built event by event.
struct Delivery {
  explicit Delivery(uint64_t uid) {
    message.mutable_suid()->set_suid_low(uid);
    message.mutable_suid()->set_suid_high(0);
  }
  Delivery& Event(int id, uint64_t ticks, const std::string& payload) {
    sns_client_event* event = message.add_events();
    event->set_msg_id(id);
    event->set_timestamp(ticks);
    event->set_payload(payload);
    return *this;
  }
  Delivery& Sample(uint64_t ticks, const std::vector<float>& data,
                   int status = 0) {
    sns_std_sensor_event event;
    event.mutable_data()->Add(data.begin(), data.end());
    event.set_status(static_cast<sns_std_sensor_sample_status>(status));
    return Event(1025, ticks, event.SerializeAsString());
  }
  sns_client_event_msg message;
};

// A streamer on a hub with a few sensors, which the tests mostly deliver to by
// hand.
class StreamerTest : public HubTest {
 protected:
  StreamerTest() {
    hub_.model = {make_sensor(1, "accel", "imu", 0),
                  make_sensor(2, "gyro", "imu", 0),
                  make_sensor(3, "light", "light", 0, 1),
                  make_sensor(4, "motion", "core", 0, 2)};
    hub_.clock = &clock_;
    Reconnect();
  }

  // Makes a new streamer on the hub as it is set up now.
  void Reconnect() {
    streamer_ = nullptr;
    connection_ = Connect();
    streamer_ = std::make_unique<SensorStreamer>(connection_.get());
    streamer_->SetSampleRate(50);
  }

  std::string Deliver(const Delivery& delivery) {
    const Captured captured =
        capture([&] { streamer_->OnEvent(delivery.message); });
    return captured.out + captured.err;
  }

  // Runs a session in which `deliver` runs while the requests are being sent,
  // on the main thread, and which then ends because sending "fails".
  Captured Session(const std::function<void()>& deliver) {
    hub_.faults = {{"SendRequests", 5, 1}};
    streamer_->SetSampleLimit(0);
    bool delivered = false;
    hub_.observer = [&, deliver](const std::string& call) {
      if (call != "SendRequests" || delivered) return;
      delivered = true;
      deliver();
    };
    Captured captured = capture([&] { EXPECT_EQ(streamer_->Stream(), 5); });
    hub_.observer = nullptr;
    captured.out = mask_times(captured.out);
    return captured;
  }

  platform::SimulatedClock clock_{0};
  std::unique_ptr<vesk::Connection> connection_;
  std::unique_ptr<SensorStreamer> streamer_;
};

// ---- Configuration ---------------------------------------------------------

TEST_F(StreamerTest, ChoosesRates) {
  const std::string kNone =
      "fennick: warning: Unable to retrieve supported rates for accel.s\n";
  using Rates = std::vector<float>;
  const struct {
    platform::AttrValue rates;
    float rate;
    std::string chosen;  // empty: none of the supported ones
    std::string used;
  } kCases[] = {
      {Rates{0, 5, 1, 10}, 0, "1.0", "1.0"},
      {Rates{-3, 2.5f}, -3, "2.5", "2.5"},
      {Rates{5}, NAN, "5.0", "5.0"},
      {Rates{5, 10}, 7, "", "7.0"},
      {Rates{}, 0, "", "1.0"},
      {Rates{0, -1, NAN}, 0, "", "1.0"},
      {true, 0, "", "1.0"},  // unreadable
  };
  vesk::setLogLevel(vesk::kDebug);
  for (const auto& c : kCases) {
    hub_.model[0].attributes[SNS_ATTR_RATES] = c.rates;
    Reconnect();
    streamer_->SetSampleRate(c.rate);
    const Captured added =
        capture([&] { EXPECT_EQ(streamer_->AddSensor("accel"), 0); });
    const std::string choice =
        "fennick: Auto-selected " + c.chosen + " Hz sample rate for accel.s\n";
    EXPECT_EQ(added.err, !c.chosen.empty() ? choice : c.rate > 0 ? "" : kNone);
    EXPECT_EQ(Session([] {}).err, "fennick: accel.s -n0 -r" + c.used + '\n');
  }
}

TEST_F(StreamerTest, CopiesTheSettingsIntoEachSensor) {
  hub_.model[1].attributes[SNS_ATTR_DISPLAY_NAME] = "Gyroscope 100%d";
  hub_.model[2].attributes.erase(SNS_ATTR_NAME);
  Reconnect();
  streamer_->SetPassive();  // holds until a sensor is recorded
  const Captured missing =
      capture([&] { EXPECT_EQ(streamer_->AddSensor("no.x"), -ENOENT); });
  EXPECT_EQ(missing.err, "fennick: error: Unable to find no.x.s\n");
  hub_.faults = {{"LoadAttributes", 7, 2}};  // the one for the name
  EXPECT_EQ(streamer_->AddSensor("accel"), 7);
  hub_.faults = {};
  streamer_->SetSampleRate(20);
  streamer_->SetSampleLimit(4);
  EXPECT_EQ(streamer_->AddSensor("gyro"), 0);
  streamer_->SetSampleRate(30);
  EXPECT_EQ(streamer_->AddSensor("accel"), 0);
  EXPECT_EQ(streamer_->AddSensor("accel.0"), 0);  // the same sensor again
  streamer_->SetStreamType('c');
  streamer_->SetSampleRate(0);
  EXPECT_EQ(streamer_->AddSensor("light"), 0);
  streamer_->SetStreamType('x');
  vesk::setLogLevel(vesk::kDebug);
  const Captured session = Session([] {});
  EXPECT_THAT(session.out,
              HasSubstr("Sampling from sensor type accel.0.s: imu.\n"
                        "Sampling from sensor type gyro.s: Gyroscope 100%d.\n"
                        "Sampling from sensor type light.c: light.\n\nTime:"));
  EXPECT_EQ(session.err,
            "fennick: accel.0.s -n4 -r30.0\nfennick: gyro.s -n4 -r20.0\n"
            "fennick: light.c -n4 -r0.0\n");
}

// Only accel is passive, so that it alone gets nothing.
TEST_F(StreamerTest, AsksPassivelyOnce) {
  platform::SimulatedClock clock(platform::kTicksPerSecond);
  hub_.clock = &clock;
  Reconnect();
  streamer_->SetPassive();
  EXPECT_EQ(streamer_->AddSensor("accel"), 0);
  streamer_->SetSampleLimit(10);
  EXPECT_EQ(streamer_->AddSensor("gyro"), 0);
  const Captured session = capture([&] { EXPECT_EQ(streamer_->Stream(), 0); });
  EXPECT_THAT(session.out, HasSubstr("\naccel.s 0 samples"));
}

// ---- Events ----------------------------------------------------------------

TEST_F(StreamerTest, DecodesEveryMessageId) {
  const auto encode = [](auto payload, auto set) {
    set(&payload);
    return payload.SerializeAsString();
  };
  const auto proximity = [&](int type, int status) {
    return encode(sns_proximity_event(), [&](sns_proximity_event* event) {
      event->set_event_type(static_cast<sns_proximity_event_type>(type));
      event->set_raw_value(4294967295);
      event->set_status(static_cast<sns_std_sensor_sample_status>(status));
      event->add_values(0.25f);
    });
  };
  const auto rate = [&](float hertz) {
    return encode(sns_std_sensor_physical_config_event(),
                  [&](auto* event) { event->set_sample_rate(hertz); });
  };
  const std::string kState =
      encode(sns_activity_event(), [](auto* event) { event->set_state(-7); });
  const std::string kVsync =
      encode(sns_camera_vsync_interrupt_info(), [](auto* event) {
        event->set_value1(16777217);
        event->set_value2(~0ul);
      });
  const std::string kBroken = "\xff";
  const std::string kFailed = "fennick: error: failed to parse received ";
  const std::string kUnexpected = "fennick: Unexpected message id ";
  const struct {
    int id;
    std::string payload;
    std::string out;
  } kCases[] = {
      {768, rate(50), ""},
      {768, rate(0), "fennick: warning: Configured accel.s for 0.0 Hz\n"},
      {768, "", ""},
      {768, kBroken, ""},
      {769, proximity(0, 2), " 5.000000 4294967296.000000 0.250000"},
      {769, proximity(-1, 3), " 0.000000 4294967296.000000 0.250000"},
      {769, proximity(0, 1), ""},
      {769, kBroken, ""},
      {778, kState, " -7.000000"},
      {778, "", " 0.000000"},
      {778, kBroken, kFailed + "activity event\n"},
      {779, kState, " -7.000000"},
      {779, kBroken, kFailed + "inactivity event\n"},
      {1025, "", ""},  // accuracy 0
      {1025, kBroken, ""},
      {1041, kVsync, " 16777216.000000 18446744073709551616.000000 0.000000"},
      {1041, kBroken, ""},
      {770, "", kUnexpected + "770\n"},
      {777, "", kUnexpected + "777\n"},
      {-1, "", kUnexpected + "-1\n"},
  };
  streamer_->SetMinimumAccuracy(SNS_SAMPLE_STATUS_MEDIUM);
  ASSERT_EQ(streamer_->AddSensor("accel"), 0);
  vesk::setLogLevel(vesk::kDebug);
  for (const auto& c : kCases) {
    SCOPED_TRACE(std::to_string(c.id) + testing::PrintToString(c.payload));
    const bool is_sample = c.out.starts_with(' ');
    EXPECT_EQ(Deliver(Delivery(1).Event(c.id, 25, c.payload)),
              is_sample ? "TS: 1000 Data:" + c.out + '\n' : c.out);
  }
  // Accuracies compare as signed numbers, known or not.
  EXPECT_EQ(Deliver(Delivery(1).Sample(25, {1}, -1).Sample(25, {2}, 99)),
            "TS: 1000 Data: 2.000000\n");
  // A rate is of no interest to a sensor that does not stream.
  streamer_->SetStreamType('c');
  ASSERT_EQ(streamer_->AddSensor("light"), 0);
  EXPECT_EQ(Deliver(Delivery(3).Event(768, 0, rate(5))), "");
}

TEST_F(StreamerTest, PrintsTimestampsAndDeltas) {
  streamer_->SetShowTimestampDiffs();
  ASSERT_EQ(streamer_->AddSensor("accel"), 0);
  EXPECT_EQ(Deliver(Delivery(1)
                        .Sample(1, {})
                        .Event(5, 100, "")  // does not count for the delta
                        .Sample(25000001, {-0.0f, 1e30f})
                        .Sample(25000000, {NAN, INFINITY, -INFINITY})
                        .Sample(~0ul, {0.0000005f})),
            "TS: 40 Delta: 0 Data:\n"
            "TS: 1000000040 Delta: 1000000000 Data: -0.000000 "
            "1000000015047466219876688855040.000000\n"
            "TS: 1000000000 Delta: -40 Data: nan inf -inf\n"
            "TS: 9223372036854775807 Delta: 9223372035854775807 "
            "Data: 0.000000\n");
}

TEST_F(StreamerTest, PrefixesLinesOnceThereAreTwoSensors) {
  ASSERT_EQ(streamer_->AddSensor("accel"), 0);
  EXPECT_EQ(Deliver(Delivery(1).Sample(25, {1})), "TS: 1000 Data: 1.000000\n");
  // An event of a sensor that was not asked for, even one without samples.
  EXPECT_EQ(Deliver(Delivery(99)), "");
  EXPECT_EQ(Deliver(Delivery(1).Sample(25, {1})),
            "Sensor: accel.s TS: 1000 Data: 1.000000\n");
  EXPECT_EQ(Deliver(Delivery(99).Sample(25, {1})),
            "Sensor: .s TS: 1000 Data: 1.000000\n");
  Delivery without_uid(0);
  without_uid.message.clear_suid();
  EXPECT_EQ(Deliver(without_uid.Sample(25, {1})),
            "Sensor: .s TS: 1000 Data: 1.000000\n");
}

TEST_F(StreamerTest, DropsTheRestOfAMessageAtTheLimit) {
  const auto three = Delivery(1).Sample(25, {}).Sample(25, {}).Sample(25, {});
  const std::pair<uint32_t, int> kLinesByLimit[] = {
      {1, 1}, {2, 2}, {3, 3}, {4, 3}, {0, 3}, {4294967295, 3}};
  for (const auto& [limit, lines] : kLinesByLimit) {
    streamer_->SetSampleLimit(limit);
    ASSERT_EQ(streamer_->AddSensor("accel"), 0);
    EXPECT_EQ(Deliver(three), repeat("TS: 1000 Data:\n", lines)) << limit;
  }
  // Past the limit every sample reaches it again.
  streamer_->SetSampleLimit(1);
  ASSERT_EQ(streamer_->AddSensor("accel"), 0);
  EXPECT_EQ(Deliver(three) + Deliver(three), repeat("TS: 1000 Data:\n", 2));
}

TEST_F(StreamerTest, TracesItself) {
  const std::string kName =
      " virtual void SensorStreamer::OnEvent(const sns_client_event_msg &)\n";
  vesk::setLogLevel(vesk::kFunction);
  EXPECT_EQ(Deliver(Delivery(1)),
            "fennick: -->" + kName + "fennick: <--" + kName);
}

TEST_F(StreamerTest, KeepsItsMemoryOverTenMillionSamples) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
  GTEST_SKIP() << "the heap is the sanitizer's";
#endif
  Delivery delivery(1);
  for (int i = 0; i < 1000; ++i) delivery.Sample(25, {1, 2, 3});
  const int saved = dup(STDOUT_FILENO);
  const int null = open("/dev/null", O_WRONLY);
  dup2(null, STDOUT_FILENO);
  ASSERT_EQ(streamer_->AddSensor("accel"), 0);
  streamer_->OnEvent(delivery.message);
  const size_t before = mallinfo2().uordblks;
  for (int i = 0; i < 10000; ++i) streamer_->OnEvent(delivery.message);
  const size_t after = mallinfo2().uordblks;
  dup2(saved, STDOUT_FILENO);
  close(saved);
  close(null);
  EXPECT_EQ(before, after);
}

// ---- The session -----------------------------------------------------------

TEST_F(StreamerTest, SumsUpWhatWasPrinted) {
  hub_.model[3].attributes.erase(SNS_ATTR_NAME);
  ASSERT_EQ(streamer_->AddSensor("gyro"), 0);  // gets one sample
  ASSERT_EQ(streamer_->AddSensor("accel"), 0);
  streamer_->SetStreamType('c');
  ASSERT_EQ(streamer_->AddSensor("light"), 0);  // gets two, without a rate
  streamer_->SetStreamType('o');
  ASSERT_EQ(streamer_->AddSensor("motion"), 0);  // gets none
  streamer_->SetMinimumAccuracy(SNS_SAMPLE_STATUS_LOW);
  const Captured session = Session([&] {
    // Of the rows 1 2 4, 10 20 -, three times 0.1 and one with an infinity.
    streamer_->OnEvent(Delivery(1)
                           .Sample(25, {1, 10, 0.1f, INFINITY}, 1)
                           .Sample(26, {100}, 0)
                           .Sample(50, {2, 20, 0.1f}, 2)
                           .Event(1025, 51, "\xff")
                           .Sample(126, {4, 0, 0.1f}, 3)
                           .message);
    streamer_->OnEvent(Delivery(2).Sample(7, {-2.5f}, 1).message);
    streamer_->OnEvent(Delivery(3).Sample(7, {}, 1).Sample(9, {}, 1).message);
  });
  const size_t summary = session.out.find("\nTime:");
  EXPECT_EQ(session.out.substr(summary),
            "\nTime: <n> seconds\n"
            "accel.s 3 samples @ ~<n> Hz, average period = 2020\n"
            "gyro.s 1 samples @ ~<n> Hz\n"
            "light.c 2 samples\n"
            "motion.o 0 samples\n"
            "\nAverage:\n"
            "accel.s  2.333333 10.000000 0.100000 inf\n"
            "gyro.s  -2.500000\n"
            "light.c \n"
            "\nStandard Deviation:\n"
            "accel.s  1.527525 10.000000 0.000000 nan\n"
            "light.c \n");
}

TEST_F(StreamerTest, PrintsTheHeadersWithoutSamples) {
  EXPECT_EQ(capture([&] { EXPECT_EQ(streamer_->Stream(), -ENOENT); }).err,
            "fennick: error: No sensors were found for the given datatypes\n");
  EXPECT_EQ(Calls("Register|Send"), "");
  ASSERT_EQ(streamer_->AddSensor("accel"), 0);
  EXPECT_EQ(Session([] {}).out,
            "Sampling from sensor type accel.s: imu.\n\nTime: <n> seconds\n"
            "accel.s 0 samples @ ~<n> Hz\n\nAverage:\n"
            "\nStandard Deviation:\n");
}

TEST_F(StreamerTest, DisablesAndUnregistersInEveryMode) {
  hub_.faults = {{"SendRequests", 7}};
  const std::string kSend = "RegisterClient SendRequests ";
  for (const bool timed : {false, true}) {
    Reconnect();
    ASSERT_EQ(streamer_->AddSensor("accel"), 0);
    streamer_->SetSampleLimit(3);
    if (timed) streamer_->SetTimeLimit(1000);
    calls_.clear();
    const Captured session =
        capture([&] { EXPECT_EQ(streamer_->Stream(), 7); });
    EXPECT_THAT(session.out, HasSubstr("\nStandard Deviation:\n"));
    EXPECT_EQ(
        Calls("Reg|Send|Unreg"),
        (timed ? "RegisterClient " + kSend + "UnregisterClient " : kSend) +
            "SendRequests UnregisterClient");
  }
}

// A streamer that the tests can wake as the library might, for no reason.
class WakeableStreamer : public SensorStreamer {
 public:
  using SensorStreamer::SensorStreamer;
  void Wake() { cv_.notify_all(); }
};

// The one sample that reaches the limit comes at every moment from the
// registration on, and then no other.
TEST_F(StreamerTest, EndsAtTheLimitWheneverItIsReached) {
  constexpr int kRounds = 10000;
  const sns_client_event_msg sample = Delivery(4).Sample(25, {1}).message;
  streamer_ = nullptr;
  for (int round = 0; round < 2 * kRounds; ++round) {
    WakeableStreamer streamer(connection_.get());
    streamer.SetSampleLimit(1);
    if (round % 2 == 0) streamer.SetTimeLimit(100000);
    streamer.SetStreamType('o');
    ASSERT_EQ(streamer.AddSensor("motion"), 0);
    std::thread other;
    int moment = round / 2 % 5;
    hub_.observer = [&](const std::string& call) {
      if (call == "RegisterClient" && moment == 0) {
        moment = -1;
        streamer.OnEvent(sample);
      }
      // No delivery is running once the client is unregistered.
      if (call == "UnregisterClient" && other.joinable()) other.join();
      if (call != "SendRequests" || moment < 0) return;
      if (moment == 1) streamer.OnEvent(sample);
      if (moment >= 2) {
        const bool wakes = moment >= 3 && round % 2 == 1;
        other = std::thread([&streamer, &sample, wakes, round] {
          for (int i = 0; wakes && i < round % 7; ++i) streamer.Wake();
          for (int i = 0; i < round % 11; ++i) std::this_thread::yield();
          streamer.OnEvent(sample);
        });
      }
      moment = -1;
    };
    const std::string out =
        capture([&] { EXPECT_EQ(streamer.Stream(), 0); }).out;
    ASSERT_THAT(out, HasSubstr("motion.o 1 samples\n")) << round;
  }
}

// The same over the hub's own delivery thread.
TEST_F(StreamerTest, EndsWithTheOnlySampleOfAOneShotSensor) {
  platform::SimulatedClock endless;
  hub_.clock = &endless;
  for (int round = 0; round < 2000; ++round) {
    Reconnect();
    streamer_->SetSampleLimit(1);
    if (round % 2 == 0) streamer_->SetTimeLimit(100000);
    streamer_->SetStreamType('o');
    ASSERT_EQ(streamer_->AddSensor("motion"), 0);
    const Captured session =
        capture([&] { EXPECT_EQ(streamer_->Stream(), 0); });
    ASSERT_THAT(session.out, HasSubstr("motion.o 1 samples\n"));
  }
}

// A streamer that loses the hub at its first event. If it is to recover, it
// finds the hub again and gets the sample that reaches its limit.
class UnluckyStreamer : public SensorStreamer {
 public:
  UnluckyStreamer(vesk::Connection* connection, bool recovers)
      : SensorStreamer(connection), recovers_(recovers) {}
  void OnEvent(const sns_client_event_msg& msg) override {
    SensorStreamer::OnEvent(msg);
    platform::set_link(connection_, false);
  }
  void OnDisconnect() override {
    SensorStreamer::OnDisconnect();
    if (recovers_) platform::set_link(connection_, true);
  }
  void OnReconnect() override {
    SensorStreamer::OnReconnect();
    SensorStreamer::OnEvent(Delivery(1).Sample(25, {1}).message);
  }

 private:
  const bool recovers_;
};

// Loss of the hub ends a timed wait with the library's status; only a limit
// ends the count wait.
TEST_F(StreamerTest, LosesTheHubInTheMiddleOfAWait) {
  for (const bool timed : {true, false}) {
    Reconnect();
    UnluckyStreamer streamer(connection_.get(), !timed);
    streamer.SetSampleLimit(1);
    if (timed) streamer.SetTimeLimit(100000);
    streamer.SetSampleRate(50);
    ASSERT_EQ(streamer.AddSensor("accel"), 0);
    const Captured session =
        capture([&] { EXPECT_EQ(streamer.Stream(), timed ? -ENOTCONN : 0); });
    EXPECT_THAT(session.out, HasSubstr(timed ? "accel.s 0 " : "accel.s 1 "));
  }
}

}  // namespace
