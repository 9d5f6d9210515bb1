#include <cerrno>

#include "platform/iio/attribute.h"
#include "platform/iio/rates.h"
#include "platform/iio/sensors.h"

// What sensors say of themselves. A sensor runs without any of it, so that an
// attribute that cannot be read is only left out; on real boards that is
// common.

namespace platform {
namespace {

using Numbers = std::vector<double>;

// The attribute's numbers, as many as there have to be (0: any); else none,
// with a warning.
Numbers read_if_possible(const Attribute& attribute, size_t count) {
  Numbers numbers;
  int status = attribute.ReadNumbers(&numbers);
  if (status == 0 && count != 0 && numbers.size() != count) status = -EINVAL;
  if (status == 0) return numbers;
  attribute.Report(status, vesk::kWarning);
  return {};
}

// What the attribute may be set to, of a range the two ends.
Numbers read_choices_if_possible(const Attribute& attribute) {
  const auto list = find_choices(attribute);
  if (!list.has_value()) return {};
  Choices choices;
  const int status = read_choices(*list, &choices);
  if (status != 0) {
    list->Report(status, vesk::kWarning);
    return {};
  }
  if (!choices.is_range) return choices.values;
  return {choices.values[0], choices.values[2]};
}

Numbers read_rates(const IioSensor& sensor) {
  const std::vector<Attribute> attributes = find_rates(sensor);
  Numbers rates;
  if (!attributes.empty()) {
    rates = read_choices_if_possible(attributes[0]);
    if (rates.empty()) rates = read_if_possible(attributes[0], 1);
  }
  if (rates.empty() && !sensor.buffered) {
    rates = {1, 5, 10, 25, 50, kFastestPoll};
  }
  return rates;
}

Numbers read_placement(const IioSensor& sensor) {
  const auto matrix =
      find_attribute(sensor.device, sensor.channels[0], "mount_matrix");
  if (!matrix.has_value()) return {};
  Numbers placement = read_if_possible(*matrix, 9);
  if (!placement.empty()) placement.resize(12);  // no position is known
  return placement;
}

}  // namespace

sns_std_attr_event read_attributes(const IioSensor& sensor) {
  sns_std_attr_event event;
  const auto add = [&event](sns_std_attr_id id) {
    sns_std_attr* attribute = event.add_attributes();
    attribute->set_id(id);
    return attribute->mutable_value();
  };
  const auto add_numbers = [&](sns_std_attr_id id, double factor,
                               const Numbers& numbers) {
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
  add_numbers(SNS_ATTR_RATES, 1, read_rates(sensor));
  add_numbers(SNS_ATTR_PLACEMENT, 1, read_placement(sensor));

  const auto scale = find_attribute(sensor.device, sensor.channels[0], "scale");
  if (!scale.has_value()) return event;
  const Numbers present = read_if_possible(*scale, 1);
  if (!present.empty()) {
    add(SNS_ATTR_SELECTED_RESOLUTION)
        ->set_number(static_cast<float>(present[0] * sensor.factor));
  }
  add_numbers(SNS_ATTR_RESOLUTIONS, sensor.factor,
              read_choices_if_possible(*scale));
  return event;
}

}  // namespace platform
