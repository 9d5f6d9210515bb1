#include "streamer/sensor_streamer.h"

#include <cerrno>

#include "lookup/sensor_lookup.h"

SensorStreamer::SensorStreamer(vesk::Connection* connection)
    : vesk::Client(connection) {}

SensorStreamer::~SensorStreamer() = default;

void SensorStreamer::SetStreamType(char letter) {
  pending_config_.stream_type = stream_type_of(letter);
  const bool is_streaming =
      pending_config_.stream_type == SNS_STREAM_TYPE_STREAMING;
  pending_config_.stream_type_char = is_streaming ? 's' : letter;
}

void SensorStreamer::SetSampleRate(float rate) {
  pending_config_.sample_rate = rate > 0 ? rate : 0;
}

void SensorStreamer::SetSampleLimit(uint32_t samples) {
  pending_config_.sample_limit = samples;
  has_sample_limit_ = true;
}

void SensorStreamer::SetPassive() { pending_config_.passive = true; }

void SensorStreamer::SetMinimumAccuracy(sns_std_sensor_sample_status accuracy) {
  minimum_accuracy_ = accuracy;
}

void SensorStreamer::SetShowTimestampDiffs() { show_timestamp_diffs_ = true; }

void SensorStreamer::SetTimeLimit(uint32_t seconds) { time_limit_ = seconds; }

int SensorStreamer::AddSensor(const std::string& datatype) {
  vesk::SensorUid uid{};
  int status = SensorLookup(connection_)
                   .Lookup(datatype, pending_config_.stream_type, &uid);
  if (status != 0) {
    vesk::log(vesk::kError, "Unable to find %s.%c", datatype.c_str(),
              pending_config_.stream_type_char);
    return status;
  }
  sns_std_attr_event attrs;
  status = vesk::AttrUtil(connection_).LoadAttributes(uid, &attrs);
  if (status != 0) return status;

  std::string* name = &pending_config_.display_name;
  if (vesk::AttrUtil::GetDisplayName(attrs, name) != 0 &&
      vesk::AttrUtil::GetName(attrs, name) != 0) {
    *name = datatype;
  }
  const float rate = ChooseRate(attrs, datatype);

  SensorConfig& config = sensors_[uid];
  config = pending_config_;
  config.datatype = datatype;
  config.sample_rate = rate;
  pending_config_.passive = false;
  return 0;
}

// The rate that was asked for, else the sensor's smallest positive one, in Hz.
float SensorStreamer::ChooseRate(const sns_std_attr_event& attrs,
                                 const std::string& datatype) const {
  const SensorConfig& pending = pending_config_;
  if (pending.stream_type != SNS_STREAM_TYPE_STREAMING ||
      pending.sample_rate > 0) {
    return pending.sample_rate;
  }
  std::vector<float> rates;
  if (vesk::AttrUtil::GetRates(attrs, &rates) != 0) rates.clear();
  float best = -1;
  for (const float rate : rates) {
    if (rate > 0 && (best < 0 || rate < best)) best = rate;
  }
  if (best < 0) {
    vesk::log(vesk::kWarning, "Unable to retrieve supported rates for %s.%c",
              datatype.c_str(), pending.stream_type_char);
    return 1;
  }
  vesk::log(vesk::kInfo, "Auto-selected %.1f Hz sample rate for %s.%c",
            static_cast<double>(best), datatype.c_str(),
            pending.stream_type_char);
  return best;
}
