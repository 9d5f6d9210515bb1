#ifndef PLATFORM_IIO_ATTRIBUTE_H_
#define PLATFORM_IIO_ATTRIBUTE_H_

#include <iio.h>
#include <signal.h>

#include <string>
#include <vector>

namespace platform {

/// Exists around every use of libiio. libiio remarks on things on stdio's
/// stderr, and it writes to sockets whose daemon may be gone; meanwhile the one
/// goes nowhere, and the other does not end the process. Diagnostics of our own
/// do not go through stdio. Of one thread.
class Quiet {
 public:
  Quiet();
  ~Quiet();
  Quiet(const Quiet&) = delete;
  Quiet& operator=(const Quiet&) = delete;

 private:
  sigset_t previous_;
};

/// One attribute of a device, of one of its channels or of its buffer; or its
/// trigger, whose text is the trigger's id, or empty. Statuses are 0 or a
/// negated errno code.
struct Attribute {
  enum Kind : int { kDevice, kChannel, kBuffer, kTrigger };

  Kind kind;
  iio_device* device;
  iio_channel* channel;  // of kChannel
  std::string name;

  int Read(std::string* text) const;
  int Write(const std::string& text) const;

  // These report their failures.

  /// The numbers of a list, a matrix or a range; at least one.
  int ReadNumbers(std::vector<double>* numbers) const;
  int ReadNumber(double* number) const;

  /// The name of its file.
  std::string FileName() const;

  /// Logs that `status` is what came of it; returns `status`.
  int Report(int status) const;
};

/// Logs a failure that concerns a device; returns `status`.
int report(const iio_device* device, const std::string& what, int status);

/// The attribute of the channel, else of its device, that has this name; false
/// if there is none.
bool find_attribute(iio_device* device, iio_channel* channel, const char* name,
                    Attribute* found);

/// A number as the kernel takes it.
std::string to_text(double number);

}  // namespace platform

#endif  // PLATFORM_IIO_ATTRIBUTE_H_
