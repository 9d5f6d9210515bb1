#ifndef LOOKUP_SENSOR_LOOKUP_H_
#define LOOKUP_SENSOR_LOOKUP_H_

#include <cstddef>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "hub/vesk.h"

/// The endpoint that an option letter stands for: 'c' on-change, 'o' one-shot,
/// 's' and any other streaming.
sns_std_sensor_stream_type stream_type_of(char letter);

/// Turns a datatype specification, DATATYPE{.(DATATYPE|INDEX)}, into the
/// sensors that it names: the root datatype, an optional sensor index behind
/// it, and child datatypes, each of which stands for the sensors of that
/// datatype whose name is the parent's.
///
/// Made on the stack for one lookup, by one caller, on the thread that owns
/// the connection; every call to the hub blocks until it has answered.
/// Nothing is cached: a sensor's attributes are loaded whenever it is examined.
class SensorLookup {
 public:
  using SuidSet = std::set<vesk::SensorUid>;
  using SuidList = std::vector<vesk::SensorUid>;

  /// `connection` is not owned.
  explicit SensorLookup(vesk::Connection* connection)
      : connection_(connection) {}

  /// Selects one sensor that has the endpoint `stream_type`. Without an index
  /// the sensor with index 0 is preferred; when no sensor has the index, or
  /// the one that has it lacks the endpoint, the first sensor with the
  /// endpoint is taken. Stores it in `*suid` (which may be null) and returns
  /// 0; else leaves `*suid` alone and returns -ENOENT when there is none,
  /// -EINVAL for a specification of more than 1,000 components, or the status
  /// of the request or the getter that failed. Logs an index that no sensor
  /// has, a child that there is none of, and too many components; what else
  /// goes wrong is the caller's to report.
  int Lookup(const std::string& datatype,
             sns_std_sensor_stream_type stream_type, vesk::SensorUid* suid);

  /// Collects every sensor that `datatype` names, only those with the endpoint
  /// `*stream_type` if that is not null. Finding none is no error. Returns 0,
  /// or as Lookup does -EINVAL or a status, with which `*suids` holds what was
  /// found before. Logs too many components.
  int Match(const std::string& datatype,
            sns_std_sensor_stream_type* stream_type, SuidSet* suids);

  /// The matching of either mode: selection of one sensor if `auto_select`
  /// (`stream_type` is then not null), else collection.
  int Match(const std::string& datatype,
            sns_std_sensor_stream_type* stream_type, SuidSet* suids,
            bool auto_select);

  /// Splits at the first period; without one, `*root` is the whole string and
  /// `*rest` is empty. Returns the period's position or npos.
  static size_t SplitDatatype(const std::string& datatype, std::string* root,
                              std::string* rest);

  /// Whether the first component of `datatype` is an index: all digits, or
  /// empty.
  static bool RootDatatypeIsIndex(const std::string& datatype);

 private:
  // The two call each other, a component at a time, with stream_type_ set.

  // Applies the index that may lead `spec` to `candidates`, then the stream
  // type or, when a child follows, the children of each survivor.
  int MatchByIndex(const std::string& spec, const SuidList& candidates,
                   SuidSet* suids, bool auto_select) const;

  // Matches the rest of `spec` against the sensors of the datatype that leads
  // it, those that carry the name of `parent`.
  int MatchByParent(const std::string& spec, const vesk::SensorUid& parent,
                    SuidSet* suids, bool auto_select) const;

  std::optional<int> MatchCandidates(const std::optional<int>& index,
                                     const std::string& rest,
                                     const SuidList& candidates, SuidSet* suids,
                                     bool auto_select,
                                     vesk::AttrUtil* attr_util) const;
  int FindChildren(const std::string& datatype, const vesk::SensorUid& parent,
                   SuidList* children) const;

  vesk::Connection* connection_;
  // The endpoint that the sensors of the last component must have, or null.
  sns_std_sensor_stream_type* stream_type_ = nullptr;
};

#endif  // LOOKUP_SENSOR_LOOKUP_H_
