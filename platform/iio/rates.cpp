#include "platform/iio/rates.h"

#include <algorithm>
#include <cerrno>
#include <cmath>

namespace platform {
namespace {

constexpr char kRate[] = "sampling_frequency";

// Channels may share an attribute.
void add_once(const Attribute& attribute, std::vector<Attribute>* attributes) {
  const std::string file = attribute.FileName();
  for (const Attribute& other : *attributes) {
    if (other.FileName() == file) return;
  }
  attributes->push_back(attribute);
}

}  // namespace

std::vector<Attribute> find_rates(const IioSensor& sensor) {
  std::vector<Attribute> found;
  for (iio_channel* channel : sensor.channels) {
    const auto rate = find_attribute(sensor.device, channel, kRate);
    if (rate.has_value()) add_once(*rate, &found);
  }
  const iio_device* trigger = nullptr;
  if (!found.empty() || !sensor.buffered ||
      !find_trigger(sensor.device, &trigger) || trigger == nullptr) {
    return found;
  }
  // The context has it as a device that can be changed, too.
  iio_device* const device = iio_context_find_device(
      iio_device_get_context(trigger), iio_device_get_id(trigger));
  const auto rate = find_attribute(device, nullptr, kRate);
  if (rate.has_value()) found.push_back(*rate);
  return found;
}

bool parse_choices(const std::string& text, Choices* choices) {
  choices->is_range = text.starts_with('[');
  return parse_numbers(text, &choices->values) &&
         (!choices->is_range || choices->values.size() == 3);
}

std::optional<Attribute> find_choices(const Attribute& attribute) {
  return find_attribute(attribute.device, attribute.channel,
                        attribute.name + "_available");
}

int read_choices(const Attribute& attribute, Choices* choices) {
  std::string text;
  const int status = attribute.Read(&text);
  if (status != 0) return status;
  return parse_choices(text, choices) ? 0 : -EINVAL;
}

double choose_rate(const Choices& choices, float request) {
  if (choices.values.empty()) return request;
  std::vector<double> candidates = choices.values;
  if (choices.is_range) {
    const double first = choices.values[0];
    const double step = choices.values[1];
    const double last = choices.values[2];
    candidates = {first, last};
    // The nearest step and its neighbours, for what was rounded off.
    const double nearest = std::round((request - first) / step);
    for (const double steps : {nearest - 1, nearest, nearest + 1}) {
      const double rate = first + steps * step;
      if (rate > first && rate < last) candidates.push_back(rate);
    }
  }
  std::sort(candidates.begin(), candidates.end());
  for (const double candidate : candidates) {
    if (static_cast<float>(candidate) >= request) return candidate;
  }
  return candidates.back();
}

}  // namespace platform
