#ifndef PLATFORM_IIO_SENSORS_H_
#define PLATFORM_IIO_SENSORS_H_

#include <iio.h>

#include <string>
#include <vector>

#include "hub/sensor_uid.h"
#include "hub/sns_messages.pb.h"

namespace platform {

/// The attribute of a device that says which clock its timestamps are of.
inline constexpr char kTimestampClock[] = "current_timestamp_clock";

/// A sensor: the channels of a device that belong together, in the order of
/// its values. All of it belongs to the context.
struct IioSensor {
  vesk::SensorUid uid;
  iio_device* device;
  std::vector<iio_channel*> channels;
  std::string datatype;
  std::string name;
  double factor;  // from the kernel's unit to the datatype's
  long index;     // among those of the datatype
  bool buffered;  // captured through the device's buffer; else it is polled
};

/// The sensors of a context (none if that is null), device by device.
std::vector<IioSensor> find_sensors(const iio_context* context);

/// What the sensor says of itself. What the kernel offers but does not give is
/// left out, and logged as a warning.
sns_std_attr_event read_attributes(const IioSensor& sensor);

/// The timestamp among the device's scan elements; null if there is none, if
/// its clock cannot be chosen, or if libiio could not cope with the others.
iio_channel* find_timestamps(iio_device* device);

/// Finds the trigger that a capture of the device is set off by: the current
/// one, else its own. `*trigger` is null if the device needs none. False if it
/// needs one and there is none.
bool find_trigger(iio_device* device, const iio_device** trigger);

/// The trigger that the device's own driver has made, by its name; null if
/// there is none.
const iio_device* find_own_trigger(const iio_device* device);

}  // namespace platform

#endif  // PLATFORM_IIO_SENSORS_H_
