#ifndef PLATFORM_IIO_GUARDIAN_H_
#define PLATFORM_IIO_GUARDIAN_H_

#include <iio.h>
#include <sys/types.h>

#include <chrono>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/iio/attribute.h"

namespace platform {

/// A setting of the kernel as it was found, by names, which any process knows.
struct Setting {
  std::string device;
  std::string channel;
  Attribute::Kind kind;
  std::string name;
  std::string text;

  /// Its attribute, if the context has that.
  std::optional<Attribute> FindIn(const iio_context* context) const;
};

/// Writes `text` to the attribute, unless that is what it has. While a buffer
/// is on the kernel refuses that, and a daemon closes a buffer some time after
/// it was told to, so it is tried until then. Returns 0 or a negated errno
/// code.
int put_back(const Attribute& attribute, const std::string& text,
             std::chrono::steady_clock::time_point until);

/// Another process, which puts settings back when this one ends without having
/// done so. It is told of a setting before that is changed. One thread at a
/// time may call it. What it is told is on behalf of an owner, a number.
class Guardian {
 public:
  Guardian() = default;
  /// Lets the process go, and waits for its end unless it has something to put
  /// back.
  ~Guardian();
  Guardian(const Guardian&) = delete;
  Guardian& operator=(const Guardian&) = delete;

  // These return 0 or a negated errno code.

  /// Starts the process. To be called before this one has another thread; the
  /// signal mask is inherited.
  int Start();

  /// Gets a device for this run to change. -EBUSY if another run has it, or the
  /// guardian of one that was killed; if `waits`, only after a few seconds, in
  /// which a guardian is done.
  int Claim(int owner, const std::string& device, bool waits);

  /// Has a setting of a claimed device put back.
  int Remember(int owner, const Setting& setting);

  /// All that was claimed and remembered for the owner is done with.
  void Forget(int owner);

 private:
  int Ask(const std::vector<std::string>& texts);

  pid_t process_ = -1;
  int line_ = -1;  // to the process, which sees it close
  std::set<int> owners_;
};

}  // namespace platform

#endif  // PLATFORM_IIO_GUARDIAN_H_
