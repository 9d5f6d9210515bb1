#include "platform/iio/sensors.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <cerrno>
#include <map>
#include <utility>

#include "platform/iio/attribute.h"

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

// libiio reads a scan wrongly that has a value of several numbers.
bool is_readable(const iio_channel* channel) {
  if (!iio_channel_is_scan_element(channel)) return false;
  const iio_data_format& format = *iio_channel_get_data_format(channel);
  return format.length >= 8 && format.length <= 64 && format.length % 8 == 0 &&
         format.bits >= 1 && format.bits + format.shift <= format.length &&
         format.repeat <= 1;
}

// A file or a daemon may say anything about a channel's format, and libiio
// divides by its size if the channel is a part of the scan. What is, a daemon
// says, too.
bool is_harmless(const iio_channel* channel) {
  const iio_data_format& format = *iio_channel_get_data_format(channel);
  return !iio_channel_is_scan_element(channel) ||
         (format.length >= 8 && format.length <= 4096 && format.repeat >= 1 &&
          format.repeat <= 4096);
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

bool is_buffered(const IioSensor& sensor) {
  const iio_device* trigger = nullptr;
  return std::all_of(sensor.channels.begin(), sensor.channels.end(),
                     is_readable) &&
         find_timestamps(sensor.device) != nullptr &&
         find_trigger(sensor.device, &trigger);
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
    sensor.buffered = is_buffered(sensor);
  }
  return sensors;
}

}  // namespace

std::vector<IioSensor> find_sensors(const iio_context* context) {
  std::vector<IioSensor> all;
  if (context == nullptr) return all;
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

iio_channel* find_timestamps(iio_device* device) {
  if (iio_device_find_attr(device, kTimestampClock) == nullptr) return nullptr;
  iio_channel* found = nullptr;
  for (unsigned i = 0; i < iio_device_get_channels_count(device); ++i) {
    iio_channel* channel = iio_device_get_channel(device, i);
    if (!is_harmless(channel)) return nullptr;
    if (iio_channel_get_type(channel) == IIO_TIMESTAMP &&
        is_readable(channel) &&
        iio_channel_get_data_format(channel)->length == 64) {
      found = channel;
    }
  }
  return found;
}

bool find_trigger(iio_device* device, const iio_device** trigger) {
  *trigger = nullptr;
  std::string current;
  const int status = trigger_attribute(device).Read(&current);
  // A device that works without a trigger has no such file.
  if (status == -ENOENT || status == -ENOSYS) return true;
  *trigger = status != 0 || current.empty()
                 ? find_own_trigger(device)
                 : iio_context_find_device(iio_device_get_context(device),
                                           current.c_str());
  return *trigger != nullptr;
}

const iio_device* find_own_trigger(const iio_device* device) {
  const iio_context* context = iio_device_get_context(device);
  const std::string name = device_name(device);
  const std::string id = iio_device_get_id(device);  // such as iio:device3
  const std::string number = id.substr(id.find_last_not_of("0123456789") + 1);
  // A driver may make further triggers, for events such as a motion.
  const std::array<std::string, 3> names = {name + ("-dev" + number), name,
                                            name + "-trigger"};
  for (const std::string& own : names) {
    for (unsigned i = 0; i < iio_context_get_devices_count(context); ++i) {
      const iio_device* trigger = iio_context_get_device(context, i);
      if (iio_device_is_trigger(trigger) && device_name(trigger) == own) {
        return trigger;
      }
    }
  }
  return nullptr;
}

}  // namespace platform
