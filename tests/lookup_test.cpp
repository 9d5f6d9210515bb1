
#include "lookup/sensor_lookup.h"
#include "tests/support.h"

namespace {

constexpr int kUnreadable = -EBADMSG;

// Sensors of several packages. The hub's order is not the order of the UIDs,
// and index 0 is not always first, or there.
class LookupTest : public HubTest {
 protected:
  LookupTest() {
    setup_.model =
        make_sensors({{12, "accel", "imu_b", 1},
                      {11, "accel", "imu_a", 0},
                      {22, "temp", "imu_b", 1},
                      {21, "temp", "imu_a", 0},
                      {23, "temp", "baro", 2},
                      {24, "temp", "imu_ab", 3},
                      {32, "light", "light", 0, SNS_STREAM_TYPE_ON_CHANGE},
                      {31, "light", "light", 0},
                      {42, "vsync", "vsync", 10},
                      {41, "vsync", "vsync", 1},
                      {51, "lonely", "solo", 0},
                      {71, "nameless", "", 0},
                      {81, "typeless", "imu_a", 0},
                      {61, "mute", "imu", 0}});
    auto& model = *setup_.model;
    model[11].attributes[SNS_ATTR_NAME] = true;         // unreadable
    model[12].attributes[SNS_ATTR_STREAM_TYPE] = "no";  // unreadable
    model[13].attributes[SNS_ATTR_HW_ID] = "no";        // unreadable
    Connect();
  }

  // Selects one sensor: its number or the status, and what is logged.
  Outcome Select(const std::string& spec, char endpoint) {
    return capture([&] {
      vesk::SensorUid suid = {999, 0};
      const int status = SensorLookup(connection_.get())
                             .Lookup(spec, stream_type_of(endpoint), &suid);
      if (status != 0 && suid.low != 999) return 1;  // it was to be left alone
      return status != 0 ? status : static_cast<int>(suid.low);
    });
  }
};

std::string no_index(const std::string& index) {
  return warning("Unable to find sensor index " + index +
                 "; performing auto-selection");
}

std::string no_children(const std::string& datatype) {
  return error("No children of type \"" + datatype + "\"");
}

TEST_F(LookupTest, SelectsOne) {
  const struct {
    Words specs;
    char endpoint;
    int result;  // the sensor's number, or a status
    std::string log = "";
  } kRows[] = {
      {{"accel", "accel.", "accel..", "accel.temp.accel"}, 's', 11},
      {{"accel.1", "accel.01."}, 's', 12},
      {{"accel.temp", "accel..temp."}, 's', 21},
      {{"accel.1.temp"}, 's', 22},
      {{"vsync", "vsync.vsync", "vsync.010"}, 's', 42},
      {{"vsync.1"}, 's', 41},
      {{"light"}, 's', 31},
      {{"light", ".0"}, 'c', 32},
      {{"accel.9"}, 's', 12, no_index("9")},
      {{"accel.99999999999"}, 's', 12, no_index("2147483647")},
      {{"accel.9.temp"}, 's', 22, no_index("9")},
      {{"accel.temp.5"}, 's', 21, no_index("5")},
      {{"mute.0"}, 's', 61, no_index("0")},
      {{"light"}, 'o', -ENOENT},
      {{"light.0"}, 'o', -ENOENT, no_index("0")},
      {{"nosuch", "Accel"}, 's', -ENOENT},
      {{"nosuch.3"}, 's', -ENOENT, no_index("3")},
      {{"lonely.temp.1", "mute.temp"}, 's', -ENOENT, no_children("temp")},
      {{"accel.1a"}, 's', -ENOENT, no_children("1a")},
      {{"accel.0.light"}, 'c', -ENOENT, no_children("light")},
      {{"typeless", "nameless.temp", "accel.nameless"}, 's', kUnreadable},
      {{"vsync" + repeat(".vsync", 999)}, 's', 42},
      {{repeat(".", 1000)},
       's',
       -EINVAL,
       error("Too many components in datatype specification")},
  };
  for (const auto& row : kRows) {
    for (const std::string& spec : row.specs) {
      EXPECT_EQ(Select(spec, row.endpoint), (Outcome{row.result, "", row.log}))
          << spec.substr(0, 80);
    }
  }
  SensorLookup lookup(connection_.get());
  EXPECT_EQ(lookup.Lookup("accel", SNS_STREAM_TYPE_STREAMING, nullptr), 0);
}

TEST_F(LookupTest, CollectsAll) {
  sns_std_sensor_stream_type streaming = SNS_STREAM_TYPE_STREAMING;
  sns_std_sensor_stream_type on_change = SNS_STREAM_TYPE_ON_CHANGE;
  const struct {
    const char* spec;
    sns_std_sensor_stream_type* type;
    std::vector<uint64_t> found;
    int status = 0;
  } kRows[] = {
      {"accel", &streaming, {11, 12}},
      {"accel.1", &streaming, {12}},
      {"accel.9", &streaming, {}},
      {"accel.temp", nullptr, {21, 22}},
      {"accel.temp.1", &streaming, {22}},
      {"lonely.temp", nullptr, {}},
      {"light", &on_change, {32}},
      {"light", nullptr, {31, 32}},
      {"typeless", nullptr, {81}},
      {"accel.nameless", nullptr, {}, kUnreadable},
      {".0", &on_change, {32}, kUnreadable},
      {"", nullptr, {11, 12, 21, 22, 23, 24, 31, 32, 41, 42, 51, 61, 71, 81}},
  };
  for (const auto& row : kRows) {
    SensorLookup::SuidSet suids;
    const int status =
        SensorLookup(connection_.get()).Match(row.spec, row.type, &suids);
    EXPECT_EQ(status, row.status) << row.spec;
    std::vector<uint64_t> found;
    for (const vesk::SensorUid& suid : suids) found.push_back(suid.low);
    EXPECT_EQ(found, row.found) << row.spec;
  }
}

// Each call in turn fails, and is then the last.
TEST_F(LookupTest, PassesUpFailures) {
  const auto load = [](uint64_t id) {
    return "LoadAttributes " + vesk::SensorUid{id, 0}.str();
  };
  const std::pair<std::string, Words> kRows[] = {
      {"vsync", {"Lookup vsync", load(42), load(41), load(42)}},
      // The child has index 1, so that it takes a second pass.
      {"accel.1.temp",
       {"Lookup accel", load(12), load(12), "Lookup temp", load(22), load(21),
        load(23), load(24), load(22), load(22)}},
      {"mute.7.temp",
       {"Lookup mute", load(61), load(61), "Lookup temp", load(22), load(21),
        load(23), load(24)}},
  };
  for (const auto& [spec, calls] : kRows) {
    Words expected;
    for (const std::string& failing : calls) {
      expected.push_back(failing);
      Words made;
      platform::probe().observer = [&](const std::string& call) {
        made.push_back(call);
        faults_ = {{made.size() < expected.size() ? "" : call, 5}};
      };
      EXPECT_EQ(Select(spec, 's').status, 5) << spec;
      EXPECT_EQ(made, expected);
      platform::probe().observer = nullptr;  // it refers to this round
    }
  }
}

}  // namespace
