#ifndef PLATFORM_VIRTUAL_HUB_CLOCK_H_
#define PLATFORM_VIRTUAL_HUB_CLOCK_H_

#include <condition_variable>
#include <mutex>

#include "platform/virtual/hub_model.h"

namespace platform {

/// The hub's time and the delivery thread's sleep. Everything is called with
/// the hub's mutex held.
class HubClock {
 public:
  virtual ~HubClock() = default;

  virtual Ticks Now() = 0;

  /// Sleeps, with `lock` released, until `due` has come (kNever: it does not)
  /// or `wake` is notified.
  virtual void SleepUntil(Ticks due, std::unique_lock<std::mutex>* lock,
                          std::condition_variable* wake) = 0;
};

/// Real time, counted since boot.
class RealClock : public HubClock {
 public:
  Ticks Now() override;
  void SleepUntil(Ticks due, std::unique_lock<std::mutex>* lock,
                  std::condition_variable* wake) override;
};

/// Time that stands still but for the sleeps: one that is to end by the horizon
/// ends at once, `lateness` ticks late, a later one only when it is woken.
class SimulatedClock : public HubClock {
 public:
  explicit SimulatedClock(Ticks horizon = kNever - 1, Ticks lateness = 0)
      : horizon_(horizon), lateness_(lateness) {}

  Ticks Now() override { return now_; }
  void SleepUntil(Ticks due, std::unique_lock<std::mutex>* lock,
                  std::condition_variable* wake) override;

 private:
  Ticks now_ = 0;
  const Ticks horizon_;
  const Ticks lateness_;
};

}  // namespace platform

#endif  // PLATFORM_VIRTUAL_HUB_CLOCK_H_
