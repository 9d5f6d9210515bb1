#ifndef PLATFORM_IIO_CHANGES_H_
#define PLATFORM_IIO_CHANGES_H_

#include <iio.h>
#include <sys/types.h>

#include <string>

#include "platform/iio/attribute.h"

namespace platform {

/// What this process has changed of the kernel's settings, and how it found
/// them. The record is in memory that a guardian shares, a process that puts
/// everything back when this one ends without having done so. One user at a
/// time.
class Changes {
 public:
  Changes() = default;
  /// Lets the guardian go, and waits for its end.
  ~Changes();
  Changes(const Changes&) = delete;
  Changes& operator=(const Changes&) = delete;

  /// Starts the guardian. To be called before the process has another thread;
  /// the guardian inherits the signal mask. Returns 0 or a negated errno code.
  int Open();

  /// Records an attribute as it is, for `owner`, unless it is recorded. False
  /// if it cannot be read.
  bool Keep(int owner, const Attribute& attribute);

  /// Keeps an attribute, and sets it, unless that is what it is. Reports its
  /// failures and returns 0 or a negated errno code.
  int Set(int owner, const Attribute& attribute, const std::string& text);

  /// Puts back what was recorded for `owner`, in the order of the recording.
  /// Failures are reported, unless `silently`.
  void Restore(int owner, const iio_context* context, bool silently);

 private:
  struct Record;

  [[noreturn]] static void Guard(Record* records, int life_line);

  Record* records_ = nullptr;  // shared
  int life_line_ = -1;         // the guardian sees it close
  pid_t guardian_ = -1;
};

}  // namespace platform

#endif  // PLATFORM_IIO_CHANGES_H_
