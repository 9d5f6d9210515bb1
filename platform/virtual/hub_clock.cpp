#include "platform/virtual/hub_clock.h"

#include <linux/futex.h>
#include <sys/syscall.h>
#include <time.h>
#include <unistd.h>
#include <utils/SystemClock.h>

#include <algorithm>

namespace platform {
namespace {

constexpr int64_t kNanosecondsPerTick = 1'000'000'000 / kTicksPerSecond;

}  // namespace

void Alarm::Ring() {
  ++rings_;
  syscall(SYS_futex, &rings_, FUTEX_WAKE_PRIVATE, 1, nullptr, nullptr, 0);
}

void Alarm::Sleep(int64_t ns, std::unique_lock<std::mutex>* lock) {
  constexpr int64_t kSecond = 1'000'000'000;
  const timespec timeout = {ns / kSecond, ns % kSecond};
  const uint32_t before = rings_;
  lock->unlock();
  // Returns at once if it has rung since.
  syscall(SYS_futex, &rings_, FUTEX_WAIT_PRIVATE, before,
          ns < 0 ? nullptr : &timeout, nullptr, 0);
  lock->lock();
}

Ticks RealClock::Now() {
  return android::elapsedRealtimeNano() / kNanosecondsPerTick;
}

void RealClock::SleepUntil(Ticks due, std::unique_lock<std::mutex>* lock,
                           Alarm* alarm) {
  // A tick more, for the part of a tick that Now leaves out.
  const Ticks left = std::max<Ticks>(due - Now(), 0) + 1;
  alarm->Sleep(due == kNever ? -1 : left * kNanosecondsPerTick, lock);
}

void SimulatedClock::SleepUntil(Ticks due, std::unique_lock<std::mutex>* lock,
                                Alarm* alarm) {
  if (due <= horizon_) {
    now_ = due + lateness_;
  } else {
    alarm->Sleep(-1, lock);
  }
}

}  // namespace platform
