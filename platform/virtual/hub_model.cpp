#include "platform/virtual/hub_model.h"

#include <algorithm>
#include <cmath>

namespace platform {
namespace {

void encode(bool value, sns_std_attr_value* out) { out->set_flag(value); }
void encode(long value, sns_std_attr_value* out) { out->set_integer(value); }
void encode(float value, sns_std_attr_value* out) { out->set_number(value); }
void encode(const std::string& value, sns_std_attr_value* out) {
  out->set_text(value);
}

void encode(const Range& value, sns_std_attr_range* out) {
  out->set_low(value.first);
  out->set_high(value.second);
}

void encode(const Range& value, sns_std_attr_value* out) {
  encode(value, out->mutable_range());
}

void encode(const std::vector<long>& values, sns_std_attr_value* out) {
  out->mutable_integers()->mutable_items()->Add(values.begin(), values.end());
}

void encode(const std::vector<float>& values, sns_std_attr_value* out) {
  out->mutable_numbers()->mutable_items()->Add(values.begin(), values.end());
}

void encode(const std::vector<std::string>& values, sns_std_attr_value* out) {
  out->mutable_texts()->mutable_items()->Add(values.begin(), values.end());
}

void encode(const std::vector<Range>& values, sns_std_attr_value* out) {
  sns_std_attr_ranges* ranges = out->mutable_ranges();
  for (const Range& value : values) encode(value, ranges->add_items());
}

// Noise in [-1, 1), by a 64-bit mixing function: the same for the same axis
// and time, whenever and wherever it is computed.
double noise_at(uint64_t axis, Ticks time) {
  uint64_t x = static_cast<uint64_t>(time) + axis * 0x9e3779b97f4a7c15;
  for (const int shift : {30, 27}) {
    x = (x ^ (x >> shift)) * 0xbf58476d1ce4e5b9;
  }
  x ^= x >> 31;
  return static_cast<double>(x >> 11) * 0x1p-52 - 1;
}

float value_at(const Axis& axis, uint64_t seed, Ticks time, Ticks changes) {
  const Ticks period = to_ticks(axis.period);
  const double phase =
      static_cast<double>(time % period) / static_cast<double>(period);
  const double triangle = 4 * std::abs(phase - 0.5) - 1;
  const double value = axis.base + axis.swing * triangle +
                       axis.noise * noise_at(seed, time) +
                       axis.step * static_cast<double>(changes);
  return static_cast<float>(value);
}

sns_std_sensor_sample_status accuracy_at(const VirtualSensor& sensor,
                                         Ticks age) {
  int level = SNS_SAMPLE_STATUS_HIGH;
  if (sensor.seconds_per_accuracy > 0) {
    const Ticks levels = age / to_ticks(sensor.seconds_per_accuracy);
    level = static_cast<int>(std::min<Ticks>(levels, level));
  }
  return static_cast<sns_std_sensor_sample_status>(level);
}

}  // namespace

Ticks to_ticks(double seconds) {
  return std::max<Ticks>(1, std::llround(seconds * kTicksPerSecond));
}

void encode_attributes(const Attributes& attributes,
                       sns_std_attr_event* event) {
  for (const auto& [id, value] : attributes) {
    sns_std_attr* attribute = event->add_attributes();
    attribute->set_id(id);
    std::visit([&](const auto& v) { encode(v, attribute->mutable_value()); },
               value);
  }
}

void SampleEncoder::Encode(const VirtualSensor& sensor, Ticks due,
                           Ticks started, std::string* payload) {
  const Ticks changes = due / to_ticks(sensor.change_period);
  const auto accuracy = accuracy_at(sensor, due - started);
  const auto measure = [&](google::protobuf::RepeatedField<float>* values) {
    values->Clear();
    uint64_t seed = sensor.uid.low * 8;
    for (const Axis& axis : sensor.axes) {
      values->Add(value_at(axis, seed++, due, changes));
    }
  };
  switch (sensor.msg_id) {
    case vesk::kProximityEvent:
      proximity_.set_event_type(changes % 2 == 0 ? SNS_PROXIMITY_FAR
                                                 : SNS_PROXIMITY_NEAR);
      proximity_.set_raw_value(
          static_cast<uint32_t>(changes % 2 == 0 ? 12 : 850));
      proximity_.set_status(accuracy);
      measure(proximity_.mutable_values());
      proximity_.SerializeToString(payload);
      break;
    case vesk::kActivityEvent: {
      sns_activity_event event;
      event.set_state(static_cast<int32_t>(changes % 3));
      event.SerializeToString(payload);
      break;
    }
    case vesk::kInactivityEvent: {
      sns_inactivity_event event;
      event.set_state(static_cast<int32_t>(changes % 2));
      event.SerializeToString(payload);
      break;
    }
    case vesk::kVsyncEvent: {  // frame number, its time, exposure in us
      sns_camera_vsync_interrupt_info event;
      const double frame =
          static_cast<double>(due - started) * sensor.native_rate;
      event.set_value1(
          static_cast<uint64_t>(std::llround(frame / kTicksPerSecond)));
      event.set_value2(
          static_cast<uint64_t>(due / (kTicksPerSecond / 1000000)));
      event.set_value3(8333);
      event.SerializeToString(payload);
      break;
    }
    default:
      standard_.set_status(accuracy);
      measure(standard_.mutable_data());
      standard_.SerializeToString(payload);
      break;
  }
}

}  // namespace platform
