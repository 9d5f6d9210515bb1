#include <cstdio>

#include "lister/sensor_lister.h"

namespace {

using vesk::AttrUtil;

// One overload per value type, each without the line's end.

void print_value(const std::string& value) { std::printf("%s", value.c_str()); }

void print_value(bool value) { std::printf("%s", value ? "true" : "false"); }

void print_value(int value) { std::printf("%d", value); }

void print_value(long value) { std::printf("%ld", value); }

void print_value(float value) { std::printf("%f", static_cast<double>(value)); }

void print_value(const AttrUtil::Range& value) {
  std::printf("(%f, %f)", static_cast<double>(value.first),
              static_cast<double>(value.second));
}

void print_name(int value, const char* const (&names)[3]) {
  std::printf("%s", value >= 0 && value < 3 ? names[value] : "<unknown>");
}

void print_value(sns_std_sensor_rigid_body_type value) {
  print_name(value, {"DISPLAY", "KEYBOARD", "EXTERNAL"});
}

void print_value(sns_std_sensor_stream_type value) {
  print_name(value, {"STREAMING", "ON_CHANGE", "SINGLE_OUTPUT"});
}

void print_element(const std::string& value) {
  std::printf("\"%s\"", value.c_str());
}

template <typename T>
void print_element(const T& value) {
  print_value(value);
}

template <typename T>
void print_value(const std::vector<T>& values) {
  std::printf("[ ");
  for (const T& value : values) {
    print_element(value);
    std::putchar(' ');
  }
  std::putchar(']');
}

template <typename T>
using Getter = int (*)(const sns_std_attr_event& attrs, T* value);

template <typename T>
void print_attribute(const char* label, const sns_std_attr_event& attrs,
                     Getter<T> get) {
  T value{};
  if (get(attrs, &value) != 0) return;
  std::printf("%-18s", label);
  print_value(value);
  std::putchar('\n');
}

struct Row {
  const char* label;
  void (*print)(const char* label, const sns_std_attr_event& attrs);
};

template <auto get>
constexpr Row row(const char* label) {
  return {label, [](const char* l, const sns_std_attr_event& attrs) {
            print_attribute(l, attrs, get);
          }};
}

// The report, line by line.
constexpr Row kRows[] = {
    row<AttrUtil::GetDatatype>("TYPE"),
    row<AttrUtil::GetVendor>("VENDOR"),
    row<AttrUtil::GetName>("NAME"),
    row<AttrUtil::GetDisplayName>("DISPLAY_NAME"),
    row<AttrUtil::GetActiveCurrent>("ACTIVE_CURRENT"),
    row<AttrUtil::GetApi>("API"),
    row<AttrUtil::GetAvailable>("AVAILABLE"),
    row<AttrUtil::GetDri>("DRI"),
    row<AttrUtil::GetDynamic>("DYNAMIC"),
    row<AttrUtil::GetEventSize>("EVENT_SIZE"),
    row<AttrUtil::GetFifoSize>("FIFO_SIZE"),
    row<AttrUtil::GetSensorIndex>("HW_ID"),
    row<AttrUtil::GetAdditionalLowLatencyRates>("LOW_LAT_RATES"),
    row<AttrUtil::GetOpModes>("OP_MODES"),
    row<AttrUtil::GetPassiveRequest>("PASSIVE_REQUEST"),
    row<AttrUtil::GetPhysicalSensor>("PHYSICAL_SENSOR"),
    row<AttrUtil::GetPhysicalSensorTests>("PHYS_SNS_TESTS"),
    row<AttrUtil::GetPlacement>("PLACEMENT"),
    row<AttrUtil::GetRanges>("RANGES"),
    row<AttrUtil::GetRates>("RATES"),
    row<AttrUtil::GetResolutions>("RESOLUTIONS"),
    row<AttrUtil::GetRigidBody>("RIGID_BODY"),
    row<AttrUtil::GetSelectedRange>("SELECTED_RANGE"),
    row<AttrUtil::GetSelectedResolution>("SEL_RESOLUTION"),
    row<AttrUtil::GetSleepCurrent>("SLEEP_CURRENT"),
    row<AttrUtil::GetStreamSync>("STREAM_SYNC"),
    row<AttrUtil::GetStreamType>("STREAM_TYPE"),
    row<AttrUtil::GetVersion>("VERSION"),
};

}  // namespace

void SensorLister::PrintAttributes(const vesk::SensorUid& uid,
                                   const sns_std_attr_event& attrs) {
  std::puts(uid.str().c_str());
  for (const Row& row : kRows) row.print(row.label, attrs);
}
