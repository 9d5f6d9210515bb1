#include <regex>

#include "lookup/sensor_lookup.h"
#include "tests/support.h"

namespace {

sns_std_sensor_stream_type type_of(const std::string& letter) {
  return static_cast<sns_std_sensor_stream_type>(
      std::string("sco").find(letter));
}

// Sensors of several packages. The hub's order is not the order of the UIDs,
// and index 0 is not always first, or there.
class LookupTest : public HubTest {
 protected:
  LookupTest() {
    hub_.model = make_sensors(
        "12,accel,imu_b,1 11,accel,imu_a,0 22,temp,imu_b,1 21,temp,imu_a,0 "
        "23,temp,baro,2 32,light,light,0,1 31,light,light,0 42,vsync,vsync,2 "
        "41,vsync,vsync,1 51,lonely,solo,0 71,nameless,,0 81,typeless,imu_a,0 "
        "61,mute,solo,0");
    (*hub_.model)[10].attributes[SNS_ATTR_NAME] = true;         // unreadable
    (*hub_.model)[11].attributes[SNS_ATTR_STREAM_TYPE] = "no";  // unreadable
    (*hub_.model)[12].attributes.erase(SNS_ATTR_HW_ID);
    connection_ = Connect();
  }

  // The outcome has the number of the selected sensor, or the status.
  Outcome Select(const std::string& spec, const std::string& letter = "s") {
    return capture([&] {
      vesk::SensorUid uid = {77, 7};
      const int status =
          SensorLookup(connection_.get()).Lookup(spec, type_of(letter), &uid);
      EXPECT_EQ(uid.low == 77, status != 0);
      return status != 0 ? status : static_cast<int>(uid.low);
    });
  }

  // The numbers of the sensors that are found, and the status if it is not 0.
  std::string Collect(const std::string& spec, const std::string& letter) {
    auto type = type_of(letter);
    SensorLookup::SuidSet found;
    const int status =
        SensorLookup(connection_.get())
            .Match(spec, letter.empty() ? nullptr : &type, &found);
    std::string text;
    for (const auto& uid : found) text += std::to_string(uid.low) + ' ';
    return text + (status != 0 ? std::to_string(status) : "");
  }

  std::unique_ptr<vesk::Connection> connection_;
};

// With the index that no sensor has, of which it warns, or the child that there
// is none of.
TEST_F(LookupTest, SelectsOneSensor) {
  static_assert(ENOENT == 2 && EBADMSG == 74);
  for (const auto& [spec, type, result, missing] : table<4>(R"(
accel;accel.;accel..;accel.temp.accel | s | 11 |
accel.1;accel.01.;.1                  | s | 12 |
accel.temp;accel..temp                | s | 21 |
accel.1.temp                          | s | 22 |
vsync                                 | s | 42 |
vsync.1                               | s | 41 |
light                                 | s | 31 |
light                                 | c | 32 |
accel.9                               | s | 12 | 9
accel.99999999999                     | s | 12 | 2147483647
accel.9.temp                          | s | 22 | 9
accel.temp.5                          | s | 21 | 5
mute.0                                | s | 61 | 0
light                                 | o | -2 |
light.0                               | o | -2 | 0
nosuch;Accel                          | s | -2 |
nosuch.3                              | s | -2 | 3
lonely.temp.1                         | s | -2 | temp
accel.1a                              | s | -2 | 1a
accel.-1                              | s | -2 | -1
typeless;nameless.temp;accel.nameless | s | -74 |
)")) {
    std::string err;
    if (missing.find_first_not_of("0123456789") != std::string::npos) {
      err = logged("error: No children of type \"" + missing + "\"");
    } else if (!missing.empty()) {
      err = "fennick: warning: Unable to find sensor index " + missing +
            "; performing auto-selection\n";
    }
    expect(Select(spec, type), std::stoi(result), "", err, spec);
  }
  expect(Select("vsync" + repeat(".vsync", 999)), 42, "");
  expect(Select(repeat(".", 1000)), -EINVAL, "",
         logged("error: Too many components in datatype specification"));
}

TEST_F(LookupTest, CollectsEveryMatch) {
  for (const auto& [spec, type, found] : table<3>(R"(
accel                              |   | 11 12
accel.1                            |   | 12
accel.temp                         |   | 21 22
accel.temp.1                       |   | 22
vsync.vsync                        |   | 41 42
light                              |   | 31 32
light                              | c | 32
accel.0.temp                       | c |
accel.9;lonely.temp;mute.0;nosuch  |   |
typeless                           |   | 81
typeless                           | s | -74
.0                                 | c | 32 -74
''                                 |   | 11 12 21 22 23 31 32 41 42 51 61 71 81
)")) {
    EXPECT_EQ(split(Collect(spec, type)), split(found)) << spec;
  }
}

// The shortest sequences of requests that show every kind of step, also those
// that a look at the results would not.
TEST_F(LookupTest, AsksTheHubStepByStep) {
  const auto requests = [&](const char* spec) {
    calls_.clear();
    Select(spec);
    return std::regex_replace(Calls("L"), std::regex("LoadAttributes [-0]*"),
                              "");
  };
  EXPECT_EQ(requests("vsync"), "Lookup vsync 2a 29 2a ");
  // The child has index 1, so that it is found in the second pass only.
  EXPECT_EQ(requests("accel.1.temp"),
            "Lookup accel c c Lookup temp 16 15 17 16 16 ");
}

// The vsyncs' third load is the first of the second pass; the third behind
// accel.temp is the parent's and the fifth that of a child.
TEST_F(LookupTest, PassesUpFailures) {
  for (const auto& [call, spec] : table<2>(R"(
Lookup accel;LoadAttributes#1                                   | accel
LoadAttributes#2;LoadAttributes#3                               | vsync
Lookup temp;LoadAttributes#2;LoadAttributes#3;LoadAttributes#5  | accel.temp
)")) {
    SetFaults(call + "=5");
    expect(Select(spec), 5, "", "", call);
  }
  SetFaults("LoadAttributes#2=7");  // what was collected before stays
  EXPECT_EQ(Collect("accel", ""), "12 7");
}

}  // namespace
