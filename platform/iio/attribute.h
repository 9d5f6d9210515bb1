#ifndef PLATFORM_IIO_ATTRIBUTE_H_
#define PLATFORM_IIO_ATTRIBUTE_H_

#include <iio.h>

#include <optional>
#include <string>
#include <vector>

#include "hub/log.h"

namespace platform {

/// One attribute of a device or of one of its channels; or a device's current
/// trigger, whose text is the trigger's id, or empty. All of it belongs to the
/// context. Statuses are 0 or a negated errno code.
struct Attribute {
  enum Kind : int { kDevice, kChannel, kTrigger };

  Kind kind;
  iio_device* device;
  iio_channel* channel;  // of kChannel, else null
  std::string name;      // of a file in the device's folder, where kDevice

  int Read(std::string* text) const;
  int Write(const std::string& text) const;

  /// The numbers of a list, a matrix or a range; at least one. -EINVAL for
  /// anything else.
  int ReadNumbers(std::vector<double>* numbers) const;
  int ReadNumber(double* number) const;

  /// The name of its file.
  std::string FileName() const;

  /// Logs that `status` is what came of it; returns `status`.
  int Report(int status, vesk::log_level level = vesk::kError) const;
};

/// Logs a failure that concerns a device; returns `status`.
int report(const iio_device* device, const std::string& what, int status,
           vesk::log_level level = vesk::kError);

/// The attribute of the channel (which may be null), else of its device, that
/// has this name.
std::optional<Attribute> find_attribute(iio_device* device,
                                        iio_channel* channel,
                                        const std::string& name);

/// The device's current trigger.
Attribute trigger_attribute(iio_device* device);

/// Reads finite numbers, with separators of any kind; false if there is
/// anything else, or nothing.
bool parse_numbers(const std::string& text, std::vector<double>* numbers);

/// A number as the kernel takes it, in the fewest digits that mean just this
/// one.
std::string to_text(double number);
std::string to_text(float number);

}  // namespace platform

#endif  // PLATFORM_IIO_ATTRIBUTE_H_
