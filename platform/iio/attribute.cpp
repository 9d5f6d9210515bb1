#include "platform/iio/attribute.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <cstring>

namespace platform {
namespace {

// The kernel's file of a device without a current trigger is empty, and libiio
// takes reading nothing for an input error.
int read_trigger(const iio_device* device, std::string* id) {
  const iio_device* trigger = nullptr;
  const int status = iio_device_get_trigger(device, &trigger);
  *id = trigger != nullptr ? iio_device_get_id(trigger) : "";
  return status == -EIO ? 0 : status;
}

int write_trigger(const iio_device* device, const std::string& id) {
  const iio_device* trigger = nullptr;
  if (!id.empty()) {
    trigger =
        iio_context_find_device(iio_device_get_context(device), id.c_str());
    if (trigger == nullptr) return -ENODEV;
  }
  return iio_device_set_trigger(device, trigger);
}

template <typename Number>
std::string in_fewest_digits(Number number) {
  std::array<char, 400> text;  // for the largest double
  const auto [end, error] = std::to_chars(
      text.data(), text.data() + text.size(), number, std::chars_format::fixed);
  return error == std::errc() ? std::string(text.data(), end) : "0";
}

}  // namespace

int Attribute::Read(std::string* text) const {
  if (kind == kTrigger) return read_trigger(device, text);
  std::array<char, 4096> buffer = {};
  const size_t size = buffer.size() - 1;
  const ssize_t status =
      kind == kChannel
          ? iio_channel_attr_read(channel, name.c_str(), buffer.data(), size)
          : iio_device_attr_read(device, name.c_str(), buffer.data(), size);
  if (status < 0) return static_cast<int>(status);
  *text = buffer.data();
  return 0;
}

int Attribute::Write(const std::string& text) const {
  if (kind == kTrigger) return write_trigger(device, text);
  const ssize_t status =
      kind == kChannel
          ? iio_channel_attr_write(channel, name.c_str(), text.c_str())
          : iio_device_attr_write(device, name.c_str(), text.c_str());
  return status < 0 ? static_cast<int>(status) : 0;
}

int Attribute::ReadNumbers(std::vector<double>* numbers) const {
  std::string text;
  const int status = Read(&text);
  if (status != 0) return status;
  return parse_numbers(text, numbers) ? 0 : -EINVAL;
}

int Attribute::ReadNumber(double* number) const {
  std::vector<double> numbers;
  const int status = ReadNumbers(&numbers);
  if (status != 0) return status;
  if (numbers.size() != 1) return -EINVAL;
  *number = numbers[0];
  return 0;
}

std::string Attribute::FileName() const {
  return kind == kChannel ? iio_channel_attr_get_filename(channel, name.c_str())
                          : name;
}

int Attribute::Report(int status, vesk::log_level level) const {
  return report(device, FileName(), status, level);
}

int report(const iio_device* device, const std::string& what, int status,
           vesk::log_level level) {
  vesk::log(level, "%s: %s: %s", iio_device_get_id(device), what.c_str(),
            std::strerror(-status));
  return status;
}

std::optional<Attribute> find_attribute(iio_device* device,
                                        iio_channel* channel,
                                        const std::string& name) {
  if (channel != nullptr &&
      iio_channel_find_attr(channel, name.c_str()) != nullptr) {
    return Attribute{Attribute::kChannel, device, channel, name};
  }
  if (iio_device_find_attr(device, name.c_str()) != nullptr) {
    return Attribute{Attribute::kDevice, device, nullptr, name};
  }
  // libiio takes a file such as in_mount_matrix, which is the whole device's,
  // for the attribute "matrix" of a channel "mount".
  const size_t end = name.find('_');
  if (end == std::string::npos) return std::nullopt;
  iio_channel* whole =
      iio_device_find_channel(device, name.substr(0, end).c_str(), false);
  const std::string rest = name.substr(end + 1);
  if (whole == nullptr ||
      iio_channel_find_attr(whole, rest.c_str()) == nullptr) {
    return std::nullopt;
  }
  return Attribute{Attribute::kChannel, device, whole, rest};
}

Attribute trigger_attribute(iio_device* device) {
  return {Attribute::kTrigger, device, nullptr, "trigger/current_trigger"};
}

bool parse_numbers(const std::string& text, std::vector<double>* numbers) {
  constexpr char kSeparators[] = " \t\n,;[]";
  numbers->clear();
  for (size_t end = 0;;) {
    const size_t begin = text.find_first_not_of(kSeparators, end);
    if (begin == std::string::npos) return !numbers->empty();
    end = std::min(text.find_first_of(kSeparators, begin), text.size());
    double number = 0;
    const auto [parsed, error] =
        std::from_chars(text.data() + begin, text.data() + end, number);
    const bool is_number = error == std::errc() && parsed == text.data() + end;
    if (!is_number || !std::isfinite(number)) return false;
    numbers->push_back(number);
  }
}

std::string to_text(double number) { return in_fewest_digits(number); }

std::string to_text(float number) { return in_fewest_digits(number); }

}  // namespace platform
