#include <cstdio>

#include "lookup/sensor_lookup.h"
#include "tests/support.h"

namespace {

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
    Connect();
  }

  // The numbers of the sensors that are found, the status if it is not 0, and
  // what is logged, by blanks.
  std::string Find(const std::string& spec, const std::string& endpoint,
                   bool auto_select) {
    const Outcome outcome = capture([&] {
      auto type = static_cast<sns_std_sensor_stream_type>(
          std::string("sco").find(endpoint));
      SensorLookup::SuidSet found;
      const int status = SensorLookup(connection_.get())
                             .Match(spec, endpoint.empty() ? nullptr : &type,
                                    &found, auto_select);
      for (const auto& uid : found) std::printf("%lu ", uid.low);
      if (status != 0) std::printf("%d ", status);
      return status;
    });
    return outcome.out + outcome.err;
  }
};

// What is selected, and what is collected, or the status: -ENOENT or -EBADMSG.
// Selection names the index that no sensor has, and the child that there is
// none of.
TEST_F(LookupTest, SelectsOneOrCollectsAll) {
  for (const auto& [spec, type, selected, missing, collected] : table<5>(R"(
accel;accel.;accel..;accel.temp.accel | s | 11  |            | 11 12
accel.1;accel.01.                     | s | 12  |            | 12
accel.temp;accel..temp                | s | 21  |            | 21 22
accel.1.temp                          | s | 22  |            | 22
vsync;vsync.vsync                     | s | 42  |            | 41 42
vsync.1                               | s | 41  |            | 41
light                                 | s | 31  |            | 31
light                                 | c | 32  |            | 32
accel.9                               | s | 12  | 9          |
accel.99999999999                     | s | 12  | 2147483647 |
accel.9.temp                          | s | 22  | 9          |
accel.temp.5                          | s | 21  | 5          |
mute.0                                | s | 61  | 0          |
light                                 | o | -2  |            |
light.0                               | o | -2  | 0          |
nosuch;Accel                          | s | -2  |            |
nosuch.3                              | s | -2  | 3          |
lonely.temp.1                         | s | -2  | "temp"     |
accel.1a                              | s | -2  | "1a"       |
accel.-1                              | s | -2  | "-1"       |
typeless.5                            | s | -74 | 5          |
accel.0.light                         | c | -2  | "light"    |
typeless;nameless.temp;accel.nameless | s | -74 |            | -74
.0                                    | c | 32  |            | 32 -74
light                                 |   |     |            | 31 32
typeless                              |   |     |            | 81
''|||| 11 12 21 22 23 31 32 41 42 51 61 71 81
)")) {
    const std::string err =
        missing.empty()     ? ""
        : missing[0] == '"' ? logged("error: No children of type " + missing)
                            : "fennick: warning: Unable to find sensor index " +
                                  missing + "; performing auto-selection\n";
    if (!type.empty()) {
      EXPECT_EQ(Find(spec, type, true), selected + ' ' + err) << spec;
    }
    EXPECT_EQ(split(Find(spec, type, false)), split(collected)) << spec;
  }
  EXPECT_EQ(Find("vsync" + repeat(".vsync", 999), "s", true), "42 ");
  EXPECT_EQ(
      Find(repeat(".", 1000), "s", true),
      "-22 " + logged("error: Too many components in datatype specification"));
}

// The shortest sequences of requests that show every kind of step, also those
// that a look at the results would not.
TEST_F(LookupTest, AsksTheHubStepByStep) {
  const auto requests = [&](const char* spec) {
    calls_.clear();
    Find(spec, "s", true);
    static const std::regex kNoise("LoadAttributes [-0]*|~Client ");
    return std::regex_replace(calls_, kNoise, "");
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
    EXPECT_EQ(Find(spec, "s", true), "5 ") << call;
  }
  SetFaults("LoadAttributes#2=7");  // what was collected before stays
  EXPECT_EQ(Find("accel", "", false), "12 7 ");
}

}  // namespace
