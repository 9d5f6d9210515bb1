#ifndef PLATFORM_IIO_UNIT_H_
#define PLATFORM_IIO_UNIT_H_

#include <pthread.h>

#include <condition_variable>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/iio/capture.h"
#include "platform/iio/changes.h"
#include "platform/iio/context.h"
#include "platform/iio/sensors.h"

namespace platform {

/// What starts and stops as one: the sensors of a device that its buffer
/// captures together, or one sensor that is polled. While it runs, a thread of
/// its own reads a block and waits until that is taken; what a slow reader does
/// not take is lost in the kernel.
///
/// One thread at a time calls Run and the destructor. Everything else may be
/// called on any thread.
class Unit {
 public:
  using Sensors = std::vector<const IioSensor*>;

  /// Whoever takes the blocks. Called on the unit's thread or in Run, with no
  /// lock of the unit held.
  class Owner {
   public:
    virtual ~Owner() = default;
    /// There is a block.
    virtual void OnBlock() = 0;
    /// The device is gone, or a daemon or the way to it. Once.
    virtual void OnLoss() = 0;
  };

  /// `sensors` are all that it can run, `number` is no other unit's.
  /// `has_device`: no other unit of the device has a buffer. Nothing of it is
  /// owned.
  Unit(Context* context, Guardian* guardian, Owner* owner, int number,
       Sensors sensors, bool has_device);
  /// Stops what runs.
  ~Unit();

  const Sensors& sensors() const { return sensors_; }

  /// Runs just these sensors, none if there are none, at `rate` Hz; what runs
  /// already so goes on undisturbed. Returns 0, or a negated errno code with
  /// which nothing runs: -ENOTCONN if the unit is lost, else a failure that was
  /// reported.
  int Run(const Sensors& sensors, float rate);

  /// The rate in Hz at which the sensors run; 0 if that is not known.
  float RunningRate() const;

  /// Whether there is a block. If so it can be taken, until Release is called.
  bool BeginTaking();

  /// Adds the sensor's samples in the block, if there still is one.
  void AddSamples(const IioSensor* sensor, sns_client_event_msg* message);

  /// Lets the next block come.
  void Release();

  /// Nothing of it can be reached any more.
  void SetLost();

 private:
  using Lock = std::unique_lock<std::mutex>;

  int Start();
  int StartThread();
  void Stop();
  int PrepareBuffer();
  int SetRates(float* running);
  int SetRate(const Attribute& attribute);
  void ReadBlocks();
  void HandOver();
  int FindLoss(int status) const;
  void Lose(int status);
  bool IsLost() const;
  bool IsStopping() const;

  Context* const context_;
  Owner* const owner_;
  const Sensors sensors_;
  const bool has_device_;
  Changes changes_;
  Sensors requested_;
  float requested_rate_ = 0;  // Hz
  pthread_t thread_ = {};
  bool has_thread_ = false;

  // Written while there is no thread but Run's; AddSamples reads it with the
  // mutex held.
  std::unique_ptr<Capture> capture_;

  mutable std::mutex mutex_;  // guards what follows
  float running_rate_ = 0;
  bool has_block_ = false;
  bool is_taken_ = false;  // between BeginTaking and Release
  bool is_stopping_ = false;
  bool is_lost_ = false;
  std::condition_variable released_;
};

}  // namespace platform

#endif  // PLATFORM_IIO_UNIT_H_
