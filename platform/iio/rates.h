#ifndef PLATFORM_IIO_RATES_H_
#define PLATFORM_IIO_RATES_H_

#include <optional>
#include <string>
#include <vector>

#include "platform/iio/attribute.h"
#include "platform/iio/sensors.h"

namespace platform {

/// A polled sensor is not read more often, in Hz.
inline constexpr float kFastestPoll = 100;

/// The attributes that hold the sensor's rate: its channels' own, else the
/// device's, else its trigger's. None if there is no such attribute.
std::vector<Attribute> find_rates(const IioSensor& sensor);

/// What the kernel says that an attribute may be set to.
struct Choices {
  /// Those of a list, or the smallest, the step and the largest of a range;
  /// none if nothing is known.
  std::vector<double> values = {};
  bool is_range = false;
};

/// Reads "1 2 4" or "[1 1 4]". False if it is neither.
bool parse_choices(const std::string& text, Choices* choices);

/// The attribute that holds the choices for this one, if the kernel offers it.
std::optional<Attribute> find_choices(const Attribute& attribute);

/// Returns 0 or a negated errno code.
int read_choices(const Attribute& attribute, Choices* choices);

/// The smallest choice that is not below the request, else the largest, as
/// floats, which requests are; the request itself where nothing is known. In
/// Hz.
double choose_rate(const Choices& choices, float request);

}  // namespace platform

#endif  // PLATFORM_IIO_RATES_H_
