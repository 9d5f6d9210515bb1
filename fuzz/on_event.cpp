#include <fuzzer/FuzzedDataProvider.h>
#include <sys/mman.h>
#include <unistd.h>

#include <bit>
#include <climits>
#include <cstdio>
#include <limits>
#include <memory>
#include <string>
#include <vector>

#include "fuzz/harness.h"
#include "platform/library/output.h"
#include "streamer/sensor_streamer.h"

// Deliveries of all kinds into a session, which is run up to its summary.

namespace {

constexpr int kSendFailure = -EIO;

struct KnownSensor {
  const char* datatype;
  vesk::SensorUid uid;
  long type;
  char letter;
  const char* display_name;
};

constexpr KnownSensor kSensors[] = {
    {"a", {1, 0}, SNS_STREAM_TYPE_STREAMING, 's', "A"},
    {"b", {2, 0}, SNS_STREAM_TYPE_ON_CHANGE, 'c', "100%n%s"},
    {"c", {0, 1}, SNS_STREAM_TYPE_SINGLE_OUTPUT, 'o', ""},
    // The one that a message without a UID means.
    {"d", {0, 0}, SNS_STREAM_TYPE_STREAMING, 's', "D"},
};

platform::HubModel make_hub() {
  platform::HubModel hub;
  for (const KnownSensor& sensor : kSensors) {
    hub.push_back(
        {.uid = sensor.uid,
         .datatype = sensor.datatype,
         .attributes = {{SNS_ATTR_DISPLAY_NAME, sensor.display_name},
                        {SNS_ATTR_HW_ID, 0L},
                        {SNS_ATTR_STREAM_TYPE, sensor.type},
                        {SNS_ATTR_RATES, std::vector<float>{10, 0, 50}}}});
  }
  return hub;
}

// The connection serves every input: nothing of a client is left there once it
// is unregistered. No time passes on its hub.
vesk::Connection* connection() {
  static platform::StandIn& setup = platform::stand_in();
  static platform::SimulatedClock clock(0);
  static const std::unique_ptr<vesk::Connection> instance = [] {
    setup.model = make_hub();
    setup.clock = &clock;
    std::unique_ptr<vesk::Connection> created;
    vesk::Connection::Create(&created);
    return created;
  }();
  return instance.get();
}

/// Keeps what goes to standard output from its construction until Take.
class CapturedOutput {
 public:
  CapturedOutput() {
    static const int real_output = dup(STDOUT_FILENO);
    static const int file = memfd_create("output", MFD_CLOEXEC);
    real_output_ = real_output;
    file_ = file;
    const bool captured = ftruncate(file_, 0) == 0 &&
                          lseek(file_, 0, SEEK_SET) == 0 &&
                          dup2(file_, STDOUT_FILENO) != -1;
    fuzz::require(captured, "the output can be captured");
  }

  /// Hands it on to the real standard output as well.
  std::string Take() {
    const off_t size = lseek(file_, 0, SEEK_CUR);
    std::string text(static_cast<size_t>(size), '\0');
    const bool read = pread(file_, text.data(), text.size(), 0) == size &&
                      dup2(real_output_, STDOUT_FILENO) != -1;
    fuzz::require(read, "the output can be read");
    std::fwrite(text.data(), 1, text.size(), stdout);
    std::fflush(stdout);
    return text;
  }

 private:
  int real_output_;
  int file_;
};

/// Makes deliveries of what the input says.
class Deliveries {
 public:
  explicit Deliveries(FuzzedDataProvider* input) : input_(*input) {}

  /// False if this one does not even decode as a delivery.
  bool Make(sns_client_event_msg* message) {
    if (input_.ConsumeIntegralInRange(0, 15) == 15) {
      return message->ParseFromString(Bytes());
    }
    AddSuid(message);
    const int events = input_.ConsumeIntegralInRange(0, 6);
    for (int i = 0; i < events; ++i) {
      sns_client_event* event = message->add_events();
      event->set_msg_id(Id());
      event->set_timestamp(Timestamp());
      event->set_payload(Payload(event->msg_id()));
    }
    return true;
  }

  float Float() {
    using Limits = std::numeric_limits<float>;
    constexpr float kSpecial[] = {0,
                                  -0.0f,
                                  1,
                                  50,
                                  -1,
                                  Limits::infinity(),
                                  -Limits::infinity(),
                                  Limits::quiet_NaN(),
                                  -Limits::quiet_NaN(),
                                  Limits::max(),
                                  Limits::lowest(),
                                  Limits::denorm_min()};
    if (input_.ConsumeBool()) return input_.PickValueInArray(kSpecial);
    return std::bit_cast<float>(input_.ConsumeIntegral<uint32_t>());
  }

 private:
  std::string Bytes() { return input_.ConsumeRandomLengthString(64); }

  void AddSuid(sns_client_event_msg* message) {
    const size_t known = std::size(kSensors);
    const size_t choice = input_.ConsumeIntegralInRange<size_t>(0, known + 2);
    if (choice == known) return;  // absent
    sns_std_suid* suid = message->mutable_suid();
    if (choice < known) {
      suid->set_suid_low(kSensors[choice].uid.low);
      suid->set_suid_high(kSensors[choice].uid.high);
    } else if (choice == known + 1) {
      suid->set_suid_low(input_.ConsumeIntegral<uint64_t>());
      suid->set_suid_high(input_.ConsumeIntegral<uint64_t>());
    }  // else empty
  }

  int Id() {
    constexpr int kIds[] = {1025, 1025, 769, 768, 778, 779,  1041,
                            770,  777,  767, 780, 0,   1024, INT_MAX};
    if (input_.ConsumeIntegralInRange(0, 15) == 15) {
      return input_.ConsumeIntegral<int>();
    }
    return input_.PickValueInArray(kIds);
  }

  uint64_t Timestamp() {
    switch (input_.ConsumeIntegralInRange(0, 3)) {
      case 0:
        return last_ = input_.ConsumeIntegral<uint64_t>();
      case 1:
        return last_ = UINT64_MAX - input_.ConsumeIntegral<uint8_t>();
      case 2:
        return last_ += input_.ConsumeIntegral<uint32_t>();
      default:
        return last_;
    }
  }

  // Mostly what belongs to `id`; sometimes damaged, or of another kind.
  std::string Payload(int id) {
    switch (input_.ConsumeIntegralInRange(0, 7)) {
      case 0:
        return Bytes();
      case 1:
        return Encode(Id());
      case 2: {
        std::string payload = Encode(id);
        const size_t at = input_.ConsumeIntegral<uint8_t>();
        if (at < payload.size()) {
          payload[at] = input_.ConsumeIntegral<char>();
        } else {
          payload.resize(payload.size() / 2);
        }
        return payload;
      }
      default:
        return Encode(id);
    }
  }

  std::string Encode(int id) {
    switch (id) {
      case 768: {
        sns_std_sensor_physical_config_event event;
        if (input_.ConsumeBool()) event.set_sample_rate(Float());
        return event.SerializeAsString();
      }
      case 769: {
        sns_proximity_event event;
        event.set_event_type(
            static_cast<sns_proximity_event_type>(Enumerator()));
        event.set_raw_value(input_.ConsumeIntegral<uint32_t>());
        event.set_status(Accuracy());
        AddValues(event.mutable_values());
        return event.SerializeAsString();
      }
      case 778: {
        sns_activity_event event;
        event.set_state(input_.ConsumeIntegral<int32_t>());
        return event.SerializeAsString();
      }
      case 779: {
        sns_inactivity_event event;
        event.set_state(input_.ConsumeIntegral<int32_t>());
        return event.SerializeAsString();
      }
      case 1041: {
        sns_camera_vsync_interrupt_info event;
        event.set_value1(input_.ConsumeIntegral<uint64_t>());
        event.set_value2(input_.ConsumeIntegral<uint64_t>());
        event.set_value3(input_.ConsumeIntegral<uint64_t>());
        return event.SerializeAsString();
      }
      default: {
        sns_std_sensor_event event;
        AddValues(event.mutable_data());
        event.set_status(Accuracy());
        return event.SerializeAsString();
      }
    }
  }

  int Enumerator() {
    const int value = input_.ConsumeIntegralInRange(0, 7);
    return value < 4 ? value : input_.ConsumeIntegral<int>();
  }

  sns_std_sensor_sample_status Accuracy() {
    return static_cast<sns_std_sensor_sample_status>(Enumerator());
  }

  // A few values; once per input so many that a line exceeds any buffer.
  template <typename Values>
  void AddValues(Values* values) {
    const int choice = input_.ConsumeIntegralInRange(0, 31);
    if (choice == 31 && !crowded_) {
      crowded_ = true;
      values->Resize(input_.ConsumeIntegralInRange(0, 3000), Float());
      return;
    }
    for (int i = 0; i < choice % 6; ++i) values->Add(Float());
  }

  FuzzedDataProvider& input_;
  uint64_t last_ = 0;
  bool crowded_ = false;
};

/// One input: a session with its settings and deliveries.
class Session {
 public:
  explicit Session(FuzzedDataProvider* input)
      : input_(*input), deliveries_(input), streamer_(connection()) {
    platform::stand_in().faults.clear();
    Configure();
    platform::stand_in().observer = [this](const std::string& call) {
      monitor_.Note(call);
      if (call != "SendRequests" || enabled_) return;
      enabled_ = true;
      Enable();
    };
  }
  ~Session() { platform::stand_in().observer = nullptr; }

  void Run() {
    const fuzz::SignalActions restored_after;
    CapturedOutput output;
    const int result = streamer_.Stream();
    CheckOutput(output.Take());
    if (first_ == nullptr) {
      fuzz::require(result == -ENOENT, "nothing to stream");
    } else if (fails_) {
      fuzz::require(result == kSendFailure, "the failure is the result");
    } else {  // a rate may be one at which nothing can run
      fuzz::require(result == 0 || result == -EINVAL, "a good result");
    }
    fuzz::require(monitor_.registrations() == 0, "all is unregistered");
  }

 private:
  enum Mode { kCount, kTime, kSignal };

  void Configure() {
    vesk::setLogLevel(
        static_cast<vesk::log_level>(input_.ConsumeIntegralInRange(1, 4)));
    mode_ = static_cast<Mode>(input_.ConsumeIntegralInRange(0, 2));
    fails_ = input_.ConsumeBool();
    const bool has_limit =
        mode_ == kCount ||
        (mode_ == kTime && (!fails_ || input_.ConsumeBool()));
    if (mode_ == kTime) streamer_.SetTimeLimit(1u << 30);
    if (input_.ConsumeBool()) streamer_.SetShowTimestampDiffs();
    streamer_.SetMinimumAccuracy(static_cast<sns_std_sensor_sample_status>(
        input_.ConsumeIntegralInRange(0, 3)));
    for (const KnownSensor& sensor : kSensors) {
      if (input_.ConsumeBool()) continue;
      streamer_.SetStreamType(sensor.letter);
      streamer_.SetSampleRate(deliveries_.Float());
      if (input_.ConsumeBool()) streamer_.SetPassive();
      if (has_limit) {
        streamer_.SetSampleLimit(first_ == nullptr
                                     ? kFirstLimit
                                     : input_.ConsumeIntegral<uint32_t>());
      }
      if (first_ == nullptr) first_ = &sensor;
      fuzz::require(streamer_.AddSensor(sensor.datatype) == 0, "it is there");
    }
  }

  // What happens while the sensors are being enabled.
  void Enable() {
    const int deliveries = input_.ConsumeIntegralInRange(0, 8);
    for (int i = 0; i < deliveries; ++i) {
      sns_client_event_msg message;
      if (deliveries_.Make(&message)) Deliver(message);
    }
    if (fails_) fuzz::CallMonitor::FailRequests(kSendFailure);
    if (mode_ == kSignal) {
      fuzz::require(fuzz::interrupt_session(sig_handler), "it can be ended");
    } else if (!fails_) {
      // Whatever came before, now the wait has to end.
      ReachLimit();
    }
  }

  void ReachLimit() {
    sns_std_sensor_event sample;
    sample.set_status(SNS_SAMPLE_STATUS_HIGH);
    sns_client_event_msg message;
    message.mutable_suid()->set_suid_low(first_->uid.low);
    message.mutable_suid()->set_suid_high(first_->uid.high);
    for (uint32_t i = 0; i < kFirstLimit; ++i) {
      sns_client_event* event = message.add_events();
      event->set_msg_id(1025);
      event->set_payload(sample.SerializeAsString());
    }
    Deliver(message);
  }

  // As the library does, but at a moment of which the input decides.
  void Deliver(const sns_client_event_msg& message) {
    platform::begin_delivery();
    streamer_.OnEvent(message);
    platform::end_delivery();
  }

  static void CheckOutput(const std::string& text) {
    if (text.find("\nTime: ") != text.npos) {
      size_t printed = 0;
      for (size_t at = 0; (at = text.find("TS: ", at)) != text.npos; ++at) {
        ++printed;
      }
      size_t counted = 0;
      for (size_t at = 0; (at = text.find(" samples", at)) != text.npos; ++at) {
        counted += std::stoul(text.substr(text.rfind(' ', at - 1)));
      }
      fuzz::require(printed == counted, "every sample is counted once");
    }
    const size_t averages = text.find("\nAverage:\n");
    fuzz::require(
        averages == text.npos || text.find("-nan", averages) == text.npos,
        "a result that is no number has no sign");
  }

  static constexpr uint32_t kFirstLimit = 3;

  FuzzedDataProvider& input_;
  Deliveries deliveries_;
  SensorStreamer streamer_;
  fuzz::CallMonitor monitor_ = fuzz::CallMonitor(INT_MAX);
  Mode mode_ = kCount;
  bool fails_ = false;
  bool enabled_ = false;
  const KnownSensor* first_ = nullptr;  // added
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  FuzzedDataProvider input(data, size);
  Session(&input).Run();
  return 0;
}
