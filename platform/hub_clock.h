#ifndef PLATFORM_HUB_CLOCK_H_
#define PLATFORM_HUB_CLOCK_H_

#include <condition_variable>
#include <mutex>

#include "platform/hub_model.h"

namespace platform {

/// The hub's time and the delivery thread's sleep. Everything is called with
/// the connection's mutex held.
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

/// Time that passes only when everybody sleeps, and then at once, `lateness`
/// ticks beyond what was due, and that stands still when nothing more is due up
/// to a horizon.
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

#endif  // PLATFORM_HUB_CLOCK_H_
