#ifndef PLATFORM_IIO_SENSORS_H_
#define PLATFORM_IIO_SENSORS_H_

#include <iio.h>

#include <optional>
#include <string>
#include <vector>

#include "hub/sensor_uid.h"
#include "hub/sns_messages.pb.h"
#include "platform/iio/attribute.h"

namespace platform {

/// A polled sensor is not read more often, in Hz.
inline constexpr double kFastestPoll = 100;

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
  bool buffered;  // else it is polled
};

/// The sensors of a context, device by device.
std::vector<IioSensor> find_sensors(const iio_context* context);

/// Fills `*event`. Reports its failures and returns 0 or a negated errno code.
int read_attributes(const IioSensor& sensor, sns_std_attr_event* event);

/// What a buffered capture of the device is set off by; null if the device
/// needs none, nothing if there is none.
std::optional<const iio_device*> find_trigger(const iio_device* device);

/// The attributes that hold the sensor's rate: its channels' own, else the
/// device's, else its trigger's. None if there is no such attribute.
std::vector<Attribute> rate_attributes(const IioSensor& sensor);

/// Finds the rate to set for a request: the smallest supported one that is not
/// below it, else the largest; the request itself, with `*is_listed` false,
/// where the kernel does not list what it supports. Reports its failures and
/// returns 0 or a negated errno code.
int choose_rate(const Attribute& attribute, double request, double* rate,
                bool* is_listed);

/// Finds what a channel's value is multiplied with after `*offset` was added.
/// Reports its failures and returns 0 or a negated errno code.
int read_scale(const IioSensor& sensor, iio_channel* channel, double* offset,
               double* gain);

/// The attribute that holds a channel's value.
Attribute value_attribute(const IioSensor& sensor, iio_channel* channel);

}  // namespace platform

#endif  // PLATFORM_IIO_SENSORS_H_
