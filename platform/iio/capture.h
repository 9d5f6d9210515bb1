#ifndef PLATFORM_IIO_CAPTURE_H_
#define PLATFORM_IIO_CAPTURE_H_

#include <memory>
#include <vector>

#include "hub/sns_messages.pb.h"
#include "platform/iio/sensors.h"

namespace platform {

/// Where running sensors' samples come from, a block at a time. Read is called
/// on a thread of its own, and AddSamples between two of its calls. Both are
/// over when it is destroyed.
class Capture {
 public:
  using Sensors = std::vector<const IioSensor*>;

  virtual ~Capture() = default;

  /// Sleeps until there is a block. Returns 0, or a negated errno code: after
  /// Cancel any, else a failure, which is reported.
  virtual int Read() = 0;

  /// Ends Read, also one that is still to come. On any thread.
  virtual void Cancel() = 0;

  /// Adds the sensor's samples in the block that was read last.
  virtual void AddSamples(const IioSensor& sensor,
                          sns_client_event_msg* message) = 0;
};

// These report their failures and return 0 or a negated errno code.

/// Captures sensors of one device through its buffer, at `rate` Hz; 0 if that
/// is not known. With the kernel's timestamps, which count from boot, or with
/// the time of the reading.
int open_buffer(const Capture::Sensors& sensors, double rate,
                bool has_timestamps, std::unique_ptr<Capture>* capture);

/// Polls one sensor.
int open_poll(const IioSensor& sensor, double rate,
              std::unique_ptr<Capture>* capture);

}  // namespace platform

#endif  // PLATFORM_IIO_CAPTURE_H_
