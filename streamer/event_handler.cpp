#include <cmath>
#include <limits>

#include "streamer/sensor_streamer.h"

namespace {

using SensorConfig = SensorStreamer::SensorConfig;

constexpr char kOnEvent[] =
    "virtual void SensorStreamer::OnEvent(const sns_client_event_msg &)";

// What a decoder gets: the event, its sensor's record and the accuracy that a
// sample must have.
struct Incoming {
  const sns_client_event& event;
  const SensorConfig& config;
  sns_std_sensor_sample_status minimum_accuracy;
};

template <typename Payload>
bool is_accurate(const Payload& payload, const Incoming& in) {
  return static_cast<int>(payload.status()) >=
         static_cast<int>(in.minimum_accuracy);
}

// The decoders, one per message id. Each appends the sample's values to
// `*values` and returns true, or returns false when the event is no sample or
// is dropped.

bool decode_physical_config(const Incoming& in, std::vector<float>*) {
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

bool decode_proximity(const Incoming& in, std::vector<float>* values) {
  constexpr float kFar = 5;
  constexpr float kNear = 0;
  sns_proximity_event payload;
  if (!payload.ParseFromString(in.event.payload())) return false;
  if (!is_accurate(payload, in)) return false;
  values->push_back(payload.event_type() == SNS_PROXIMITY_FAR ? kFar : kNear);
  values->push_back(static_cast<float>(payload.raw_value()));
  values->insert(values->end(), payload.values().begin(),
                 payload.values().end());
  return true;
}

template <typename Payload>
bool decode_state(const Incoming& in, const char* name,
                  std::vector<float>* values) {
  Payload payload;
  if (!payload.ParseFromString(in.event.payload())) {
    vesk::log(vesk::kError, "failed to parse received %s event", name);
    return false;
  }
  values->push_back(static_cast<float>(payload.state()));
  return true;
}

bool decode_activity(const Incoming& in, std::vector<float>* values) {
  return decode_state<sns_activity_event>(in, "activity", values);
}

bool decode_inactivity(const Incoming& in, std::vector<float>* values) {
  return decode_state<sns_inactivity_event>(in, "inactivity", values);
}

bool decode_standard(const Incoming& in, std::vector<float>* values) {
  sns_std_sensor_event payload;
  if (!payload.ParseFromString(in.event.payload())) return false;
  if (!is_accurate(payload, in)) return false;
  values->assign(payload.data().begin(), payload.data().end());
  return true;
}

bool decode_vsync(const Incoming& in, std::vector<float>* values) {
  sns_camera_vsync_interrupt_info payload;
  if (!payload.ParseFromString(in.event.payload())) return false;
  for (const uint64_t value :
       {payload.value1(), payload.value2(), payload.value3()}) {
    values->push_back(static_cast<float>(value));
  }
  return true;
}

struct Decoder {
  int msg_id;
  bool (*decode)(const Incoming& in, std::vector<float>* values);
};

constexpr Decoder kDecoders[] = {
    {1025, decode_standard},        // sns_std_sensor_event
    {768, decode_physical_config},  // sns_std_sensor_physical_config_event
    {769, decode_proximity},        // sns_proximity_event
    {778, decode_activity},         // sns_activity_event
    {779, decode_inactivity},       // sns_inactivity_event
    {1041, decode_vsync},           // sns_camera_vsync_interrupt_info
};

bool decode(const Incoming& in, std::vector<float>* values) {
  values->clear();
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

}  // namespace

void SensorStreamer::OnEvent(const sns_client_event_msg& msg) {
  vesk::logFunc(kOnEvent, "-->");
  const sns_std_suid& suid = msg.suid();
  SensorConfig& config =
      sensors_[vesk::SensorUid{suid.suid_low(), suid.suid_high()}];
  for (const sns_client_event& event : msg.events()) {
    if (!decode({event, config, minimum_accuracy_}, &values_)) continue;
    PrintSample(event, &config);
    ++config.sample_count;
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

void SensorStreamer::PrintSample(const sns_client_event& event,
                                 SensorConfig* config) {
  if (sensors_.size() >= 2) {
    vesk::say("Sensor: %s.%c ", config->datatype.c_str(),
              config->stream_type_char);
  }
  const int64_t ns = to_nanoseconds(vesk::ticksToSeconds(event.timestamp()));
  vesk::say("TS: %ld ", ns);
  if (config->first_timestamp < 0) config->first_timestamp = ns;
  if (show_timestamp_diffs_) {
    const bool is_first = config->last_timestamp < 0;
    vesk::say("Delta: %ld ",
              is_first ? 0 : Elapsed(config->last_timestamp, ns));
  }
  config->last_timestamp = ns;
  vesk::say("Data:");
  PrintValues(config);
  vesk::say("\n");
}

// Prints the sample's values and adds them to the sums.
void SensorStreamer::PrintValues(SensorConfig* config) {
  for (size_t i = 0; i < values_.size(); ++i) {
    const double x = values_[i];
    vesk::say(" %f", x);
    if (i < config->sums.size()) {
      config->sums[i] += x;
      config->sums_of_squares[i] += x * x;
    } else {
      config->sums.push_back(x);
      config->sums_of_squares.push_back(x * x);
    }
  }
}
