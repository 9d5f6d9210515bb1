#include <optional>
#include <regex>

#include "lookup/sensor_lookup.h"
#include "tests/support.h"

namespace {

using Uids = std::vector<uint64_t>;

constexpr auto kStreaming = SNS_STREAM_TYPE_STREAMING;
constexpr auto kOnChange = SNS_STREAM_TYPE_ON_CHANGE;
constexpr auto kOneShot = SNS_STREAM_TYPE_SINGLE_OUTPUT;

// Sensors of several packages. The hub's order is not the order of the UIDs,
// and index 0 is not always first, or there.
class LookupTest : public HubTest {
 protected:
  LookupTest() {
    hub_.model = {
        make_sensor(12, "accel", "imu_b", 1),
        make_sensor(11, "accel", "imu_a", 0),
        make_sensor(22, "temp", "imu_b", 1),
        make_sensor(21, "temp", "imu_a", 0),
        make_sensor(23, "temp", "baro", 2),
        make_sensor(32, "light", "light", 0, kOnChange),
        make_sensor(31, "light", "light", 0),
        make_sensor(42, "vsync", "vsync", 2),
        make_sensor(41, "vsync", "vsync", 1),
        make_sensor(51, "lonely", "solo", 0),
        make_sensor(61, "mute", "solo", 0),
        make_sensor(71, "nameless", "", 0),
        make_sensor(81, "typeless", "imu_a", 0),
    };
    sensor(61).attributes.erase(SNS_ATTR_HW_ID);
    sensor(71).attributes[SNS_ATTR_NAME] = true;         // unreadable
    sensor(81).attributes[SNS_ATTR_STREAM_TYPE] = "no";  // unreadable
  }
  platform::VirtualSensor& sensor(uint64_t id) {
    for (auto& s : hub_.model) {
      if (s.uid.low == id) return s;
    }
    return hub_.model.front();
  }
};

TEST_F(LookupTest, SelectsOneSensor) {
  // A number: the warning that no sensor has that index. A name: the error
  // that there are no children of it.
  const struct {
    std::string spec;
    sns_std_sensor_stream_type type;
    int status;
    uint64_t uid;
    std::string message;
  } kCases[] = {
      {"accel", kStreaming, 0, 11, ""},
      {"accel.", kStreaming, 0, 11, ""},
      {"accel..", kStreaming, 0, 11, ""},
      {"accel.1", kStreaming, 0, 12, ""},
      {"accel.01.", kStreaming, 0, 12, ""},
      {"accel.9", kStreaming, 0, 12, "9"},
      {"accel.99999999999", kStreaming, 0, 12, "2147483647"},
      {"accel.temp", kStreaming, 0, 21, ""},
      {"accel..temp", kStreaming, 0, 21, ""},
      {"accel.1.temp", kStreaming, 0, 22, ""},
      {"accel.9.temp", kStreaming, 0, 22, "9"},
      {"accel.temp.5", kStreaming, 0, 21, "5"},
      {"accel.temp.accel", kStreaming, 0, 11, ""},
      {"vsync", kStreaming, 0, 42, ""},
      {"vsync.1", kStreaming, 0, 41, ""},
      {"light", kStreaming, 0, 31, ""},
      {"light", kOnChange, 0, 32, ""},
      {"light", kOneShot, -ENOENT, 0, ""},
      {"light.0", kOneShot, -ENOENT, 0, "0"},
      {"mute.0", kStreaming, 0, 61, "0"},
      {"nosuch", kStreaming, -ENOENT, 0, ""},
      {"nosuch.3", kStreaming, -ENOENT, 0, "3"},
      {"lonely.temp.1", kStreaming, -ENOENT, 0, "temp"},
      {"accel.1a", kStreaming, -ENOENT, 0, "1a"},
      {"accel.-1", kStreaming, -ENOENT, 0, "-1"},
      {"Accel", kStreaming, -ENOENT, 0, ""},
      {".1", kStreaming, 0, 12, ""},
      {"typeless", kStreaming, -EBADMSG, 0, ""},
      {"nameless.temp", kStreaming, -EBADMSG, 0, ""},
      {"accel.nameless", kStreaming, -EBADMSG, 0, ""},
      {"vsync" + repeat(".vsync", 999), kStreaming, 0, 42, ""},
  };
  const auto connection = Connect();
  for (const auto& c : kCases) {
    SCOPED_TRACE(c.spec.substr(0, 40));
    vesk::SensorUid uid = {0, 0};
    const Captured captured = capture([&] {
      EXPECT_EQ(SensorLookup(connection.get()).Lookup(c.spec, c.type, &uid),
                c.status);
    });
    EXPECT_EQ(uid.low, c.uid);
    const bool is_index =
        c.message.find_first_not_of("0123456789") == std::string::npos;
    const std::string expected =
        is_index
            ? "fennick: warning: Unable to find sensor index " + c.message +
                  "; performing auto-selection\n"
            : "fennick: error: No children of type \"" + c.message + "\"\n";
    EXPECT_EQ(captured.err, c.message.empty() ? "" : expected);
  }
  EXPECT_EQ(SensorLookup(connection.get()).Lookup("accel", kStreaming, nullptr),
            0);
  const Captured refused = capture([&] {
    EXPECT_EQ(SensorLookup(connection.get())
                  .Lookup(repeat(".", 1000), kStreaming, nullptr),
              -EINVAL);
  });
  EXPECT_EQ(refused.err,
            "fennick: error: Too many components in datatype specification\n");
}

TEST_F(LookupTest, CollectsEveryMatch) {
  const struct {
    std::string spec;
    std::optional<sns_std_sensor_stream_type> type;
    int status;
    Uids uids;
  } kCases[] = {
      {"accel", {}, 0, {11, 12}},
      {"accel.1", {}, 0, {12}},
      {"accel.9", {}, 0, {}},
      {"accel.temp", {}, 0, {21, 22}},
      {"accel.temp.1", {}, 0, {22}},
      {"accel.0.temp", kOnChange, 0, {}},
      {"vsync.vsync", {}, 0, {41, 42}},
      {"light", {}, 0, {31, 32}},
      {"light", kOnChange, 0, {32}},
      {"lonely.temp", {}, 0, {}},
      {"mute.0", {}, 0, {}},
      {"nosuch", {}, 0, {}},
      {"typeless", {}, 0, {81}},
      {"typeless", kStreaming, -EBADMSG, {}},
      {"", {}, 0, {11, 12, 21, 22, 23, 31, 32, 41, 42, 51, 61, 71, 81}},
      {".0", kOnChange, -EBADMSG, {32}},
  };
  const auto connection = Connect();
  for (const auto& c : kCases) {
    SCOPED_TRACE(c.spec);
    auto type = c.type;
    SensorLookup::SuidSet found;
    EXPECT_EQ(SensorLookup(connection.get())
                  .Match(c.spec, type ? &*type : nullptr, &found),
              c.status);
    Uids uids;
    for (const vesk::SensorUid& uid : found) uids.push_back(uid.low);
    EXPECT_EQ(uids, c.uids);
  }
}

// The shortest sequences of requests that show every kind of step, also those
// that a look at the results would not.
TEST_F(LookupTest, AsksTheHubStepByStep) {
  const auto requests = [&](const char* spec) {
    const auto connection = Connect();
    calls_.clear();
    EXPECT_EQ(SensorLookup(connection.get()).Lookup(spec, kStreaming, nullptr),
              0);
    return std::regex_replace(Calls("L"), std::regex("LoadAttributes [-0]*"),
                              "");
  };
  EXPECT_EQ(requests("vsync"), "Lookup vsync 2a 29 2a");
  // The child has index 1, so that it is found in the second pass only.
  EXPECT_EQ(requests("accel.1.temp"),
            "Lookup accel c c Lookup temp 16 15 17 16 16");
}

TEST_F(LookupTest, PassesUpFailures) {
  const struct {
    platform::Fault fault;
    const char* spec;
  } kCases[] = {
      {{"Lookup accel", -5}, "accel"},
      {{"Lookup temp", 7}, "accel.temp"},
      {{"LoadAttributes", -110, 1}, "accel"},
      {{"LoadAttributes", 7, 2}, "vsync"},
      {{"LoadAttributes", 7, 3}, "vsync"},  // in the second pass
      {{"LoadAttributes", -1, 2}, "accel.temp"},
      {{"LoadAttributes", -1, 3}, "accel.temp"},  // of the parent
      {{"LoadAttributes", -1, 5}, "accel.temp"},  // of a child
  };
  const auto connection = Connect();
  for (const auto& c : kCases) {
    SCOPED_TRACE(c.fault.call + ' ' + std::to_string(c.fault.nth));
    hub_.faults = {c.fault};
    vesk::SensorUid uid = {77, 7};
    EXPECT_EQ(SensorLookup(connection.get()).Lookup(c.spec, kStreaming, &uid),
              c.fault.status);
    EXPECT_EQ(uid.low, 77u);
  }
  // What was collected before a failure stays.
  hub_.faults = {{"LoadAttributes", 7, 2}};
  SensorLookup::SuidSet found;
  EXPECT_EQ(SensorLookup(connection.get()).Match("accel", nullptr, &found), 7);
  EXPECT_EQ(found.size(), 1u);
}

}  // namespace
