#ifndef PLATFORM_VIRTUAL_HUB_MODEL_H_
#define PLATFORM_VIRTUAL_HUB_MODEL_H_

#include <cstdint>
#include <limits>
#include <map>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "hub/message_ids.h"
#include "hub/sensor_uid.h"
#include "hub/sns_messages.pb.h"

// A virtual hub as data: its sensors, what they say of themselves, what they
// measure and what is wrong with them.
namespace platform {

/// Hub time, in ticks of the hub's clock since its epoch.
using Ticks = int64_t;
inline constexpr Ticks kTicksPerSecond = 25'000'000;
inline constexpr Ticks kNever = std::numeric_limits<Ticks>::max();

using Range = std::pair<float, float>;
using AttrValue = std::variant<bool, long, float, std::string, Range,
                               std::vector<long>, std::vector<float>,
                               std::vector<std::string>, std::vector<Range>>;
using Attributes = std::map<sns_std_attr_id, AttrValue>;

/// One measured value: base + swing * triangle wave + noise + step * (number
/// of changes since the epoch). A pure function of hub time, in arithmetic
/// that every architecture rounds alike.
struct Axis {
  float base = 0;
  float swing = 0;
  float period = 1;  // seconds
  float noise = 0;   // largest deviation, uniform
  float step = 0;
};

struct VirtualSensor {
  vesk::SensorUid uid = {};
  std::string datatype;  // the one under which a lookup finds it
  // Stream type, rates and FIFO size are also what the sensor goes by.
  Attributes attributes = {};
  int msg_id = vesk::kSensorEvent;  // what its events are
  std::vector<Axis> axes = {};
  float native_rate = 30;          // Hz; if it lists no rates
  float change_period = 1;         // seconds from change to change, or from
                                   // the enabling to a one-shot's event
  float seconds_per_accuracy = 0;  // from level to level; 0: highest at once
  float resident_rate = 0;         // Hz at which the device itself keeps it on
  int load_status = 0;             // a fault: what loading its attributes gives
};

using HubModel = std::vector<VirtualSensor>;

/// The hub of a device with the usual sensors, of invented parts.
HubModel default_hub();

/// Adds `attributes` to an attribute list.
void encode_attributes(const Attributes& attributes, sns_std_attr_event* event);

/// Encodes samples, without an allocation once it has encoded some of each
/// size.
class SampleEncoder {
 public:
  /// Sets `*payload` to that of the sample that is due at `due`, from a sensor
  /// that runs since `started`.
  void Encode(const VirtualSensor& sensor, Ticks due, Ticks started,
              std::string* payload);

 private:
  // Those that hold lists, kept for their memory.
  sns_std_sensor_event standard_;
  sns_proximity_event proximity_;
};

/// A duration in ticks, at least one.
Ticks to_ticks(double seconds);

}  // namespace platform

#endif  // PLATFORM_VIRTUAL_HUB_MODEL_H_
