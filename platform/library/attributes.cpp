#include <cerrno>

#include "hub/vesk.h"

// The attribute getters of the client library.

namespace vesk {
namespace {

// One overload per value type: true when `in` holds a value of that type.

bool decode(const sns_std_attr_value& in, bool* out) {
  *out = in.flag();
  return in.has_flag();
}

bool decode(const sns_std_attr_value& in, long* out) {
  *out = in.integer();
  return in.has_integer();
}

bool decode(const sns_std_attr_value& in, int* out) {
  *out = static_cast<int>(in.integer());
  return in.has_integer() && *out == in.integer();
}

bool decode(const sns_std_attr_value& in, float* out) {
  *out = in.number();
  return in.has_number();
}

bool decode(const sns_std_attr_value& in, std::string* out) {
  *out = in.text();
  return in.has_text();
}

bool decode(const sns_std_attr_value& in, AttrUtil::Range* out) {
  *out = {in.range().low(), in.range().high()};
  return in.has_range();
}

template <typename Items, typename T>
bool decode_list(bool is_list, const Items& items, std::vector<T>* out) {
  out->assign(items.begin(), items.end());
  return is_list;
}

bool decode(const sns_std_attr_value& in, std::vector<long>* out) {
  return decode_list(in.has_integers(), in.integers().items(), out);
}

bool decode(const sns_std_attr_value& in, std::vector<float>* out) {
  return decode_list(in.has_numbers(), in.numbers().items(), out);
}

bool decode(const sns_std_attr_value& in, std::vector<std::string>* out) {
  return decode_list(in.has_texts(), in.texts().items(), out);
}

bool decode(const sns_std_attr_value& in, std::vector<AttrUtil::Range>* out) {
  out->clear();
  for (const sns_std_attr_range& item : in.ranges().items()) {
    out->emplace_back(item.low(), item.high());
  }
  return in.has_ranges();
}

template <typename Enum>
bool decode_enum(const sns_std_attr_value& in, Enum* out) {
  int value = 0;
  const bool is_int = decode(in, &value);
  *out = static_cast<Enum>(value);
  return is_int;
}

bool decode(const sns_std_attr_value& in, sns_std_sensor_stream_type* out) {
  return decode_enum(in, out);
}

bool decode(const sns_std_attr_value& in, sns_std_sensor_rigid_body_type* out) {
  return decode_enum(in, out);
}

template <typename T>
int get(const sns_std_attr_event& attrs, sns_std_attr_id id, T* value) {
  for (const sns_std_attr& attribute : attrs.attributes()) {
    if (attribute.id() != id) continue;
    return decode(attribute.value(), value) ? 0 : -EBADMSG;
  }
  return -ENOENT;
}

}  // namespace

int AttrUtil::GetDatatype(const Attrs& attrs, std::string* value) {
  return get(attrs, SNS_ATTR_DATATYPE, value);
}

int AttrUtil::GetVendor(const Attrs& attrs, std::string* value) {
  return get(attrs, SNS_ATTR_VENDOR, value);
}

int AttrUtil::GetName(const Attrs& attrs, std::string* value) {
  return get(attrs, SNS_ATTR_NAME, value);
}

int AttrUtil::GetDisplayName(const Attrs& attrs, std::string* value) {
  return get(attrs, SNS_ATTR_DISPLAY_NAME, value);
}

int AttrUtil::GetActiveCurrent(const Attrs& attrs, std::vector<long>* value) {
  return get(attrs, SNS_ATTR_ACTIVE_CURRENT, value);
}

int AttrUtil::GetApi(const Attrs& attrs, std::vector<std::string>* value) {
  return get(attrs, SNS_ATTR_API, value);
}

int AttrUtil::GetAvailable(const Attrs& attrs, bool* value) {
  return get(attrs, SNS_ATTR_AVAILABLE, value);
}

int AttrUtil::GetDri(const Attrs& attrs, bool* value) {
  return get(attrs, SNS_ATTR_DRI, value);
}

int AttrUtil::GetDynamic(const Attrs& attrs, bool* value) {
  return get(attrs, SNS_ATTR_DYNAMIC, value);
}

int AttrUtil::GetEventSize(const Attrs& attrs, long* value) {
  return get(attrs, SNS_ATTR_EVENT_SIZE, value);
}

int AttrUtil::GetFifoSize(const Attrs& attrs, long* value) {
  return get(attrs, SNS_ATTR_FIFO_SIZE, value);
}

int AttrUtil::GetSensorIndex(const Attrs& attrs, int* value) {
  return get(attrs, SNS_ATTR_HW_ID, value);
}

int AttrUtil::GetAdditionalLowLatencyRates(const Attrs& attrs,
                                           std::vector<float>* value) {
  return get(attrs, SNS_ATTR_LOW_LATENCY_RATES, value);
}

int AttrUtil::GetOpModes(const Attrs& attrs, std::vector<std::string>* value) {
  return get(attrs, SNS_ATTR_OP_MODES, value);
}

int AttrUtil::GetPassiveRequest(const Attrs& attrs, bool* value) {
  return get(attrs, SNS_ATTR_PASSIVE_REQUEST, value);
}

int AttrUtil::GetPhysicalSensor(const Attrs& attrs, bool* value) {
  return get(attrs, SNS_ATTR_PHYSICAL_SENSOR, value);
}

int AttrUtil::GetPhysicalSensorTests(const Attrs& attrs,
                                     std::vector<long>* value) {
  return get(attrs, SNS_ATTR_PHYSICAL_SENSOR_TESTS, value);
}

int AttrUtil::GetPlacement(const Attrs& attrs, std::vector<float>* value) {
  return get(attrs, SNS_ATTR_PLACEMENT, value);
}

int AttrUtil::GetRanges(const Attrs& attrs, std::vector<Range>* value) {
  return get(attrs, SNS_ATTR_RANGES, value);
}

int AttrUtil::GetRates(const Attrs& attrs, std::vector<float>* value) {
  return get(attrs, SNS_ATTR_RATES, value);
}

int AttrUtil::GetResolutions(const Attrs& attrs, std::vector<float>* value) {
  return get(attrs, SNS_ATTR_RESOLUTIONS, value);
}

int AttrUtil::GetRigidBody(const Attrs& attrs,
                           sns_std_sensor_rigid_body_type* value) {
  return get(attrs, SNS_ATTR_RIGID_BODY, value);
}

int AttrUtil::GetSelectedRange(const Attrs& attrs, Range* value) {
  return get(attrs, SNS_ATTR_SELECTED_RANGE, value);
}

int AttrUtil::GetSelectedResolution(const Attrs& attrs, float* value) {
  return get(attrs, SNS_ATTR_SELECTED_RESOLUTION, value);
}

int AttrUtil::GetSleepCurrent(const Attrs& attrs, long* value) {
  return get(attrs, SNS_ATTR_SLEEP_CURRENT, value);
}

int AttrUtil::GetStreamSync(const Attrs& attrs, bool* value) {
  return get(attrs, SNS_ATTR_STREAM_SYNC, value);
}

int AttrUtil::GetStreamType(const Attrs& attrs,
                            sns_std_sensor_stream_type* value) {
  return get(attrs, SNS_ATTR_STREAM_TYPE, value);
}

int AttrUtil::GetVersion(const Attrs& attrs, long* value) {
  return get(attrs, SNS_ATTR_VERSION, value);
}

}  // namespace vesk
