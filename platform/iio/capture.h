#ifndef PLATFORM_IIO_CAPTURE_H_
#define PLATFORM_IIO_CAPTURE_H_

#include <memory>
#include <string>
#include <vector>

#include "hub/sns_messages.pb.h"
#include "platform/iio/context.h"
#include "platform/iio/sensors.h"

namespace platform {

/// Where the samples of running sensors come from, a block at a time. Read and
/// GoOn are called on a thread of their own, AddSamples only while neither
/// runs, and Cancel on any thread. All of it is over when it is destroyed.
class Capture {
 public:
  using Sensors = std::vector<const IioSensor*>;

  /// What Read returns when there has been no block for some seconds.
  static constexpr int kNothingYet = 1;

  virtual ~Capture() = default;

  /// Sleeps until there is a block. Returns 0, kNothingYet or a negated errno
  /// code. After Cancel it returns at once, with any of these.
  virtual int Read() = 0;

  /// Gets ready for the next Read after one that did not return 0 but `status`,
  /// though the device is still there. Returns 0, or a negated errno code if
  /// the capture cannot go on.
  virtual int GoOn(int status) = 0;

  /// Ends Read, also one that is still to come.
  virtual void Cancel() = 0;

  /// Adds the sensor's samples in the block that was read last.
  virtual void AddSamples(const IioSensor& sensor,
                          sns_client_event_msg* message) = 0;

  /// What of the device is read, for messages.
  virtual std::string Source() const = 0;
};

/// How a channel's value comes about.
struct Scale {
  double offset = 0;
  double gain = 1;
  float Apply(double raw) const {
    return static_cast<float>((raw + offset) * gain);
  }
};

/// The value of a channel whose format is `format`, as iio_channel_convert has
/// put it at `data`.
double converted_value(const iio_data_format& format, const void* data);

// These report their failures and return 0 or a negated errno code.

/// Captures buffered sensors of one device, at `rate` Hz (0: not known), with
/// the kernel's timestamps.
int open_buffer(Context* context, const Capture::Sensors& sensors, float rate,
                std::unique_ptr<Capture>* capture);

/// Polls one sensor, at `rate` Hz.
int open_poll(const IioSensor& sensor, float rate,
              std::unique_ptr<Capture>* capture);

/// Reads what a channel's raw values are scaled with to the sensor's unit.
int read_scale(const IioSensor& sensor, iio_channel* channel, Scale* scale);

/// Adds a sample to a delivery.
void add_sample(int64_t timestamp, const sns_std_sensor_event& values,
                sns_client_event_msg* message);

}  // namespace platform

#endif  // PLATFORM_IIO_CAPTURE_H_
