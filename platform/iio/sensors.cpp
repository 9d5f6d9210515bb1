#include "platform/iio/sensors.h"

#include <algorithm>
#include <cctype>
#include <map>
#include <utility>

namespace platform {
namespace {

struct Mapping {
  const char* type;  // the kernel's
  const char* datatype;
  double factor;
};

// The types that have another name or unit here.
constexpr Mapping kMappings[] = {
    {"anglvel", "gyro", 1},
    {"magn", "mag", 100},                    // gauss to microtesla
    {"pressure", "pressure", 10},            // kilopascal to hectopascal
    {"temp", "sensor_temperature", 0.001},   // millidegrees
    {"illuminance", "ambient_light", 1},     //
    {"humidityrelative", "humidity", 0.001}  // thousandths of a percent
};

std::string device_name(const iio_device* device) {
  const char* name = iio_device_get_name(device);
  return name != nullptr ? name : iio_device_get_id(device);
}

bool is_sensor_channel(const iio_channel* channel) {
  return !iio_channel_is_output(channel) &&
         iio_channel_get_type(channel) != IIO_TIMESTAMP &&
         (iio_channel_find_attr(channel, "raw") != nullptr ||
          iio_channel_find_attr(channel, "input") != nullptr);
}

// x, y and z come first, in this order.
int rank(const iio_channel* channel) {
  const iio_modifier modifier = iio_channel_get_modifier(channel);
  return modifier >= IIO_MOD_X && modifier <= IIO_MOD_Z ? modifier
                                                        : IIO_MOD_Z + 1;
}

// Channels with the same one are one sensor's: "accel" of accel_x, "temp1".
std::string sensor_key(const iio_channel* channel) {
  const std::string id = iio_channel_get_id(channel);
  return iio_channel_get_modifier(channel) == IIO_NO_MOD
             ? id
             : id.substr(0, id.find('_'));
}

uint64_t hash(const std::string& text) {
  uint64_t value = 0xcbf29ce484222325;
  for (const char c : text) {
    value = (value ^ static_cast<unsigned char>(c)) * 0x100000001b3;
  }
  return value;
}

IioSensor make_sensor(iio_device* device, const std::string& key) {
  const auto end =
      std::find_if_not(key.begin(), key.end(),
                       [](unsigned char c) { return std::isalpha(c) != 0; });
  IioSensor sensor = {};
  sensor.device = device;
  sensor.datatype = {key.begin(), end};
  sensor.name = device_name(device);
  sensor.factor = 1;
  const std::string identity =
      std::string(iio_device_get_id(device)) + ' ' + sensor.name + ' ' + key;
  sensor.uid = {hash(identity), hash(identity + ' ')};
  for (const Mapping& mapping : kMappings) {
    if (sensor.datatype != mapping.type) continue;
    sensor.datatype = mapping.datatype;
    sensor.factor = mapping.factor;
    break;
  }
  return sensor;
}

bool is_in_buffer(const IioSensor& sensor) {
  return std::all_of(sensor.channels.begin(), sensor.channels.end(),
                     iio_channel_is_scan_element) &&
         find_trigger(sensor.device).has_value();
}

std::vector<IioSensor> sensors_of(iio_device* device) {
  // By length first, so that 10 comes after 9.
  std::map<std::pair<size_t, std::string>, std::vector<iio_channel*>> groups;
  for (unsigned i = 0; i < iio_device_get_channels_count(device); ++i) {
    iio_channel* channel = iio_device_get_channel(device, i);
    if (!is_sensor_channel(channel)) continue;
    const std::string key = sensor_key(channel);
    groups[{key.size(), key}].push_back(channel);
  }
  std::vector<IioSensor> sensors;
  for (auto& [key, channels] : groups) {
    std::stable_sort(
        channels.begin(), channels.end(),
        [](const auto* a, const auto* b) { return rank(a) < rank(b); });
    IioSensor& sensor = sensors.emplace_back(make_sensor(device, key.second));
    sensor.channels = std::move(channels);
    sensor.buffered = is_in_buffer(sensor);
  }
  return sensors;
}

}  // namespace

std::vector<IioSensor> find_sensors(const iio_context* context) {
  std::vector<IioSensor> all;
  std::map<std::string, int> devices;  // of a name
  for (unsigned i = 0; i < iio_context_get_devices_count(context); ++i) {
    iio_device* device = iio_context_get_device(context, i);
    // The sensors of the computer itself are none of ours.
    if (iio_device_is_hwmon(device) || iio_device_is_trigger(device)) continue;
    const std::vector<IioSensor> sensors = sensors_of(device);
    if (!sensors.empty()) ++devices[sensors[0].name];
    all.insert(all.end(), sensors.begin(), sensors.end());
  }
  std::map<std::string, long> counts;  // of a datatype
  for (IioSensor& sensor : all) {
    sensor.index = counts[sensor.datatype]++;
    if (devices[sensor.name] == 1) continue;
    sensor.name += std::string(" (") + iio_device_get_id(sensor.device) + ')';
  }
  return all;
}

std::optional<const iio_device*> find_trigger(const iio_device* device) {
  const iio_device* current = nullptr;
  const int status = iio_device_get_trigger(device, &current);
  if (status < 0 || current != nullptr) return current;
  const iio_context* context = iio_device_get_context(device);
  const std::string id = iio_device_get_id(device);
  const std::string own = "-dev" + id.substr(id.find_first_of("0123456789"));
  const std::string name = device_name(device);
  for (unsigned i = 0; i < iio_context_get_devices_count(context); ++i) {
    const iio_device* trigger = iio_context_get_device(context, i);
    if (!iio_device_is_trigger(trigger)) continue;
    const std::string its_name = device_name(trigger);
    if (!its_name.starts_with(name)) continue;
    const std::string rest = its_name.substr(name.size());
    // One of another device of this name has that device's number.
    const bool is_other = rest.starts_with("-dev") && rest != own;
    if (rest.empty() || (rest[0] == '-' && !is_other)) return trigger;
  }
  return std::nullopt;
}

std::vector<Attribute> rate_attributes(const IioSensor& sensor) {
  std::vector<Attribute> found;
  Attribute attribute;
  for (iio_channel* channel : sensor.channels) {
    if (!find_attribute(sensor.device, channel, "sampling_frequency",
                        &attribute)) {
      continue;
    }
    const std::string file = attribute.FileName();
    // Channels may share it.
    if (std::none_of(found.begin(), found.end(), [&](const Attribute& other) {
          return other.FileName() == file;
        })) {
      found.push_back(attribute);
    }
  }
  if (!found.empty() || !sensor.buffered) return found;
  const iio_device* trigger = find_trigger(sensor.device).value_or(nullptr);
  if (trigger == nullptr) return found;
  // libiio finds devices as ones that can be changed.
  iio_device* device = iio_context_find_device(
      iio_device_get_context(sensor.device), iio_device_get_id(trigger));
  if (find_attribute(device, nullptr, "sampling_frequency", &attribute)) {
    found.push_back(attribute);
  }
  return found;
}

Attribute value_attribute(const IioSensor& sensor, iio_channel* channel) {
  const bool raw = iio_channel_find_attr(channel, "raw") != nullptr;
  return {Attribute::kChannel, sensor.device, channel, raw ? "raw" : "input"};
}

int read_scale(const IioSensor& sensor, iio_channel* channel, double* offset,
               double* gain) {
  *offset = 0;
  *gain = 1;
  int status = 0;
  if (value_attribute(sensor, channel).name == "raw") {
    Attribute attribute;
    if (find_attribute(sensor.device, channel, "offset", &attribute)) {
      status = attribute.ReadNumber(offset);
    }
    if (status == 0 &&
        find_attribute(sensor.device, channel, "scale", &attribute)) {
      status = attribute.ReadNumber(gain);
    }
  }
  *gain *= sensor.factor;
  return status;
}

}  // namespace platform
