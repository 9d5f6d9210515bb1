#include <fcntl.h>
#include <google/protobuf/io/coded_stream.h>
#include <google/protobuf/io/zero_copy_stream_impl_lite.h>
#include <malloc.h>
#include <unistd.h>

#include <bit>
#include <thread>

#include "streamer/sensor_streamer.h"
#include "tests/support.h"

namespace {

// The payload with these fields, NUMBER=VALUE: a float, which has a period or
// an n, or a whole number. "broken" is none.
std::string encode(const Words& fields) {
  std::string bytes;
  google::protobuf::io::StringOutputStream stream(&bytes);
  google::protobuf::io::CodedOutputStream out(&stream);
  for (const std::string& field : fields) {
    if (field == "broken") return "\xff";
    const std::string value = field.substr(2);
    const bool is_float = value.find_first_of(".n") != std::string::npos;
    out.WriteTag(static_cast<uint32_t>(field[0] - '0') << 3 | is_float * 5u);
    if (is_float) {
      out.WriteLittleEndian32(std::bit_cast<uint32_t>(std::stof(value)));
    } else {
      out.WriteVarint64(static_cast<uint64_t>(std::stoll(value)));
    }
  }
  out.Trim();
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
    (*hub_.model)[3].change_period = 9;  // s; not before the clock stands still
    Connect();
    streamer_ = std::make_unique<SensorStreamer>(connection_.get());
    vesk::setLogLevel(vesk::kError);
  }

  void Add(const std::string& datatype, char endpoint = 's') {
    streamer_->SetStreamType(endpoint);
    EXPECT_EQ(streamer_->AddSensor(datatype), 0);
  }

  // What a delivery prints.
  std::string Deliver(uint64_t uid, const std::string& events) {
    const Outcome outcome =
        capture([&] { return streamer_->OnEvent(delivery(uid, events)), 0; });
    return outcome.out + outcome.err;
  }

  Outcome Stream() {
    return capture([&] { return streamer_->Stream(); });
  }

  std::unique_ptr<SensorStreamer> streamer_;
};

// ---- Events ----------------------------------------------------------------

TEST_F(StreamerTest, DecodesEveryMessageId) {
  streamer_->SetMinimumAccuracy(SNS_SAMPLE_STATUS_MEDIUM);
  Add("accel");
  vesk::setLogLevel(vesk::kDebug);
  for (const auto& [payload, id, shown] : table<3>(R"(
1=10.;;broken               | 768  |
1=0.                        | 768  | warning: Configured accel.s for 0.0 Hz
1=0 2=4294967295 3=2 4=0.25 | 769  | 5.000000 4294967296.000000 0.250000
1=-1 3=3                    | 769  | 0.000000 0.000000
1=0 3=1;broken              | 769  |
1=-7                        | 778  | -7.000000
''                          | 778  | 0.000000
broken | 778 | error: failed to parse received activity event
1=-7                        | 779  | -7.000000
broken | 779 | error: failed to parse received inactivity event
1=1. 1=-2.5 2=2             | 1025 | 1.000000 -2.500000
1=1. 2=99                   | 1025 | 1.000000
1=1. 2=1;1=1. 2=-1;;broken  | 1025 |
1=16777217 2=-1 | 1041 | 16777216.000000 18446744073709551616.000000 0.000000
broken                      | 1041 |
''                          | 770  | Unexpected message id 770
''                          | -1   | Unexpected message id -1
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
  vesk::setLogLevel(vesk::kFunction);
  const std::string kName =
      " virtual void SensorStreamer::OnEvent(const sns_client_event_msg &)";
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
  Add("gyro");
  Add("accel");
  Add("light", 'c');
  Add("motion", 'o');
  streamer_->SetMinimumAccuracy(SNS_SAMPLE_STATUS_LOW);
  // Of the rows 1 2 4, 10 20 0, three times 0.1 and one with an infinity.
  Deliver(1,
          "1025 0 1=1. 1=10. 1=.1 1=inf 2=1;1025 1 1=100. 2=0;"
          "1025 25 1=2. 1=20. 1=.1 2=2;1025 26 broken;"
          "1025 101 1=4. 1=0. 1=.1 2=3");
  Deliver(2, "1025 7 1=-2.5 2=1");
  Deliver(3, "1025 7 2=1;1025 9 2=1");
  // The session itself ends at once.
  SetFaults("SendRequests=5");
  streamer_->SetSampleLimit(0);
  EXPECT_THAT(Stream().out,
              testing::EndsWith(
                  "\nTime: <n> seconds\n"
                  "accel.s 3 samples @ ~<n> Hz, average period = 2020\n"
                  "gyro.s 1 samples @ ~<n> Hz\nlight.c 2 samples\n"
                  "motion.o 0 samples\n"
                  "\nAverage:\naccel.s  2.333333 10.000000 0.100000 inf\n"
                  "gyro.s  -2.500000\nlight.c \n"
                  "\nStandard Deviation:\n"
                  "accel.s  1.527525 10.000000 0.000000 nan\nlight.c \n"));
}

// A streamer that the tests can wake as the library might, for no reason.
struct WakeableStreamer : SensorStreamer {
  using SensorStreamer::SensorStreamer;
  void Wake() { cv_.notify_all(); }
};

// The one sample that reaches the limit comes at every moment from the
// registration on, and then no other.
TEST_F(StreamerTest, EndsAtTheLimitWheneverItIsReached) {
  const sns_client_event_msg sample = delivery(4, "1025 25 1=1.");
  for (int round = 0; round < 20000; ++round) {
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

// A streamer that loses the hub at every event, and may find it again.
struct UnluckyStreamer : SensorStreamer {
  using SensorStreamer::SensorStreamer;
  void OnEvent(const sns_client_event_msg& msg) override {
    SensorStreamer::OnEvent(msg);
    platform::set_link(connection_, false);
  }
  void OnDisconnect() override {
    SensorStreamer::OnDisconnect();
    platform::set_link(connection_, recovers);
  }
  static inline bool recovers;
};

// Loss of the hub ends a timed wait with the library's status; only a limit
// ends the count wait.
TEST_F(StreamerTest, LosesTheHubInTheMiddleOfAWait) {
  for (const bool timed : {true, false}) {
    platform::set_link(connection_.get(), true);
    streamer_ = std::make_unique<UnluckyStreamer>(connection_.get());
    UnluckyStreamer::recovers = !timed;
    streamer_->SetSampleLimit(timed ? ~0u : 3);
    if (timed) streamer_->SetTimeLimit(100000);
    Add("accel");
    expect(Stream(), timed ? -ENOTCONN : 0,
           HasSubstr(timed ? "accel.s 0 " : "average period = 100000000"));
  }
}

}  // namespace
