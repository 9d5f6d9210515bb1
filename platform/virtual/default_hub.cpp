#include <string_view>

#include "platform/virtual/hub_model.h"

namespace platform {
namespace {

using Floats = std::vector<float>;
using Longs = std::vector<long>;
using Texts = std::vector<std::string>;

// A sensor of the default hub, as far as it differs from the others.
struct Row {
  const char* name;
  const char* datatype;
  long index;
  const char* display_name;
  Floats rates = {};  // Hz; none: it does not list them
  sns_std_sensor_stream_type type = SNS_STREAM_TYPE_STREAMING;
  int msg_id = vesk::kSensorEvent;
  std::vector<Axis> axes = {};
  Range range = {};  // the selected one; empty: none
  float resolution = 0;
  long active_current = 0;  // microamperes
  long fifo_size = 64;
  float change_period = 1;  // seconds
  float seconds_per_accuracy = 0;
  float resident_rate = 0;
  bool physical = true;
};

const Floats kImuRates = {12.5f, 25, 50, 100, 200, 400};
const Floats kSlowRates = {1, 5, 10};

std::vector<Row> rows() {
  constexpr auto kOnChange = SNS_STREAM_TYPE_ON_CHANGE;
  constexpr auto kOneShot = SNS_STREAM_TYPE_SINGLE_OUTPUT;
  return {
      {.name = "imu_a",
       .datatype = "accel",
       .index = 0,
       .display_name = "Accelerometer A",
       .rates = kImuRates,
       .axes = {{.base = 0.12f, .swing = 0.3f, .period = 2.9f, .noise = 0.02f},
                {.base = -0.31f, .swing = 0.2f, .period = 3.7f, .noise = 0.02f},
                {.base = 9.79f, .swing = 0.1f, .period = 1.3f, .noise = 0.02f}},
       .range = {-39.2266f, 39.2266f},
       .resolution = 0.001197f,
       .active_current = 240,
       .fifo_size = 512,
       .resident_rate = 12.5f},
      {.name = "imu_a",
       .datatype = "gyro",
       .index = 0,
       .display_name = "Gyroscope A",
       .rates = kImuRates,
       .axes = {{.swing = 0.02f, .period = 2.1f, .noise = 0.003f},
                {.swing = 0.01f, .period = 4.3f, .noise = 0.003f},
                {.base = 0.004f, .swing = 0.03f, .period = 5.9f}},
       .range = {-34.9066f, 34.9066f},
       .resolution = 0.001065f,
       .active_current = 610,
       .fifo_size = 512},
      {.name = "imu_a",
       .datatype = "sensor_temperature",
       .index = 0,
       .display_name = "IMU A temperature",
       .rates = kSlowRates,
       .axes = {{.base = 31.5f, .swing = 0.4f, .period = 47, .noise = 0.06f}},
       .resolution = 0.0625f,
       .active_current = 12},
      {.name = "imu_b",
       .datatype = "accel",
       .index = 1,
       .display_name = "Accelerometer B",
       .rates = kImuRates,
       .axes = {{.base = -0.2f, .swing = 0.3f, .period = 2.9f, .noise = 0.05f},
                {.base = 0.27f, .swing = 0.2f, .period = 3.7f, .noise = 0.05f},
                {.base = 9.86f, .swing = 0.1f, .period = 1.3f, .noise = 0.05f}},
       .range = {-78.4532f, 78.4532f},
       .resolution = 0.002394f,
       .active_current = 180,
       .fifo_size = 256},
      {.name = "imu_b",
       .datatype = "gyro",
       .index = 1,
       .display_name = "Gyroscope B",
       .rates = kImuRates,
       .axes = {{.swing = 0.02f, .period = 2.1f, .noise = 0.006f},
                {.swing = 0.01f, .period = 4.3f, .noise = 0.006f},
                {.swing = 0.03f, .period = 5.9f, .noise = 0.006f}},
       .range = {-17.4533f, 17.4533f},
       .resolution = 0.000533f,
       .active_current = 480,
       .fifo_size = 256},
      {.name = "imu_b",
       .datatype = "sensor_temperature",
       .index = 1,
       .display_name = "IMU B temperature",
       .rates = kSlowRates,
       .axes = {{.base = 33.2f, .swing = 0.6f, .period = 61, .noise = 0.12f}},
       .resolution = 0.125f,
       .active_current = 9},
      {.name = "mag_a",
       .datatype = "mag",
       .index = 0,
       .display_name = "Magnetometer A",
       .rates = {10, 20, 50, 100},
       .axes = {{.base = 21.4f, .swing = 1.5f, .period = 7, .noise = 0.3f},
                {.base = -4.8f, .swing = 1.5f, .period = 9, .noise = 0.3f},
                {.base = -43.1f, .swing = 1.5f, .period = 11, .noise = 0.3f}},
       .range = {-4912, 4912},
       .resolution = 0.15f,
       .active_current = 350,
       .seconds_per_accuracy = 0.625f},
      {.name = "baro_a",
       .datatype = "pressure",
       .index = 0,
       .display_name = "Barometer A",
       .rates = {1, 5, 10, 25},
       .axes = {{.base = 1009.6f, .swing = 0.2f, .period = 83, .noise = 0.03f}},
       .range = {0, 1250},
       .resolution = 0.0017f,
       .active_current = 45},
      {.name = "baro_a",
       .datatype = "sensor_temperature",
       .index = 2,
       .display_name = "Barometer A temperature",
       .rates = kSlowRates,
       .axes = {{.base = 29.8f, .swing = 0.3f, .period = 71, .noise = 0.01f}},
       .resolution = 0.01f,
       .active_current = 5},
      {.name = "light_a",
       .datatype = "ambient_light",
       .index = 0,
       .display_name = "Light A",
       .rates = {5, 10},
       .axes = {{.base = 320, .swing = 140, .period = 19, .noise = 2}},
       .resolution = 0.05f,
       .active_current = 90},
      {.name = "light_a",
       .datatype = "ambient_light",
       .index = 0,
       .display_name = "Light A on change",
       .type = kOnChange,
       .axes = {{.base = 320, .swing = 140, .period = 19, .noise = 2}},
       .resolution = 0.05f,
       .active_current = 60,
       .change_period = 0.8f},
      {.name = "prox_a",
       .datatype = "proximity",
       .index = 0,
       .display_name = "Proximity A",
       .rates = {5, 10},
       .msg_id = vesk::kProximityEvent,
       .axes = {{.base = 0.4f, .swing = 0.1f, .period = 6}},
       .active_current = 110,
       .change_period = 3},
      {.name = "prox_a",
       .datatype = "proximity",
       .index = 0,
       .display_name = "Proximity A on change",
       .type = kOnChange,
       .msg_id = vesk::kProximityEvent,
       .axes = {{.base = 0.4f, .swing = 0.1f, .period = 6}},
       .active_current = 70,
       .change_period = 1.5f},
      {.name = "vsync_a",
       .datatype = "camera_vsync",
       .index = 0,
       .display_name = "Rear camera vsync",
       .msg_id = vesk::kVsyncEvent},
      {.name = "vsync_a",
       .datatype = "camera_vsync",
       .index = 1,
       .display_name = "Wide camera vsync",
       .msg_id = vesk::kVsyncEvent},
      {.name = "vsync_a",
       .datatype = "camera_vsync",
       .index = 2,
       .display_name = "Front camera vsync",
       .msg_id = vesk::kVsyncEvent},
      {.name = "motion_core",
       .datatype = "activity",
       .index = 0,
       .display_name = "Activity",
       .type = kOnChange,
       .msg_id = vesk::kActivityEvent,
       .change_period = 2,
       .physical = false},
      {.name = "motion_core",
       .datatype = "inactivity",
       .index = 0,
       .display_name = "Inactivity",
       .type = kOnChange,
       .msg_id = vesk::kInactivityEvent,
       .change_period = 2.5f,
       .physical = false},
      {.name = "motion_core",
       .datatype = "step_count",
       .index = 0,
       .display_name = "Step counter",
       .type = kOnChange,
       .axes = {{.step = 1}},
       .change_period = 0.55f,
       .physical = false},
      {.name = "motion_core",
       .datatype = "gravity",
       .index = 0,
       .display_name = "Gravity",
       .rates = {25, 50, 100},
       .axes = {{.base = 0.11f, .swing = 0.01f, .period = 13},
                {.base = -0.3f, .swing = 0.01f, .period = 17},
                {.base = 9.8f, .swing = 0.002f, .period = 19}},
       .physical = false},
      {.name = "motion_core",
       .datatype = "significant_motion",
       .index = 0,
       .display_name = "Significant motion",
       .type = kOneShot,
       .axes = {{.base = 1}},
       .change_period = 0.3f,
       .physical = false},
  };
}

// FNV-1a.
uint64_t hash(std::string_view text, uint64_t seed) {
  uint64_t value = 0xcbf29ce484222325 ^ seed;
  for (const char c : text) {
    value = (value ^ static_cast<unsigned char>(c)) * 0x100000001b3;
  }
  return value;
}

// The same UID for the same sensor in every build.
vesk::SensorUid uid_of(const Row& row) {
  const std::string key = std::string(row.name) + '/' + row.datatype + '/' +
                          std::to_string(row.index) + '/' +
                          std::to_string(row.type);
  return {hash(key, 0x6c6f77), hash(key, 0x68696768)};
}

// The largest size of an encoded event's payload, in bytes, or a little more.
long event_size(const Row& row) {
  const long values = 8 + 4 * static_cast<long>(row.axes.size());
  switch (row.msg_id) {
    case vesk::kProximityEvent:
      return values + 8;
    case vesk::kVsyncEvent:
      return 33;
    default:
      return values;
  }
}

Attributes attributes_of(const Row& row) {
  const std::string name = row.name;
  Attributes attributes = {
      {SNS_ATTR_DATATYPE, row.datatype},
      {SNS_ATTR_VENDOR, row.physical ? "Aldermoor" : "fennick"},
      {SNS_ATTR_NAME, name},
      {SNS_ATTR_DISPLAY_NAME, row.display_name},
      {SNS_ATTR_API,
       Texts{row.msg_id == vesk::kSensorEvent ? "standard" : row.datatype}},
      {SNS_ATTR_AVAILABLE, true},
      {SNS_ATTR_DYNAMIC, false},
      {SNS_ATTR_EVENT_SIZE, event_size(row)},
      {SNS_ATTR_FIFO_SIZE, row.fifo_size},
      {SNS_ATTR_HW_ID, row.index},
      {SNS_ATTR_PASSIVE_REQUEST, true},
      {SNS_ATTR_PHYSICAL_SENSOR, row.physical},
      {SNS_ATTR_STREAM_SYNC, row.msg_id == vesk::kVsyncEvent},
      {SNS_ATTR_STREAM_TYPE, static_cast<long>(row.type)},
      {SNS_ATTR_VERSION, 65538L},
  };
  if (row.physical) {
    attributes[SNS_ATTR_DRI] = row.type != SNS_STREAM_TYPE_STREAMING;
    attributes[SNS_ATTR_PHYSICAL_SENSOR_TESTS] = Longs{0, 2};
    attributes[SNS_ATTR_PLACEMENT] =
        Floats{1, 0, 0, 0, 1, 0, 0, 0, 1, 12.5f, -31, 4.25f};
    attributes[SNS_ATTR_RIGID_BODY] = static_cast<long>(SNS_RIGID_BODY_DISPLAY);
  }
  if (row.active_current > 0) {
    attributes[SNS_ATTR_ACTIVE_CURRENT] =
        Longs{row.active_current / 4, row.active_current};
    attributes[SNS_ATTR_SLEEP_CURRENT] = row.active_current / 40;
    attributes[SNS_ATTR_OP_MODES] = Texts{"LPM", "NORMAL", "OFF"};
  }
  if (!row.rates.empty()) attributes[SNS_ATTR_RATES] = row.rates;
  if (row.rates.size() >= 5) {
    attributes[SNS_ATTR_LOW_LATENCY_RATES] = Floats{800};
  }
  if (row.range != Range()) {
    attributes[SNS_ATTR_RANGES] = std::vector<Range>{
        {row.range.first / 2, row.range.second / 2}, row.range};
    attributes[SNS_ATTR_SELECTED_RANGE] = row.range;
  }
  if (row.resolution > 0) {
    attributes[SNS_ATTR_RESOLUTIONS] =
        Floats{row.resolution / 2, row.resolution};
    attributes[SNS_ATTR_SELECTED_RESOLUTION] = row.resolution;
  }
  return attributes;
}

}  // namespace

HubModel default_hub() {
  HubModel model;
  for (const Row& row : rows()) {
    model.push_back({.uid = uid_of(row),
                     .datatype = row.datatype,
                     .attributes = attributes_of(row),
                     .msg_id = row.msg_id,
                     .axes = row.axes,
                     .change_period = row.change_period,
                     .seconds_per_accuracy = row.seconds_per_accuracy,
                     .resident_rate = row.resident_rate});
  }
  return model;
}

}  // namespace platform
