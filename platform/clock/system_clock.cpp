#include <time.h>
#include <utils/SystemClock.h>

int64_t android::elapsedRealtimeNano() {
  timespec now;
  clock_gettime(CLOCK_BOOTTIME, &now);
  return int64_t{now.tv_sec} * 1'000'000'000 + now.tv_nsec;
}
