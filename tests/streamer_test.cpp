#include <fcntl.h>
#include <malloc.h>
#include <unistd.h>

#include <cmath>
#include <thread>

#include "streamer/sensor_streamer.h"
#include "tests/support.h"

namespace {

// The payload with these fields, NUMBER=VALUE: a float, which has a period or
// an n, or a whole number. "broken" is none.
std::string encode(const Words& fields) {
  std::string bytes;
  for (const std::string& field : fields) {
    if (field == "broken") return "\xff";
    const std::string value = field.substr(2);
    const bool is_float = value.find_first_of(".n") != std::string::npos;
    bytes += static_cast<char>((field[0] - '0') << 3 | (is_float ? 5 : 0));
    if (is_float) {
      const float number = std::stof(value);
      bytes.append(reinterpret_cast<const char*>(&number), sizeof number);
      continue;
    }
    auto rest = static_cast<uint64_t>(std::stoll(value));
    for (; rest > 127; rest >>= 7) bytes += static_cast<char>(rest | 128);
    bytes += static_cast<char>(rest);
  }
  return bytes;
}

// A delivery of these events, by semicolons: message id, ticks, fields.
sns_client_event_msg delivery(uint64_t uid, const std::string& events) {
  sns_client_event_msg message;
  message.mutable_suid()->set_suid_low(uid);
  for (const std::string& text : split(events, ';')) {
    const Words words = split(text);
    sns_client_event* event = message.add_events();
    event->set_msg_id(std::stoi(words[0]));
    event->set_timestamp(std::stoull(words[1]));
    event->set_payload(encode({words.begin() + 2, words.end()}));
  }
  return message;
}

// A streamer on a hub with a few sensors, which the tests mostly deliver to by
// hand.
class StreamerTest : public HubTest {
 protected:
  StreamerTest() {
    hub_.model = make_sensors(
        "1,accel,imu,0 2,gyro,imu,0 3,light,light,0,1 4,motion,core,0,2");
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

  void Add(const std::string& datatype, char endpoint = 's') {
    streamer_->SetStreamType(endpoint);
    EXPECT_EQ(streamer_->AddSensor(datatype), 0);
  }

  // What a delivery prints.
  std::string Deliver(uint64_t uid, const std::string& events) {
    const auto message = delivery(uid, events);
    const Outcome outcome =
        capture([&] { return streamer_->OnEvent(message), 0; });
    return outcome.out + outcome.err;
  }

  Outcome Stream() {
    return capture([&] { return streamer_->Stream(); });
  }

  // Runs a session that gets the deliveries while the requests are being sent,
  // and which then ends because sending "fails", with status 5.
  Outcome Session(const std::vector<sns_client_event_msg>& deliveries = {}) {
    SetFaults("SendRequests#1=5");
    streamer_->SetSampleLimit(0);
    hub_.observer = [&, sent = false](const std::string& call) mutable {
      if (call != "SendRequests" || std::exchange(sent, true)) return;
      for (const auto& message : deliveries) streamer_->OnEvent(message);
    };
    const Outcome outcome = Stream();
    hub_.observer = nullptr;
    return outcome;
  }

  platform::SimulatedClock clock_{0};
  platform::SimulatedClock endless_;
  std::unique_ptr<vesk::Connection> connection_;
  std::unique_ptr<SensorStreamer> streamer_;
};

// ---- Configuration ---------------------------------------------------------

// Also what a session without samples prints.
TEST_F(StreamerTest, ChoosesRates) {
  vesk::setLogLevel(vesk::kDebug);
  for (const auto& [supported, wanted, used, choice] : table<4>(R"(
0 5 1 10  | 0   | 1.0 | Auto-selected 1.0 Hz sample rate
-3 2.5    | -3  | 2.5 | Auto-selected 2.5 Hz sample rate
5         | nan | 5.0 | Auto-selected 5.0 Hz sample rate
5 10      | 7   | 7.0 |
          | 0   | 1.0 | warning: Unable to retrieve supported rates
0 -1 nan  | 0   | 1.0 | warning: Unable to retrieve supported rates
)")) {
    std::vector<float> rates;
    for (const auto& rate : split(supported)) rates.push_back(std::stof(rate));
    (*hub_.model)[0].attributes[SNS_ATTR_RATES] = rates;
    Reconnect();
    streamer_->SetSampleRate(std::stof(wanted));
    EXPECT_EQ(capture([&] { return streamer_->AddSensor("accel"); }).err,
              choice.empty() ? "" : logged(choice + " for accel.s"));
    expect(Session(), 5,
           "Sampling from sensor type accel.s: imu.\n\nTime: <n> seconds\n"
           "accel.s 0 samples @ ~<n> Hz\n\nAverage:\n\nStandard Deviation:\n",
           logged("accel.s -n0 -r" + used));
  }
}

TEST_F(StreamerTest, CopiesTheSettingsIntoEachSensor) {
  (*hub_.model)[0].attributes[SNS_ATTR_RATES] = true;  // unreadable
  (*hub_.model)[1].attributes[SNS_ATTR_DISPLAY_NAME] = "Gyroscope 100%d";
  (*hub_.model)[2].attributes.erase(SNS_ATTR_NAME);
  Reconnect();
  streamer_->SetPassive();  // holds until a sensor is recorded
  expect(capture([&] { return streamer_->AddSensor("no.x"); }), -ENOENT, "",
         logged("error: Unable to find no.x.s"));
  SetFaults("LoadAttributes#2=7");  // the one for the name
  EXPECT_EQ(streamer_->AddSensor("accel"), 7);
  SetFaults("");
  streamer_->SetSampleRate(20);
  streamer_->SetSampleLimit(4);
  Add("gyro");
  streamer_->SetSampleRate(0);
  Add("accel");
  Add("accel.0");  // the same sensor again
  Add("light", 'c');
  streamer_->SetStreamType('x');
  vesk::setLogLevel(vesk::kDebug);
  expect(Session(), 5,
         HasSubstr("Sampling from sensor type accel.0.s: imu.\n"
                   "Sampling from sensor type gyro.s: Gyroscope 100%d.\n"
                   "Sampling from sensor type light.c: light.\n\nTime:"),
         logged("accel.0.s -n4 -r1.0;gyro.s -n4 -r20.0;light.c -n4 -r0.0"));
}

// ---- Events ----------------------------------------------------------------

TEST_F(StreamerTest, DecodesEveryMessageId) {
  streamer_->SetMinimumAccuracy(SNS_SAMPLE_STATUS_MEDIUM);
  Add("accel");
  vesk::setLogLevel(vesk::kDebug);
  for (const auto& [id, payload, shown] : table<3>(R"(
768  | 1=50.           |
768  | 1=0.            | warning: Configured accel.s for 0.0 Hz
768  |                 |
768  | broken          |
769  | 1=0 2=4294967295 3=2 4=0.25 | 5.000000 4294967296.000000 0.250000
769  | 1=-1 3=3        | 0.000000 0.000000
769  | 1=0 3=1         |
769  | broken          |
778  | 1=-7            | -7.000000
778  |                 | 0.000000
778  | broken          | error: failed to parse received activity event
779  | 1=-7            | -7.000000
779  | broken          | error: failed to parse received inactivity event
1025 | 1=1. 1=-2.5 2=2 | 1.000000 -2.500000
1025 | 1=1. 2=1        |
1025 | 1=1. 2=-1       |
1025 | 1=1. 2=99       | 1.000000
1025 |                 |
1025 | broken          |
1041 | 1=16777217 2=-1 | 16777216.000000 18446744073709551616.000000 0.000000
1041 | broken          |
770  |                 | Unexpected message id 770
-1   |                 | Unexpected message id -1
)")) {
    const std::string data = "TS: 1000 Data: " + shown + '\n';
    EXPECT_EQ(
        Deliver(1, id + " 25 " + payload),
        std::isalpha(shown[0]) != 0 || shown.empty() ? logged(shown) : data)
        << id << ' ' << payload;
  }
  // A rate is of no interest to a sensor that does not stream.
  Add("light", 'c');
  EXPECT_EQ(Deliver(3, "768 0 1=5."), "");
}

TEST_F(StreamerTest, PrintsTimestampsAndDeltas) {
  streamer_->SetShowTimestampDiffs();
  Add("accel");
  // An event that is no sample does not count for the delta.
  EXPECT_EQ(Deliver(1,
                    "1025 1;5 100;1025 25000001 1=-0. 1=1.e30;"
                    "1025 25000000 1=nan 1=inf 1=-inf;"
                    "1025 18446744073709551615 1=0.0000005"),
            "TS: 40 Delta: 0 Data:\n"
            "TS: 1000000040 Delta: 1000000000 Data: -0.000000 "
            "1000000015047466219876688855040.000000\n"
            "TS: 1000000000 Delta: -40 Data: nan inf -inf\n"
            "TS: 9223372036854775807 Delta: 9223372035854775807 "
            "Data: 0.000000\n");
}

// Also for events, even without samples, of a sensor that was not asked for.
TEST_F(StreamerTest, PrefixesLinesOnceThereAreTwoSensors) {
  const std::string kSample = "1025 25 1=1.";
  const std::string kLine = "TS: 1000 Data: 1.000000\n";
  Add("accel");
  EXPECT_EQ(Deliver(1, kSample), kLine);
  EXPECT_EQ(Deliver(99, ""), "");
  EXPECT_EQ(Deliver(1, kSample), "Sensor: accel.s " + kLine);
  EXPECT_EQ(Deliver(99, kSample), "Sensor: .s " + kLine);
}

TEST_F(StreamerTest, DropsTheRestOfAMessageAtTheLimit) {
  for (const int limit : {2, 3, 4, 0, -1, 1}) {
    const int lines = limit == 1 || limit == 2 ? limit : 3;
    streamer_->SetSampleLimit(static_cast<uint32_t>(limit));
    Add("accel");
    EXPECT_EQ(Deliver(1, "1025 25;1025 25;1025 25"),
              repeat("TS: 1000 Data:\n", lines))
        << limit;
  }
  // Past the limit every sample reaches it again.
  EXPECT_EQ(Deliver(1, "1025 25;1025 25"), "TS: 1000 Data:\n");
}

TEST_F(StreamerTest, TracesItself) {
  const std::string kName =
      " virtual void SensorStreamer::OnEvent(const sns_client_event_msg &)";
  vesk::setLogLevel(vesk::kFunction);
  EXPECT_EQ(Deliver(1, ""), logged("-->" + kName + ";<--" + kName));
}

TEST_F(StreamerTest, KeepsItsMemoryOverTenMillionSamples) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
  GTEST_SKIP() << "the heap is the sanitizer's";
#endif
  const auto message = delivery(1, repeat("1025 25 1=1. 1=2. 1=3.;", 1000));
  Add("accel");
  capture([&] {
    dup2(open("/dev/null", O_WRONLY), STDOUT_FILENO);
    streamer_->OnEvent(message);
    const size_t before = mallinfo2().uordblks;
    for (int i = 0; i < 10000; ++i) streamer_->OnEvent(message);
    EXPECT_EQ(mallinfo2().uordblks, before);
    return 0;
  });
}

// ---- The session -----------------------------------------------------------

TEST_F(StreamerTest, SumsUpWhatWasPrinted) {
  (*hub_.model)[3].attributes.erase(SNS_ATTR_NAME);
  Add("gyro");
  Add("accel");
  Add("light", 'c');
  Add("motion", 'o');
  streamer_->SetMinimumAccuracy(SNS_SAMPLE_STATUS_LOW);
  // Of the rows 1 2 4, 10 20 0, three times 0.1 and one with an infinity.
  const auto accel = delivery(1,
                              "1025 25 1=1. 1=10. 1=.1 1=inf 2=1;"
                              "1025 26 1=100. 2=0;"
                              "1025 50 1=2. 1=20. 1=.1 2=2;"
                              "1025 51 broken;"
                              "1025 126 1=4. 1=0. 1=.1 2=3");
  const auto gyro = delivery(2, "1025 7 1=-2.5 2=1");
  const auto light = delivery(3, "1025 7 2=1;1025 9 2=1");
  const std::string out = Session({accel, gyro, light}).out;
  EXPECT_EQ(out.substr(out.find("\nTime:")),
            "\nTime: <n> seconds\n"
            "accel.s 3 samples @ ~<n> Hz, average period = 2020\n"
            "gyro.s 1 samples @ ~<n> Hz\nlight.c 2 samples\n"
            "motion.o 0 samples\n"
            "\nAverage:\naccel.s  2.333333 10.000000 0.100000 inf\n"
            "gyro.s  -2.500000\nlight.c \n"
            "\nStandard Deviation:\n"
            "accel.s  1.527525 10.000000 0.000000 nan\nlight.c \n");
}

// A streamer that the tests can wake as the library might, for no reason.
struct WakeableStreamer : SensorStreamer {
  using SensorStreamer::SensorStreamer;
  void Wake() { cv_.notify_all(); }
};

// The one sample that reaches the limit comes at every moment from the
// registration on, and then no other.
TEST_F(StreamerTest, EndsAtTheLimitWheneverItIsReached) {
  constexpr int kRounds = 10000;
  const sns_client_event_msg sample = delivery(4, "1025 25 1=1.");
  for (int round = 0; round < 2 * kRounds; ++round) {
    auto* const streamer = new WakeableStreamer(connection_.get());
    streamer_.reset(streamer);
    streamer->SetSampleLimit(1);
    if (round % 2 == 0) streamer->SetTimeLimit(100000);
    Add("motion", 'o');
    const int moment = round / 2 % 5;
    const int wakes = moment >= 3 && round % 2 == 1 ? round % 7 : 0;
    std::thread other;
    bool delivered = false;
    hub_.observer = [&](const std::string& call) {
      // No delivery is running once the client is unregistered.
      if (call == "UnregisterClient" && other.joinable()) other.join();
      if (call != (moment == 0 ? "RegisterClient" : "SendRequests")) return;
      if (std::exchange(delivered, true)) return;
      if (moment <= 1) return streamer->OnEvent(sample);
      other = std::thread([=, &sample] {
        for (int i = 0; i < wakes; ++i) streamer->Wake();
        for (int i = 0; i < round % 11; ++i) std::this_thread::yield();
        streamer->OnEvent(sample);
      });
    };
    const Outcome outcome = Stream();
    hub_.observer = nullptr;  // it refers to this round
    ASSERT_EQ(outcome.status, 0);
    ASSERT_THAT(outcome.out, HasSubstr("motion.o 1 samples\n")) << round;
  }
}

// The same over the hub's own delivery thread.
TEST_F(StreamerTest, EndsWithTheOnlySampleOfAOneShotSensor) {
  hub_.clock = &endless_;
  for (int round = 0; round < 2000; ++round) {
    Reconnect();
    streamer_->SetSampleLimit(1);
    if (round % 2 == 0) streamer_->SetTimeLimit(100000);
    Add("motion", 'o');
    ASSERT_THAT(Stream().out, HasSubstr("motion.o 1 samples\n")) << round;
  }
}

// A streamer that loses the hub at its first event. If it is to recover, it
// finds the hub again and gets the sample that reaches its limit.
struct UnluckyStreamer : SensorStreamer {
  using SensorStreamer::SensorStreamer;
  void OnEvent(const sns_client_event_msg& msg) override {
    SensorStreamer::OnEvent(msg);
    platform::set_link(connection_, false);
  }
  void OnDisconnect() override {
    SensorStreamer::OnDisconnect();
    if (recovers) platform::set_link(connection_, true);
  }
  void OnReconnect() override {
    SensorStreamer::OnReconnect();
    SensorStreamer::OnEvent(delivery(1, "1025 25"));
  }
  bool recovers = false;
};

// Loss of the hub ends a timed wait with the library's status; only a limit
// ends the count wait.
TEST_F(StreamerTest, LosesTheHubInTheMiddleOfAWait) {
  for (const bool timed : {true, false}) {
    Reconnect();
    auto* const unlucky = new UnluckyStreamer(connection_.get());
    streamer_.reset(unlucky);
    unlucky->recovers = !timed;
    streamer_->SetSampleLimit(1);
    if (timed) streamer_->SetTimeLimit(100000);
    streamer_->SetSampleRate(50);
    Add("accel");
    expect(Stream(), timed ? -ENOTCONN : 0,
           HasSubstr(timed ? "accel.s 0 " : "accel.s 1 "));
  }
}

}  // namespace
