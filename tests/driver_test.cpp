#include <fcntl.h>

#include "driver/usage.h"
#include "tests/support.h"

namespace {

const std::string kUsageText = std::string(kUsage) + '\n';
constexpr int kInvalid = 234;  // -EINVAL

// With datatypes that look like options and commands.
class DriverTest : public HubTest {
 protected:
  DriverTest() {
    auto& model = *setup_.model;
    for (const auto& sensor : make_sensors(
             {{5, "-x", "odd"}, {6, "listing", "odd"}, {7, "List", "odd"}})) {
      model.push_back(sensor);
    }
    model[1].attributes[SNS_ATTR_DISPLAY_NAME] = "Gyroscope 100%d";
    model[3].attributes.erase(SNS_ATTR_NAME);
    model[4].attributes[SNS_ATTR_RATES] = Floats{40};
  }
};

TEST_F(DriverTest, RejectsBadCommandLines) {
  const auto reject = [](const std::string& message,
                         const std::vector<Words>& lines,
                         const std::string& usage = "") {
    for (const Words& words : lines) {
      EXPECT_EQ(run_tool(words),
                (Outcome{kInvalid, "", error(message) + usage}));
    }
  };
  reject("LEVEL must be between 1 and 4, inclusive",
         {{"-v0"}, {"-v5"}, {"-v3x"}, {"-v", ""}, {"-h", "-v", "9"}});
  reject("Accuracy LEVEL must be in the range [0, 3]",
         {{"-a", "4"}, {"-a", "-1"}});
  reject("SAMPLES must be an unsigned integer",
         {{"-n", "12abc"},
          {"accel", "-n", "08", "list"},
          {"--count", "99999999999999999999"}});
  reject("RATE must be non-negative",
         {{"-r", "-0.5"}, {"-r", "2x"}, {"-r", "1e99"}});
  reject("SECONDS must be a positive integer",
         {{"-t", "0"}, {"-t", "1.5"}, {"-t", "4294967296"}});
  reject("Invalid option '-dxp'", {{"accel", "-dxp", "accel"}}, kUsageText);
  reject("Invalid option '--help=1'", {{"--help=1"}}, kUsageText);
  reject("Invalid option '--ver'", {{"--ver"}}, kUsageText);
  reject("Missing argument for option '-t'", {{"accel", "-t"}}, kUsageText);
  reject("Missing argument for option '-dt'", {{"-dt"}}, kUsageText);
  reject("Missing argument for option '--cou'", {{"-d", "--cou"}}, kUsageText);
}

// Each sensor's trace shows what the setters got. The hub takes no requests,
// which ends the session.
TEST_F(DriverTest, TakesGoodCommandLines) {
  faults_ = {{"SendRequests", 5}};
  const std::pair<Words, std::string> kRows[] = {
      {{"-n", "0x10", "-r", "0.5", "accel"}, "accel.s -n16 -r0.5"},
      {{"-n010", "--rate=1e1", "accel"}, "accel.s -n8 -r10.0"},
      {{"-n-1", "-a4294967296", "-r7", "accel"}, "accel.s -n4294967295 -r7.0"},
      {{"-n", "", "-r7", "accel", "-v9", "-r8", "-n2"}, "accel.s -n0 -r7.0"},
      {{"-n4294967297", "-r7", "--", "-x"}, "-x.s -n1 -r7.0"},
      {{"--str", "--d", "-dspn1", "-r7", "listing"}, "listing.s -n1 -r7.0"},
      {{"--on-change", "-sr7", "--acc", "3", "List"}, "List.s -n0 -r7.0"},
      {{"--one-shot", "--pass", "motion"}, "motion.o -n0 -r0.0"},
      {{"-r7", ""}, ".s -n0 -r7.0"},
  };
  for (const auto& [words, trace] : kRows) {
    Words all = {"-v4", "-v", "3", "--time=1"};
    all.insert(all.end(), words.begin(), words.end());
    EXPECT_EQ(run_tool(all).err, info(trace));
    all[2] = "2";  // at which it is not shown
    EXPECT_EQ(run_tool(all).err, "");
  }
}

// What holds for the next datatype, for all that follow, and for the session.
TEST_F(DriverTest, AppliesOptionsToTheDatatypesBehindThem) {
  ShowCalls({"Enable"});
  const Words words = {"-v2",  "-t1",  "-p",   "nosuch", "accel", "--",  "-x",
                       "-r20", "gyro", "-or9", "motion", "-s",    "-r30"};
  const std::string out =
      "Sampling from sensor type accel.s: imu.\n"
      "Sampling from sensor type gyro.s: Gyroscope 100%d.\n"
      "Sampling from sensor type motion.o: motion.\n"
      "Sampling from sensor type -x.s: odd.\n"
      "[Enable 00000000-0000-0000-0000-000000000001 10 Hz passive]\n"
      "[Enable 00000000-0000-0000-0000-000000000002 20 Hz]\n"
      "[Enable 00000000-0000-0000-0000-000000000004 -1 Hz]\n"
      "[Enable 00000000-0000-0000-0000-000000000005 40 Hz]\n" +
      summary(
          "accel.s 0 samples @ ~0.0 Hz\ngyro.s 0 samples @ ~0.0 Hz\n"
          "motion.o 0 samples\n-x.s 0 samples @ ~0.0 Hz\n");
  const std::string err =
      error("Unable to find nosuch.s") +
      info("Auto-selected 10.0 Hz sample rate for accel.s") +
      info("Auto-selected 40.0 Hz sample rate for -x.s");
  expect_runs({{words, {5, out, err}, {{"SendRequests", 5, 1}}}});
}

TEST_F(DriverTest, ShowsUsageAndVersion) {
  expect_runs({{{"-h", "-x"}, {0, kUsageText}},
               {{"accel", "-dh"}, {0, kUsageText}},
               {{"--version", "-x"}, {0, "fennick version 2.0\n"}},
               {{"list", "--version"}, {0, "fennick version 2.0\n"}}});
  platform::probe().observer = nullptr;  // which keeps the warning back
  expect_runs({{{"-h"},
                {13, "", warning("Failed to open log file")},
                {{"openLogFile", 1}, {"Create", 13}}}});
}

// The calls of whole runs, in one order with what is printed, and the signals
// that are blocked; HUP is all along, by the parent.
TEST_F(DriverTest, RunsInOrder) {
  ShowCalls({"openLogFile", "Create", "closeLogFile", "~Connection"});
  const std::string open = "[openLogFile; HUP blocked]\n";
  const std::string create = open + "[Create; HUP INT blocked]\n";
  const std::string destroy = "[~Connection; HUP blocked]\n";
  const std::string close = "[closeLogFile; HUP blocked]\n" + destroy;
  const std::string level = error("LEVEL must be between 1 and 4, inclusive");
  const std::string none =
      error("No sensors were found for the given datatypes");
  expect_runs({{{"-v9"}, {kInvalid, open, level}},
               {{}, {13, create + close}, {{"Create", 13}}},
               {{"accel"},
                {254, create + close, none},
                {{"LoadAttributes", 5, 2}}},  // the one behind the lookup
               {{"-h"}, {0, create + kUsageText + destroy}},
               {{"gyro", "list", "-h"}, {0, create + kUsageText + close}}},
              [] { block_signal(SIGHUP); });
}

TEST_F(DriverTest, ReportsOutputThatFails) {
  (*setup_.model)[3].attributes.erase(SNS_ATTR_STREAM_TYPE);
  const std::string failed = error("Unable to write to standard output");
  expect_runs({{{"-n5", "accel"}, {0, "", failed}},
               {{"--version"}, {0, "", failed}},
               {{"list", "accel"}, {251, "", failed}},
               {{"list", "--version"}, {251, "", failed}},
               {{"list", "accel", "-h"}, {251, "", failed}},
               {{"list", "nosuch"}, {0, "", ""}},
               {{"list", "accel", "-c", "motion"}, {254, "", failed}}},
              [] { dup2(open("/dev/full", O_WRONLY), STDOUT_FILENO); });
}

}  // namespace
