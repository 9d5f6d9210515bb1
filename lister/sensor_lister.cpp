#include "lister/sensor_lister.h"

#include <getopt.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <map>
#include <optional>
#include <set>
#include <utility>
#include <vector>

#include "lookup/sensor_lookup.h"

namespace {

using vesk::AttrUtil;

constexpr char kOptionLetters[] = "+chosv:";
constexpr int kVersionOption = 256;
constexpr option kOptions[] = {
    {"help", no_argument, nullptr, 'h'},
    {"on-change", no_argument, nullptr, 'c'},
    {"one-shot", no_argument, nullptr, 'o'},
    {"streaming", no_argument, nullptr, 's'},
    {"verbose", required_argument, nullptr, 'v'},
    {"version", no_argument, nullptr, kVersionOption},
    {nullptr, 0, nullptr, 0},
};
constexpr char kListUsage[] =
    "Usage: fennick list {[-cos] DATATYPE{.(DATATYPE|INDEX)}}\n";

using Endpoint = std::optional<sns_std_sensor_stream_type>;

// Reads the options before the next datatype. Returns 0, with the endpoint that
// they select, if any, and optind at the datatype; or what List is to return.
int parse_options(int argc, char** argv, Endpoint* endpoint) {
  optind = 1;
  for (;;) {
    const int at = optind;  // still the same within a cluster
    const int letter =
        getopt_long(argc, argv, kOptionLetters, kOptions, nullptr);
    switch (letter) {
      case -1:
        return 0;
      case 'c':
      case 'o':
      case 's':
        *endpoint = stream_type_of(static_cast<char>(letter));
        break;
      case 'v':
        break;
      case 'h':
        return SensorLister::kShowUsage;
      case kVersionOption:
        return SensorLister::kShowVersion;
      default:
        vesk::log(vesk::kError, "Invalid 'list' option '%s'", argv[at]);
        std::fputs(kListUsage, stderr);
        return -EINVAL;
    }
  }
}

// Orders by a key that a getter reads; unreadable keys come last.
template <typename Key>
bool sort_attrs_by(int (*get)(const sns_std_attr_event&, Key*),
                   const sns_std_attr_event& a, const sns_std_attr_event& b) {
  Key key_a{};
  Key key_b{};
  if (get(a, &key_a) != 0) return false;
  if (get(b, &key_b) != 0) return true;
  return key_a < key_b;
}

bool sort_attrs_by_index(const sns_std_attr_event& a,
                         const sns_std_attr_event& b) {
  return sort_attrs_by(AttrUtil::GetSensorIndex, a, b);
}

bool sort_attrs_by_datatype(const sns_std_attr_event& a,
                            const sns_std_attr_event& b) {
  return sort_attrs_by(AttrUtil::GetDatatype, a, b);
}

void print_group(const std::string& name,
                 std::vector<sns_std_attr_event>* group) {
  std::sort(group->begin(), group->end(), sort_attrs_by_index);
  std::stable_sort(group->begin(), group->end(), sort_attrs_by_datatype);
  std::printf("%s", name.c_str());
  std::string previous;
  for (const sns_std_attr_event& attrs : *group) {
    std::string datatype;
    if (AttrUtil::GetDatatype(attrs, &datatype) != 0) continue;
    if (datatype != previous) {
      std::printf("\n  %s", datatype.c_str());
      previous = datatype;
    }
    int index = 0;
    if (AttrUtil::GetSensorIndex(attrs, &index) == 0 && index >= 1) {
      std::printf(".%d", index);
    }
  }
  std::puts("\n");
}

}  // namespace

int SensorLister::List(int argc, char** argv) const {
  int result = 0;
  for (bool first = true;; first = false) {
    Endpoint endpoint;
    const int ended = parse_options(argc, argv, &endpoint);
    if (ended != 0) return ended;
    if (optind >= argc) return first ? ListAll() : result;
    const int status =
        ListMatch(argv[optind], endpoint.has_value() ? &*endpoint : nullptr);
    if (result == 0) result = status;
    argc -= optind;
    argv += optind;
    if (argc <= 1) return result;
  }
}

int SensorLister::ListMatch(const std::string& spec,
                            sns_std_sensor_stream_type* type) const {
  std::set<vesk::SensorUid> uids;
  int result = SensorLookup(connection_).Match(spec, type, &uids);
  if (result != 0) return result;
  AttrUtil attr_util(connection_);
  for (const vesk::SensorUid& uid : uids) {
    sns_std_attr_event attrs;
    const int status = attr_util.LoadAttributes(uid, &attrs);
    if (status == 0) {
      PrintAttributes(uid, attrs);
    } else {
      vesk::log(vesk::kError, "No attributes for %s", uid.str().c_str());
      result = status;
    }
    std::putchar('\n');
  }
  return result;
}

int SensorLister::ListAll() const {
  std::vector<vesk::SensorUid> uids;
  const int status = vesk::SuidUtil(connection_).Lookup("", &uids);
  if (status != 0) return status;

  std::map<std::string, std::vector<sns_std_attr_event>> groups;
  AttrUtil attr_util(connection_);
  for (const vesk::SensorUid& uid : uids) {
    sns_std_attr_event attrs;
    if (attr_util.LoadAttributes(uid, &attrs) != 0) continue;
    bool physical = false;
    AttrUtil::GetPhysicalSensor(attrs, &physical);
    if (!physical) continue;
    std::string name;
    if (AttrUtil::GetName(attrs, &name) != 0) continue;
    groups[name].push_back(std::move(attrs));
  }
  for (auto& [name, group] : groups) print_group(name, &group);
  return 0;
}
