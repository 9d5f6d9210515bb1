#include <algorithm>
#include <cerrno>
#include <cmath>

#include "platform/iio/sensors.h"

// What sensors say of themselves.

namespace platform {
namespace {

std::string available(const Attribute& attribute) {
  return attribute.name + "_available";
}

// The values that the kernel lists for an attribute; none if it lists none.
// Of a range [min step max] all three, and `*is_range` is set.
int read_available(const Attribute& of, std::vector<double>* values,
                   bool* is_range) {
  values->clear();
  *is_range = false;
  Attribute list;
  if (!find_attribute(of.device, of.channel, available(of).c_str(), &list)) {
    return 0;
  }
  std::string text;
  const int status = list.Read(&text);
  if (status != 0) return list.Report(status);
  *is_range = text.starts_with('[');
  return list.ReadNumbers(values);
}

// The same for people, with the two ends of a range.
int read_choices(const Attribute& of, std::vector<double>* values) {
  bool is_range = false;
  const int status = read_available(of, values, &is_range);
  if (is_range && values->size() == 3) values->erase(values->begin() + 1);
  return status;
}

int read_rates(const IioSensor& sensor, std::vector<double>* rates) {
  const std::vector<Attribute> attributes = rate_attributes(sensor);
  rates->clear();
  if (attributes.empty()) {
    if (!sensor.buffered) *rates = {1, 5, 10, 25, 50, kFastestPoll};
    return 0;
  }
  const int status = read_choices(attributes[0], rates);
  if (status != 0 || !rates->empty()) return status;
  return attributes[0].ReadNumbers(rates);
}

// The matrix of the sensor, else of the device.
int read_mount_matrix(const IioSensor& sensor, std::vector<double>* matrix) {
  matrix->clear();
  Attribute attribute;
  bool found = find_attribute(sensor.device, sensor.channels[0], "mount_matrix",
                              &attribute);
  // As libiio takes in_mount_matrix apart.
  iio_channel* mount = iio_device_find_channel(sensor.device, "mount", false);
  if (!found && mount != nullptr) {
    found = find_attribute(sensor.device, mount, "matrix", &attribute);
  }
  if (!found) return 0;
  const int status = attribute.ReadNumbers(matrix);
  if (status != 0 || matrix->size() == 9) return status;
  return attribute.Report(-EINVAL);
}

}  // namespace

int choose_rate(const Attribute& attribute, double request, double* rate,
                bool* is_listed) {
  std::vector<double> rates;
  bool is_range = false;
  const int status = read_available(attribute, &rates, &is_range);
  *rate = request;
  *is_listed = !rates.empty();
  if (status != 0 || rates.empty()) return status;
  if (is_range && rates.size() == 3 && rates[1] > 0) {
    const double steps = std::ceil((request - rates[0]) / rates[1]);
    *rate = std::min(rates[0] + std::max(steps, 0.0) * rates[1], rates[2]);
    return 0;
  }
  std::sort(rates.begin(), rates.end());
  const auto at_least = std::lower_bound(rates.begin(), rates.end(), request);
  *rate = at_least != rates.end() ? *at_least : rates.back();
  return 0;
}

int read_attributes(const IioSensor& sensor, sns_std_attr_event* event) {
  const auto add = [event](sns_std_attr_id id) {
    sns_std_attr* attribute = event->add_attributes();
    attribute->set_id(id);
    return attribute->mutable_value();
  };
  const auto add_numbers = [&](sns_std_attr_id id, double factor,
                               const std::vector<double>& numbers) {
    if (numbers.empty()) return;
    sns_std_attr_numbers* list = add(id)->mutable_numbers();
    for (const double x : numbers) {
      list->add_items(static_cast<float>(x * factor));
    }
  };
  const char* label = iio_device_get_label(sensor.device);
  add(SNS_ATTR_DATATYPE)->set_text(sensor.datatype);
  add(SNS_ATTR_NAME)->set_text(sensor.name);
  add(SNS_ATTR_DISPLAY_NAME)
      ->set_text(label != nullptr ? label
                                  : sensor.name + ' ' + sensor.datatype);
  add(SNS_ATTR_AVAILABLE)->set_flag(true);
  add(SNS_ATTR_DYNAMIC)->set_flag(false);
  add(SNS_ATTR_PHYSICAL_SENSOR)->set_flag(true);
  add(SNS_ATTR_PASSIVE_REQUEST)->set_flag(false);
  add(SNS_ATTR_STREAM_TYPE)->set_integer(SNS_STREAM_TYPE_STREAMING);
  add(SNS_ATTR_HW_ID)->set_integer(sensor.index);

  std::vector<double> numbers;
  int status = read_rates(sensor, &numbers);
  if (status != 0) return status;
  add_numbers(SNS_ATTR_RATES, 1, numbers);
  status = read_mount_matrix(sensor, &numbers);
  if (status != 0) return status;
  if (!numbers.empty()) numbers.resize(12);  // no position is known
  add_numbers(SNS_ATTR_PLACEMENT, 1, numbers);

  Attribute scale;
  if (!find_attribute(sensor.device, sensor.channels[0], "scale", &scale)) {
    return 0;
  }
  double present = 0;
  status = scale.ReadNumber(&present);
  if (status == 0) status = read_choices(scale, &numbers);
  if (status != 0) return status;
  add(SNS_ATTR_SELECTED_RESOLUTION)
      ->set_number(static_cast<float>(present * sensor.factor));
  add_numbers(SNS_ATTR_RESOLUTIONS, sensor.factor, numbers);
  return 0;
}

}  // namespace platform
