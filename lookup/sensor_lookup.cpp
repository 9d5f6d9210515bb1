#include "lookup/sensor_lookup.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdlib>

namespace {

// The components are matched recursively; this bounds the recursion.
constexpr std::ptrdiff_t kMaxComponents = 1000;

int lookup_suids(vesk::Connection* connection, const std::string& datatype,
                 SensorLookup::SuidList* suids) {
  return vesk::SuidUtil(connection).Lookup(datatype, suids);
}

// Whether `attrs` show the endpoint `wanted`, in `*matches`.
int match_stream_type(const sns_std_attr_event& attrs,
                      sns_std_sensor_stream_type wanted, bool* matches) {
  sns_std_sensor_stream_type read = SNS_STREAM_TYPE_STREAMING;
  const int status = vesk::AttrUtil::GetStreamType(attrs, &read);
  *matches = read == wanted;
  return status;
}

bool has_index(const sns_std_attr_event& attrs, int wanted) {
  int read = -1;
  return vesk::AttrUtil::GetSensorIndex(attrs, &read) == 0 && read == wanted;
}

// An index beyond the range of int is taken as the largest one.
int index_value(const std::string& digits) {
  const long value = std::strtol(digits.c_str(), nullptr, 10);
  return static_cast<int>(std::min<long>(value, INT_MAX));
}

}  // namespace

sns_std_sensor_stream_type stream_type_of(char letter) {
  switch (letter) {
    case 'c':
      return SNS_STREAM_TYPE_ON_CHANGE;
    case 'o':
      return SNS_STREAM_TYPE_SINGLE_OUTPUT;
    default:
      return SNS_STREAM_TYPE_STREAMING;
  }
}

int SensorLookup::Lookup(const std::string& datatype,
                         sns_std_sensor_stream_type stream_type,
                         vesk::SensorUid* suid) {
  SuidSet suids;
  const int status = Match(datatype, &stream_type, &suids, true);
  if (suid != nullptr && !suids.empty()) *suid = *suids.begin();
  return status;
}

int SensorLookup::Match(const std::string& datatype,
                        sns_std_sensor_stream_type* stream_type,
                        SuidSet* suids) {
  return Match(datatype, stream_type, suids, false);
}

int SensorLookup::Match(const std::string& datatype,
                        sns_std_sensor_stream_type* stream_type, SuidSet* suids,
                        bool auto_select) {
  if (std::count(datatype.begin(), datatype.end(), '.') >= kMaxComponents) {
    vesk::log(vesk::kError, "Too many components in datatype specification");
    return -EINVAL;
  }
  std::string root;
  std::string rest;
  const size_t pos = SplitDatatype(datatype, &root, &rest);
  SuidList candidates;
  const int status = lookup_suids(connection_, root, &candidates);
  if (status != 0) return status;
  stream_type_ = stream_type;
  // The period that is kept before a child says that no index was given.
  return MatchByIndex(RootDatatypeIsIndex(rest) ? rest : datatype.substr(pos),
                      candidates, suids, auto_select);
}

size_t SensorLookup::SplitDatatype(const std::string& datatype,
                                   std::string* root, std::string* rest) {
  const size_t pos = datatype.find('.');
  *root = datatype.substr(0, pos);
  *rest = pos == std::string::npos ? "" : datatype.substr(pos + 1);
  return pos;
}

bool SensorLookup::RootDatatypeIsIndex(const std::string& datatype) {
  const size_t end = datatype.find_first_not_of("0123456789");
  return end == std::string::npos || datatype[end] == '.';
}

int SensorLookup::MatchByIndex(const std::string& spec,
                               const SuidList& candidates, SuidSet* suids,
                               bool auto_select) const {
  std::string digits;
  std::string rest;
  SplitDatatype(spec, &digits, &rest);
  std::optional<int> index;
  if (!digits.empty()) {
    index = index_value(digits);
  } else if (auto_select) {
    index = 0;  // which is preferred
  }

  vesk::AttrUtil attr_util(connection_);
  const std::optional<int> status =
      MatchCandidates(index, rest, candidates, suids, auto_select, &attr_util);
  if (status.has_value()) return *status;
  if (!auto_select) return 0;

  if (!digits.empty()) {
    vesk::log(vesk::kWarning,
              "Unable to find sensor index %d; performing auto-selection",
              *index);
  }
  if (candidates.empty()) return -ENOENT;
  if (!rest.empty()) return MatchByParent(rest, candidates[0], suids, true);
  return MatchCandidates({}, rest, candidates, suids, true, &attr_util)
      .value_or(-ENOENT);
}

// One pass over the candidates, of those with the index if one is given.
// Returns nothing if it has run through without a failure or, in selection,
// a decision.
std::optional<int> SensorLookup::MatchCandidates(
    const std::optional<int>& index, const std::string& rest,
    const SuidList& candidates, SuidSet* suids, bool auto_select,
    vesk::AttrUtil* attr_util) const {
  sns_std_attr_event attrs;
  for (const vesk::SensorUid& candidate : candidates) {
    int status = attr_util->LoadAttributes(candidate, &attrs);
    if (status != 0) return status;
    if (index.has_value() && !has_index(attrs, *index)) continue;
    if (!rest.empty()) {
      status = MatchByParent(rest, candidate, suids, auto_select);
      // The first sensor with the index decides, whatever its children give.
      if (status != 0 || auto_select) return status;
      continue;
    }
    bool matches = true;
    if (stream_type_ != nullptr) {
      status = match_stream_type(attrs, *stream_type_, &matches);
      if (status != 0) return status;
    }
    if (!matches) continue;
    suids->insert(candidate);
    if (auto_select) return 0;
  }
  return std::nullopt;
}

int SensorLookup::MatchByParent(const std::string& spec,
                                const vesk::SensorUid& parent, SuidSet* suids,
                                bool auto_select) const {
  std::string child;
  std::string rest;
  const size_t pos = SplitDatatype(spec, &child, &rest);
  SuidList children;
  const int status = FindChildren(child, parent, &children);
  if (status != 0) return status;
  if (children.empty()) {
    if (!auto_select) return 0;
    vesk::log(vesk::kError, "No children of type \"%s\"", child.c_str());
    return -ENOENT;
  }
  return MatchByIndex(RootDatatypeIsIndex(rest) ? rest : spec.substr(pos),
                      children, suids, auto_select);
}

int SensorLookup::FindChildren(const std::string& datatype,
                               const vesk::SensorUid& parent,
                               SuidList* children) const {
  vesk::AttrUtil attr_util(connection_);
  sns_std_attr_event attrs;
  int status = attr_util.LoadAttributes(parent, &attrs);
  if (status != 0) return status;
  std::string parent_name;
  status = vesk::AttrUtil::GetName(attrs, &parent_name);
  if (status != 0) return status;
  SuidList candidates;
  status = lookup_suids(connection_, datatype, &candidates);
  if (status != 0) return status;
  for (const vesk::SensorUid& candidate : candidates) {
    status = attr_util.LoadAttributes(candidate, &attrs);
    if (status != 0) return status;
    std::string name;
    status = vesk::AttrUtil::GetName(attrs, &name);
    if (status != 0) return status;
    if (name == parent_name) children->push_back(candidate);
  }
  return 0;
}
