#include <algorithm>
#include <cmath>
#include <limits>
#include <utility>

#include "streamer/sensor_streamer.h"

namespace {

using SensorConfig = SensorStreamer::SensorConfig;
using Values = SensorStreamer::Values;

constexpr char kOnEvent[] =
    "virtual void SensorStreamer::OnEvent(const sns_client_event_msg &)";

// What a decoder gets: the event, its sensor's record and the accuracy that a
// sample must have.
struct Incoming {
  const sns_client_event& event;
  const SensorConfig& config;
  sns_std_sensor_sample_status minimum_accuracy;
};

// Parses the event's payload into `*payload`, with the elements of its field
// `*elements` going to `*values` instead, whose memory they use.
template <typename Payload>
bool parse(const Incoming& in, Payload* payload, Values* elements,
           Values* values) {
  *elements = std::move(*values);
  const bool is_good = payload->ParseFromString(in.event.payload());
  *values = std::move(*elements);
  return is_good;
}

template <typename Payload>
bool is_accurate(const Payload& payload, const Incoming& in) {
  return static_cast<int>(payload.status()) >=
         static_cast<int>(in.minimum_accuracy);
}

// The decoders, one per message id. Each sets `*values` to the sample's and
// returns true, or returns false when the event is no sample or is dropped.

bool decode_physical_config(const Incoming& in, Values*) {
  if (in.config.stream_type != SNS_STREAM_TYPE_STREAMING) return false;
  sns_std_sensor_physical_config_event payload;
  if (payload.ParseFromString(in.event.payload()) &&
      payload.has_sample_rate() &&
      payload.sample_rate() != in.config.sample_rate) {
    vesk::log(vesk::kWarning, "Configured %s.%c for %.1f Hz",
              in.config.datatype.c_str(), in.config.stream_type_char,
              static_cast<double>(payload.sample_rate()));
  }
  return false;
}

bool decode_proximity(const Incoming& in, Values* values) {
  constexpr float kFar = 5;
  constexpr float kNear = 0;
  sns_proximity_event payload;
  if (!parse(in, &payload, payload.mutable_values(), values)) return false;
  values->Add(payload.event_type() == SNS_PROXIMITY_FAR ? kFar : kNear);
  values->Add(static_cast<float>(payload.raw_value()));
  std::rotate(values->begin(), values->end() - 2, values->end());
  return is_accurate(payload, in);
}

template <typename Payload>
bool decode_state(const Incoming& in, const char* name, Values* values) {
  Payload payload;
  if (!payload.ParseFromString(in.event.payload())) {
    vesk::log(vesk::kError, "failed to parse received %s event", name);
    return false;
  }
  values->Add(static_cast<float>(payload.state()));
  return true;
}

bool decode_activity(const Incoming& in, Values* values) {
  return decode_state<sns_activity_event>(in, "activity", values);
}

bool decode_inactivity(const Incoming& in, Values* values) {
  return decode_state<sns_inactivity_event>(in, "inactivity", values);
}

bool decode_standard(const Incoming& in, Values* values) {
  sns_std_sensor_event payload;
  return parse(in, &payload, payload.mutable_data(), values) &&
         is_accurate(payload, in);
}

bool decode_vsync(const Incoming& in, Values* values) {
  sns_camera_vsync_interrupt_info payload;
  if (!payload.ParseFromString(in.event.payload())) return false;
  for (const uint64_t value :
       {payload.value1(), payload.value2(), payload.value3()}) {
    values->Add(static_cast<float>(value));
  }
  return true;
}

struct Decoder {
  vesk::MessageId msg_id;
  bool (*decode)(const Incoming& in, Values* values);
};

constexpr Decoder kDecoders[] = {
    {vesk::kSensorEvent, decode_standard},
    {vesk::kPhysicalConfigEvent, decode_physical_config},
    {vesk::kProximityEvent, decode_proximity},
    {vesk::kActivityEvent, decode_activity},
    {vesk::kInactivityEvent, decode_inactivity},
    {vesk::kVsyncEvent, decode_vsync},
};

bool decode(const Incoming& in, Values* values) {
  values->Clear();
  const int msg_id = in.event.msg_id();
  for (const Decoder& decoder : kDecoders) {
    if (decoder.msg_id == msg_id) return decoder.decode(in, values);
  }
  vesk::log(vesk::kDebug, "Unexpected message id %d", msg_id);
  return false;
}

// Truncates toward zero, and stops at the ends of the range of int64.
int64_t to_nanoseconds(double seconds) {
  constexpr double kEnd = 0x1p63;
  const double ns = seconds * 1e9;
  if (std::isnan(ns)) return 0;
  if (ns >= kEnd) return std::numeric_limits<int64_t>::max();
  if (ns < -kEnd) return std::numeric_limits<int64_t>::min();
  return static_cast<int64_t>(ns);
}

// Adds a printed sample to its sensor's record.
void account(int64_t ns, const Values& values, SensorConfig* config) {
  if (config->first_timestamp < 0) config->first_timestamp = ns;
  config->last_timestamp = ns;
  const auto count = static_cast<size_t>(values.size());
  if (config->sums.size() < count) {
    // The sum of nothing, to which a value adds up as it is, also -0.
    config->sums.resize(count, -0.0);
    config->sums_of_squares.resize(count, -0.0);
  }
  for (size_t i = 0; i < count; ++i) {
    const double x = values[static_cast<int>(i)];
    config->sums[i] += x;
    config->sums_of_squares[i] += x * x;
  }
  ++config->sample_count;
}

}  // namespace

void SensorStreamer::OnEvent(const sns_client_event_msg& msg) {
  vesk::logFunc(kOnEvent, "-->");
  const sns_std_suid& suid = msg.suid();
  SensorConfig& config =
      sensors_[vesk::SensorUid{suid.suid_low(), suid.suid_high()}];
  for (const sns_client_event& event : msg.events()) {
    if (!decode({event, config, minimum_accuracy_}, &values_)) continue;
    const int64_t ns = PrintSample(event, values_, config);
    account(ns, values_, &config);
    // A limit of 0 wraps to the largest count and is never reached.
    if (config.sample_limit - 1 < config.sample_count) {
      limit_reached_ = true;
      limit_reached_.notify_all();
      cv_.notify_all();
      break;
    }
  }
  vesk::logFunc(kOnEvent, "<--");
}

int64_t SensorStreamer::PrintSample(const sns_client_event& event,
                                    const Values& values,
                                    const SensorConfig& config) const {
  if (sensors_.size() >= 2) {
    vesk::say("Sensor: %s.%c ", config.datatype.c_str(),
              config.stream_type_char);
  }
  const int64_t ns = to_nanoseconds(vesk::ticksToSeconds(event.timestamp()));
  vesk::say("TS: %ld ", ns);
  if (show_timestamp_diffs_) {
    const bool is_first = config.last_timestamp < 0;
    vesk::say("Delta: %ld ", is_first ? 0 : Elapsed(config.last_timestamp, ns));
  }
  vesk::say("Data:");
  for (const double value : values) vesk::say(" %f", value);
  vesk::say("\n");
  return ns;
}
