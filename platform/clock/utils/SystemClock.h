#ifndef UTILS_SYSTEMCLOCK_H_
#define UTILS_SYSTEMCLOCK_H_

#include <cstdint>

namespace android {

/// Monotonic nanoseconds since boot, counting through suspend.
int64_t elapsedRealtimeNano();

}  // namespace android

#endif  // UTILS_SYSTEMCLOCK_H_
