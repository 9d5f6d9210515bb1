#ifndef PLATFORM_VIRTUAL_HUB_CLOCK_H_
#define PLATFORM_VIRTUAL_HUB_CLOCK_H_

#include <atomic>
#include <cstdint>
#include <mutex>

#include "platform/virtual/hub_model.h"

namespace platform {

/// What ends a sleep, other than time. Unlike a condition variable it does not
/// leave the mutex looking contended, whose release would cost a system call
/// after each sleep.
class Alarm {
 public:
  /// Ends the sleep that there is. Called with the mutex held.
  void Ring();

  /// Sleeps, with `lock` released, until Ring is called or, if `ns` is not
  /// negative, as many nanoseconds have passed. For one thread.
  void Sleep(int64_t ns, std::unique_lock<std::mutex>* lock);

 private:
  std::atomic<uint32_t> rings_ = 0;
};

/// The hub's time and the delivery thread's sleep. Everything is called with
/// the hub's mutex held.
class HubClock {
 public:
  virtual ~HubClock() = default;

  virtual Ticks Now() = 0;

  /// Sleeps, with `lock` released, until `due` has come (kNever: it does not)
  /// or `alarm` rings.
  virtual void SleepUntil(Ticks due, std::unique_lock<std::mutex>* lock,
                          Alarm* alarm) = 0;
};

/// Real time, counted since boot.
class RealClock : public HubClock {
 public:
  Ticks Now() override;
  void SleepUntil(Ticks due, std::unique_lock<std::mutex>* lock,
                  Alarm* alarm) override;
};

/// Time that stands still but for the sleeps: one that is to end by the horizon
/// ends at once, `lateness` ticks late, a later one only when it is woken.
class SimulatedClock : public HubClock {
 public:
  explicit SimulatedClock(Ticks horizon = kNever - 1, Ticks lateness = 0)
      : horizon_(horizon), lateness_(lateness) {}

  Ticks Now() override { return now_; }
  void SleepUntil(Ticks due, std::unique_lock<std::mutex>* lock,
                  Alarm* alarm) override;

 private:
  Ticks now_ = 0;
  const Ticks horizon_;
  const Ticks lateness_;
};

}  // namespace platform

#endif  // PLATFORM_VIRTUAL_HUB_CLOCK_H_
