#include <fuzzer/FuzzedDataProvider.h>

#include <algorithm>
#include <climits>
#include <cstdlib>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "fuzz/harness.h"
#include "lookup/sensor_lookup.h"

// Datatype specifications against hubs of all kinds, in both modes.

namespace {

using platform::Attributes;
using platform::AttrValue;
using platform::HubModel;
using platform::VirtualSensor;
using SuidSet = SensorLookup::SuidSet;

// A chain of datatypes that k sensors of one name share takes k^depth requests
// in collection mode.
constexpr int kCallBudget = 300;
constexpr vesk::SensorUid kUntouched = {0xdead, 0xbeef};

// What the sensors' attributes are picked from; what is usual comes often.
const char* const kDatatypes[] = {"a", "a",  "a",   "b", "b",   "c",
                                  "1", "1a", "a%n", "",  "\xff"};
const char* const kNames[] = {"x", "x", "x", "y", "y", "", "%s%n", "\xfe\xff"};
constexpr long kIndices[] = {0, 0, 0, 1, 2, -1, INT_MAX, INT_MIN, LONG_MAX};
constexpr long kStreamTypes[] = {0, 0, 0, 0, 1, 1, 2, 3, -1, INT_MAX, LONG_MIN};
constexpr int kStatuses[] = {-EIO, -ENOENT, 1};

const char* const kComponents[] = {
    "a",    "a",  "b",  "b",          "c",          "0",
    "1",    "2",  "02", "",           "1a",         "a%n",
    "\xff", "-1", " 1", "2147483647", "2147483648", "99999999999999999999"};

// Sets the attribute, or leaves it out, or gives it another type.
template <typename T, typename Values>
void add_attribute(sns_std_attr_id id, const Values& values,
                   FuzzedDataProvider* input, Attributes* attributes) {
  switch (input->ConsumeIntegralInRange(0, 15)) {
    case 14:
      (*attributes)[id] = 1.5f;
      break;
    case 15:
      break;
    default:
      (*attributes)[id] = T(input->PickValueInArray(values));
  }
}

HubModel make_hub(FuzzedDataProvider* input) {
  HubModel hub;
  const int sensors = input->ConsumeIntegralInRange(0, 12);
  for (int i = 0; i < sensors; ++i) {
    VirtualSensor& sensor = hub.emplace_back();
    // Not in the order of the UIDs, and some of them twice.
    sensor.uid = {input->ConsumeIntegralInRange<uint64_t>(0, 15),
                  input->ConsumeIntegralInRange<uint64_t>(0, 1)};
    sensor.datatype = input->PickValueInArray(kDatatypes);
    add_attribute<std::string>(SNS_ATTR_NAME, kNames, input,
                               &sensor.attributes);
    add_attribute<long>(SNS_ATTR_HW_ID, kIndices, input, &sensor.attributes);
    add_attribute<long>(SNS_ATTR_STREAM_TYPE, kStreamTypes, input,
                        &sensor.attributes);
    if (input->ConsumeIntegralInRange(0, 31) == 31) sensor.load_status = -EIO;
  }
  return hub;
}

std::vector<platform::Fault> make_faults(FuzzedDataProvider* input) {
  if (input->ConsumeIntegralInRange(0, 7) != 7) return {};
  return {{.call = input->ConsumeBool() ? "Lookup" : "LoadAttributes",
           .status = input->PickValueInArray(kStatuses),
           .nth = input->ConsumeIntegralInRange(1, 20)}};
}

// Mostly of components that there are; sometimes any text.
std::string make_spec(FuzzedDataProvider* input) {
  if (input->ConsumeIntegralInRange(0, 3) == 3) {
    return input->ConsumeRemainingBytesAsString();
  }
  std::string spec = input->PickValueInArray(kDatatypes);
  const int more = input->ConsumeIntegralInRange(0, 7);
  for (int i = 0; i < more; ++i) {
    spec += '.';
    spec += input->PickValueInArray(kComponents);
  }
  return spec;
}

/// What a specification asks for, as far as the checks need it.
struct Parsed {
  std::string root;
  std::string last_datatype;
  std::optional<long> last_index;  // of the last datatype
  bool has_child = false;
  bool has_index = false;  // anywhere
};

Parsed parse(const std::string& spec) {
  std::vector<std::string> components(1);
  for (const char c : spec) {
    if (c == '.') {
      components.emplace_back();
    } else {
      components.back() += c;
    }
  }
  // A period at the very end adds nothing.
  if (components.size() > 1 && components.back().empty()) {
    components.pop_back();
  }
  Parsed parsed = {components[0], components[0], {}};
  bool after_datatype = true;  // where an index may stand
  for (size_t i = 1; i < components.size(); ++i) {
    const std::string& component = components[i];
    const bool digits =
        std::all_of(component.begin(), component.end(),
                    [](char c) { return c >= '0' && c <= '9'; });
    if (after_datatype && digits) {
      if (!component.empty()) {
        parsed.last_index = std::strtol(component.c_str(), nullptr, 10);
        parsed.has_index = true;
      }
      after_datatype = false;
    } else {
      parsed.last_datatype = component;
      parsed.last_index.reset();
      parsed.has_child = true;
      after_datatype = true;
    }
  }
  return parsed;
}

/// One input: a hub on which a specification is matched in several ways.
class Run {
 public:
  explicit Run(FuzzedDataProvider* input)
      : hub_(make_hub(input)),
        faults_(make_faults(input)),
        wanted_(static_cast<sns_std_sensor_stream_type>(
            input->ConsumeIntegralInRange(0, 3))),
        spec_(make_spec(input)),
        parsed_(parse(spec_)) {
    vesk::setLogLevel(vesk::kFunction);
    platform::stand_in() = {.model = hub_, .clock = &clock_};
    vesk::Connection::Create(&connection_);
  }
  ~Run() { platform::stand_in().observer = nullptr; }

  void Check() {
    SuidSet all;
    const int all_status = Match(nullptr, false, &all);
    SuidSet typed;
    const int typed_status = Match(&wanted_, false, &typed);
    for (const SuidSet& found : {all, typed}) {
      for (const vesk::SensorUid& uid : found) {
        CheckFound(uid);
        fuzz::require(!parsed_.last_index || !index_in_range_ ||
                          HasIndex(uid, *parsed_.last_index),
                      "of the index that was asked for");
      }
    }
    if (all_status == 0 && typed_status == 0) {
      SuidSet expected;
      for (const vesk::SensorUid& uid : all) {
        if (HasWantedType(uid)) expected.insert(uid);
      }
      fuzz::require(Equal(typed, expected), "all of the type, and only those");
    }
    CheckSelection(all_status == 0 ? &all : nullptr);
  }

 private:
  // `all`: what collection found; null if it failed.
  void CheckSelection(const SuidSet* all) {
    SuidSet selected;
    const int match_status = Match(&wanted_, true, &selected);
    fuzz::require(selected.size() == (match_status == 0 ? 1 : 0),
                  "selection finds one or fails");

    Prepare();
    vesk::SensorUid uid = kUntouched;
    const int status =
        SensorLookup(connection_.get()).Lookup(spec_, wanted_, &uid);
    fuzz::require(status == match_status, "Lookup and Match agree");
    const SuidSet looked_up = status == 0 ? SuidSet{uid} : SuidSet{};
    fuzz::require(Equal(looked_up, selected), "Lookup stores what Match finds");
    if (status != 0) {
      fuzz::require(Equal({uid}, {kUntouched}), "a failure stores nothing");
      return;
    }
    CheckFound(uid);
    fuzz::require(HasWantedType(uid), "of the type that was asked for");
    // An index that no sensor has makes way for another sensor.
    if (all != nullptr && !parsed_.has_index) {
      fuzz::require(all->contains(uid), "one of all that are named");
    }
    if (!parsed_.has_child && index_in_range_) {
      fuzz::require(Equal({uid}, {BestOfRoot()}),
                    "the first with the index, else the first");
    }
  }

  // The sensor of the root datatype that selection takes, if it takes any.
  vesk::SensorUid BestOfRoot() const {
    const VirtualSensor* best = nullptr;
    for (const VirtualSensor& sensor : hub_) {
      if (!IsOf(parsed_.root, sensor) || !HasWantedType(sensor.uid)) continue;
      if (HasIndex(sensor.uid, parsed_.last_index.value_or(0))) {
        return sensor.uid;
      }
      if (best == nullptr) best = &sensor;
    }
    fuzz::require(best != nullptr, "there is one to be selected");
    return best->uid;
  }

  int Match(sns_std_sensor_stream_type* type, bool auto_select,
            SuidSet* suids) {
    Prepare();
    SensorLookup lookup(connection_.get());
    return auto_select ? lookup.Match(spec_, type, suids, true)
                       : lookup.Match(spec_, type, suids);
  }

  // The same faults, counted anew, for each way of matching.
  void Prepare() {
    monitor_.emplace(kCallBudget);
    platform::stand_in().faults = faults_;
    platform::stand_in().observer = [this](const std::string& call) {
      monitor_->Note(call);
    };
  }

  void CheckFound(const vesk::SensorUid& uid) const {
    fuzz::require(Finds(parsed_.last_datatype, uid), "of the last datatype");
    if (!parsed_.has_child) return;
    const auto has_name = [&](const VirtualSensor& sensor) {
      return Finds(parsed_.root, sensor.uid) &&
             Attribute(sensor.uid, SNS_ATTR_NAME) ==
                 Attribute(uid, SNS_ATTR_NAME);
    };
    fuzz::require(std::any_of(hub_.begin(), hub_.end(), has_name),
                  "a name that a sensor of the root datatype has");
  }

  static bool IsOf(const std::string& datatype, const VirtualSensor& sensor) {
    return datatype.empty() || sensor.datatype == datatype;
  }

  // Whether looking up the datatype yields the UID.
  bool Finds(const std::string& datatype, const vesk::SensorUid& uid) const {
    return std::any_of(hub_.begin(), hub_.end(), [&](const VirtualSensor& s) {
      return Equal({s.uid}, {uid}) && IsOf(datatype, s);
    });
  }

  bool HasIndex(const vesk::SensorUid& uid, long index) const {
    return Attribute(uid, SNS_ATTR_HW_ID) == AttrValue(index);
  }

  bool HasWantedType(const vesk::SensorUid& uid) const {
    return Attribute(uid, SNS_ATTR_STREAM_TYPE) ==
           AttrValue(static_cast<long>(wanted_));
  }

  // Of sensors with the same UID the last one's count.
  std::optional<AttrValue> Attribute(const vesk::SensorUid& uid,
                                     sns_std_attr_id id) const {
    const auto sensor = std::find_if(
        hub_.rbegin(), hub_.rend(),
        [&](const VirtualSensor& s) { return Equal({s.uid}, {uid}); });
    const auto found = sensor->attributes.find(id);
    if (found == sensor->attributes.end()) return std::nullopt;
    return found->second;
  }

  static bool Equal(const SuidSet& a, const SuidSet& b) {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(),
                      [](const vesk::SensorUid& x, const vesk::SensorUid& y) {
                        return x.low == y.low && x.high == y.high;
                      });
  }

  const HubModel hub_;
  const std::vector<platform::Fault> faults_;
  sns_std_sensor_stream_type wanted_;
  const std::string spec_;
  const Parsed parsed_;
  // What an index beyond the range of int stands for is open.
  const bool index_in_range_ = parsed_.last_index.value_or(0) <= INT_MAX;
  platform::SimulatedClock clock_ = platform::SimulatedClock(0);
  std::optional<fuzz::CallMonitor> monitor_;
  std::unique_ptr<vesk::Connection> connection_;
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  FuzzedDataProvider input(data, size);
  Run(&input).Check();
  return 0;
}
