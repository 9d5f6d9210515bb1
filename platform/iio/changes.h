#ifndef PLATFORM_IIO_CHANGES_H_
#define PLATFORM_IIO_CHANGES_H_

#include <string>
#include <utility>
#include <vector>

#include "platform/iio/guardian.h"

namespace platform {

/// What one owner has changed of a device's settings, and how they were found.
/// One thread at a time may call it. Statuses are 0 or a negated errno code.
class Changes {
 public:
  /// `guardian` is not owned; it knows the owner by the number.
  Changes(Guardian* guardian, int owner) : guardian_(guardian), owner_(owner) {}

  /// Gets the device to change. -EBUSY if another run changes it, and goes on
  /// to for some seconds if `waits`.
  int Begin(const iio_device* device, bool waits);

  /// Remembers an attribute of it as it is, before that is changed.
  int Keep(const Attribute& attribute);

  /// Keeps an attribute, and sets it unless that is what it is.
  int Set(const Attribute& attribute, const std::string& text);

  bool HasBegun() const { return has_begun_; }

  /// Puts everything back, in the order in which it was kept, and reports what
  /// that fails for. What could not be put back within a second is left to the
  /// guardian.
  void PutBack();

  /// Leaves everything to the guardian, as the device is out of reach.
  void GiveUp();

 private:
  Guardian* guardian_;
  int owner_;
  bool has_begun_ = false;
  std::vector<std::pair<Attribute, std::string>> kept_;
};

}  // namespace platform

#endif  // PLATFORM_IIO_CHANGES_H_
