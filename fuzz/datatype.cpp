#include "fuzz/harness.h"
#include "lookup/sensor_lookup.h"

// Datatype specifications, in both modes.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  fuzz::set_up(200);
  FuzzedDataProvider input(data, size);
  const auto type = static_cast<sns_std_sensor_stream_type>(
      input.ConsumeIntegralInRange(0, 2));
  const std::string spec = input.ConsumeRemainingBytesAsString();
  constexpr vesk::SensorUid kNone = {1, 1};
  vesk::SensorUid uid = kNone;
  SensorLookup lookup(fuzz::connection());
  const int status = lookup.Lookup(spec, type, &uid);
  if ((status == 0) != (uid.high != kNone.high)) std::abort();
  SensorLookup::SuidSet found;
  // Without a digit there is no index that makes way for another.
  const bool is_all = lookup.Match(spec, nullptr, &found) == 0 &&
                      spec.find_first_of("0123456789") == spec.npos;
  if (is_all && status == 0 && !found.contains(uid)) std::abort();
  return 0;
}
