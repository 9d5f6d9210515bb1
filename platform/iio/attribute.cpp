#include "platform/iio/attribute.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <mutex>
#include <utility>

#include "hub/vesk.h"

namespace platform {
namespace {

std::mutex quiet_mutex;  // guards what follows
int quiet_count = 0;
FILE* loud = nullptr;

sigset_t broken_pipe() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGPIPE);
  return signals;
}

// Reads all of what must be finite numbers, with separators of any kind.
bool parse_numbers(const std::string& text, std::vector<double>* numbers) {
  constexpr char kSeparators[] = " \t\n,;[]";
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

}  // namespace

Quiet::Quiet() {
  const sigset_t signals = broken_pipe();
  pthread_sigmask(SIG_BLOCK, &signals, &previous_);
  const std::lock_guard<std::mutex> lock(quiet_mutex);
  if (quiet_count++ > 0) return;
  static FILE* const nowhere = std::fopen("/dev/null", "we");
  loud = stderr;
  if (nowhere != nullptr) stderr = nowhere;
}

Quiet::~Quiet() {
  {
    const std::lock_guard<std::mutex> lock(quiet_mutex);
    if (--quiet_count == 0) stderr = loud;
  }
  const sigset_t signals = broken_pipe();
  const timespec at_once = {};
  sigtimedwait(&signals, nullptr, &at_once);
  pthread_sigmask(SIG_SETMASK, &previous_, nullptr);
}

int Attribute::Read(std::string* text) const {
  std::array<char, 4096> buffer = {};
  ssize_t status = 0;
  const iio_device* trigger = nullptr;
  switch (kind) {
    case kDevice:
      status = iio_device_attr_read(device, name.c_str(), buffer.data(),
                                    buffer.size() - 1);
      break;
    case kChannel:
      status = iio_channel_attr_read(channel, name.c_str(), buffer.data(),
                                     buffer.size() - 1);
      break;
    case kBuffer:
      status = iio_device_buffer_attr_read(device, name.c_str(), buffer.data(),
                                           buffer.size() - 1);
      break;
    case kTrigger:
      status = iio_device_get_trigger(device, &trigger);
      break;
  }
  if (status < 0) return static_cast<int>(status);
  *text = trigger != nullptr ? iio_device_get_id(trigger) : buffer.data();
  return 0;
}

int Attribute::Write(const std::string& text) const {
  ssize_t status = 0;
  switch (kind) {
    case kDevice:
      status = iio_device_attr_write(device, name.c_str(), text.c_str());
      break;
    case kChannel:
      status = iio_channel_attr_write(channel, name.c_str(), text.c_str());
      break;
    case kBuffer:
      status = iio_device_buffer_attr_write(device, name.c_str(), text.c_str());
      break;
    case kTrigger:
      const iio_context* context = iio_device_get_context(device);
      status = iio_device_set_trigger(
          device, text.empty()
                      ? nullptr
                      : iio_context_find_device(context, text.c_str()));
      break;
  }
  return status < 0 ? static_cast<int>(status) : 0;
}

int Attribute::ReadNumbers(std::vector<double>* numbers) const {
  numbers->clear();
  std::string text;
  int status = Read(&text);
  if (status == 0 && !parse_numbers(text, numbers)) status = -EINVAL;
  return status == 0 ? 0 : Report(status);
}

int Attribute::ReadNumber(double* number) const {
  std::vector<double> numbers;
  const int status = ReadNumbers(&numbers);
  if (status != 0) return status;
  if (numbers.size() != 1) return Report(-EINVAL);
  *number = numbers[0];
  return 0;
}

std::string Attribute::FileName() const {
  switch (kind) {
    case kChannel:
      return iio_channel_attr_get_filename(channel, name.c_str());
    case kBuffer:
      return "buffer/" + name;
    default:
      return name;
  }
}

int Attribute::Report(int status) const {
  return report(device, FileName(), status);
}

int report(const iio_device* device, const std::string& what, int status) {
  vesk::log(vesk::kError, "%s: %s: %s", iio_device_get_id(device), what.c_str(),
            std::strerror(-status));
  return status;
}

bool find_attribute(iio_device* device, iio_channel* channel, const char* name,
                    Attribute* found) {
  if (channel != nullptr && iio_channel_find_attr(channel, name) != nullptr) {
    *found = {Attribute::kChannel, device, channel, name};
    return true;
  }
  *found = {Attribute::kDevice, device, nullptr, name};
  return iio_device_find_attr(device, name) != nullptr;
}

std::string to_text(double number) {
  std::array<char, 400> text;
  const auto [end, error] = std::to_chars(
      text.data(), text.data() + text.size(), number, std::chars_format::fixed);
  return error == std::errc() ? std::string(text.data(), end) : "0";
}

}  // namespace platform
