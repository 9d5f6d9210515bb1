#ifndef HUB_UTILITIES_H_
#define HUB_UTILITIES_H_

#include <string>
#include <utility>
#include <vector>

#include "hub/client.h"

namespace vesk {

/// Loads and reads the attributes of sensors. Made on the stack for one step
/// of work, on the thread that does the step.
class AttrUtil : public Client {
 public:
  explicit AttrUtil(Connection* connection) : Client(connection) {}

  void OnEvent(const sns_client_event_msg& msg) override;

  /// Asks the hub for the attribute list of `suid`, waits for the answer and
  /// fills `*attrs`. Returns 0 or the library's status.
  int LoadAttributes(const SensorUid& suid, sns_std_attr_event* attrs);

  // The getters. Each returns 0 when the attribute is present and then sets
  // `*value` to exactly that attribute's value; a list replaces the whole
  // content of the vector. Each returns a nonzero status when the attribute is
  // absent or unreadable, and then `*value` is not to be relied on.

  using Attrs = sns_std_attr_event;
  using Range = std::pair<float, float>;

  static int GetDatatype(const Attrs& attrs, std::string* value);
  static int GetVendor(const Attrs& attrs, std::string* value);
  static int GetName(const Attrs& attrs, std::string* value);
  static int GetDisplayName(const Attrs& attrs, std::string* value);
  static int GetActiveCurrent(const Attrs& attrs, std::vector<long>* value);
  static int GetApi(const Attrs& attrs, std::vector<std::string>* value);
  static int GetAvailable(const Attrs& attrs, bool* value);
  static int GetDri(const Attrs& attrs, bool* value);
  static int GetDynamic(const Attrs& attrs, bool* value);
  static int GetEventSize(const Attrs& attrs, long* value);
  static int GetFifoSize(const Attrs& attrs, long* value);
  static int GetSensorIndex(const Attrs& attrs, int* value);
  static int GetAdditionalLowLatencyRates(const Attrs& attrs,
                                          std::vector<float>* value);
  static int GetOpModes(const Attrs& attrs, std::vector<std::string>* value);
  static int GetPassiveRequest(const Attrs& attrs, bool* value);
  static int GetPhysicalSensor(const Attrs& attrs, bool* value);
  static int GetPhysicalSensorTests(const Attrs& attrs,
                                    std::vector<long>* value);
  static int GetPlacement(const Attrs& attrs, std::vector<float>* value);
  static int GetRanges(const Attrs& attrs, std::vector<Range>* value);
  static int GetRates(const Attrs& attrs, std::vector<float>* value);
  static int GetResolutions(const Attrs& attrs, std::vector<float>* value);
  static int GetRigidBody(const Attrs& attrs,
                          sns_std_sensor_rigid_body_type* value);
  static int GetSelectedRange(const Attrs& attrs, Range* value);
  static int GetSelectedResolution(const Attrs& attrs, float* value);
  static int GetSleepCurrent(const Attrs& attrs, long* value);
  static int GetStreamSync(const Attrs& attrs, bool* value);
  static int GetStreamType(const Attrs& attrs,
                           sns_std_sensor_stream_type* value);
  static int GetVersion(const Attrs& attrs, long* value);

 private:
  sns_std_attr_event attr_event_;
};

/// Finds the sensors of a datatype. Made on the stack for one lookup.
class SuidUtil : public Client {
 public:
  explicit SuidUtil(Connection* connection) : Client(connection) {}

  void OnEvent(const sns_client_event_msg& msg) override;

  /// Fills `*suids` with the sensors of `datatype`, in the library's order;
  /// the empty datatype stands for all sensors. Returns 0 or the library's
  /// status.
  int Lookup(const std::string& datatype, std::vector<SensorUid>* suids);

 private:
  sns_suid_event suid_event_;
};

}  // namespace vesk

#endif  // HUB_UTILITIES_H_
