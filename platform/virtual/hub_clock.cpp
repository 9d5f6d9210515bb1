#include "platform/virtual/hub_clock.h"

#include <utils/SystemClock.h>

#include <chrono>

namespace platform {
namespace {

constexpr int64_t kNanosecondsPerTick = 1'000'000'000 / kTicksPerSecond;

}  // namespace

Ticks RealClock::Now() {
  return android::elapsedRealtimeNano() / kNanosecondsPerTick;
}

void RealClock::SleepUntil(Ticks due, std::unique_lock<std::mutex>* lock,
                           std::condition_variable* wake) {
  if (due == kNever) {
    wake->wait(*lock);
    return;
  }
  // A tick more, for the part of a tick that Now leaves out.
  const Ticks left = due - Now() + 1;
  wake->wait_for(*lock, std::chrono::nanoseconds(left * kNanosecondsPerTick));
}

void SimulatedClock::SleepUntil(Ticks due, std::unique_lock<std::mutex>* lock,
                                std::condition_variable* wake) {
  if (due <= horizon_) {
    now_ = due + lateness_;
  } else {
    wake->wait(*lock);
  }
}

}  // namespace platform
