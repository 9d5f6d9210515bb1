#ifndef HUB_SENSOR_UID_H_
#define HUB_SENSOR_UID_H_

#include <cstdint>
#include <cstdio>
#include <functional>
#include <string>

namespace vesk {

/// The 128-bit identifier of one sensor of the hub.
struct SensorUid {
  uint64_t low;
  uint64_t high;

  /// The number high:low as 36 characters, grouped like a UUID.
  std::string str() const {
    char text[37] = {};
    std::snprintf(text, sizeof text, "%08lx-%04lx-%04lx-%04lx-%012lx",
                  static_cast<unsigned long>(high >> 32),
                  static_cast<unsigned long>(high >> 16 & 0xffff),
                  static_cast<unsigned long>(high & 0xffff),
                  static_cast<unsigned long>(low >> 48),
                  static_cast<unsigned long>(low & 0xffffffffffff));
    return text;
  }
};

}  // namespace vesk

/// Orders sensors by the 128-bit number high:low.
template <>
struct std::less<vesk::SensorUid> {
  bool operator()(const vesk::SensorUid& a, const vesk::SensorUid& b) const {
    return a.high != b.high ? a.high < b.high : a.low < b.low;
  }
};

#endif  // HUB_SENSOR_UID_H_
