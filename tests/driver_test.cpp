#include <cstdio>

#include "driver/usage.h"
#include "tests/support.h"

namespace {

using testing::EndsWith;
using testing::HasSubstr;
using Words = std::vector<std::string>;

const std::string kUsageText = std::string(kUsage) + '\n';
const std::string kError = "fennick: error: ";
constexpr int kInvalid = 234;  // -EINVAL as an exit status

std::string text(const Words& words) { return testing::PrintToString(words); }

// Runs the whole tool, each time in a process of its own, on a hub whose
// sensors have delivered all that they will after half a second of hub time.
class DriverTest : public HubTest {
 protected:
  DriverTest() {
    hub_.model = {make_sensor(1, "accel", "imu", 0),
                  make_sensor(2, "gyro", "imu", 0),
                  make_sensor(3, "-x", "odd", 0)};
    hub_.clock = &clock_;
    // Neither the log file nor a choice is of interest here.
    hub_.observer = [this](const std::string& call) {
      calls_.push_back(call);
      if (call == "openLogFile") vesk::setLogLevel(vesk::kError);
    };
  }
  platform::SimulatedClock clock_{platform::kTicksPerSecond / 2};
};

TEST_F(DriverTest, RejectsBadCommandLines) {
  const std::string kLevel = "LEVEL must be between 1 and 4, inclusive\n";
  const std::string kAccuracy = "Accuracy LEVEL must be in the range [0, 3]\n";
  const std::string kSamples = "SAMPLES must be an unsigned integer\n";
  const std::string kRate = "RATE must be non-negative\n";
  const std::string kSeconds = "SECONDS must be a positive integer\n";
  const auto invalid = [](const std::string& option) {
    return "Invalid option '" + option + "'\n" + kUsageText;
  };
  const auto missing = [](const std::string& option) {
    return "Missing argument for option '" + option + "'\n" + kUsageText;
  };
  const struct {
    Words arguments;
    std::string message;
  } kCases[] = {
      {{"-v", "0"}, kLevel},
      {{"-v", "5"}, kLevel},
      {{"-v", "x"}, kLevel},
      {{"-v", "3x"}, kLevel},
      {{"-v", "3 "}, kLevel},
      {{"-v", ""}, kLevel},
      {{"-v", "-1"}, kLevel},
      {{"-h", "-v", "9"}, kLevel},
      {{"-x", "-v", "2", "-v9"}, kLevel},
      {{"--verbose=18446744073709551617"}, kLevel},
      {{"-a", "4"}, kAccuracy},
      {{"-a", "-1"}, kAccuracy},
      {{"-a", "2.0"}, kAccuracy},
      {{"-a", "99999999999999999999"}, kAccuracy},
      {{"-n", "12abc"}, kSamples},
      {{"-n", "08"}, kSamples},
      {{"--count", "1e3"}, kSamples},
      {{"-r", "-0.5"}, kRate},
      {{"-r", "fast"}, kRate},
      {{"-r", "1e99"}, kRate},
      {{"-r", "1e-99"}, kRate},
      {{"-r", "50Hz"}, kRate},
      {{"-t", "0"}, kSeconds},
      {{"-t", ""}, kSeconds},
      {{"-t", "1.5"}, kSeconds},
      {{"-t", "4294967296"}, kSeconds},
      {{"accel", "-t", "x"}, kSeconds},
      {{"-x", "accel"}, invalid("-x")},
      {{"-dxp"}, invalid("-dxp")},
      {{"-dpx", "accel"}, invalid("-dpx")},
      {{"--bogus=1"}, invalid("--bogus=1")},
      {{"--help=1"}, invalid("--help=1")},
      {{"--ver"}, invalid("--ver")},
      {{"--o"}, invalid("--o")},
      {{"accel", "-?"}, invalid("-?")},
      {{"accel", "-t"}, missing("-t")},
      {{"-dt"}, missing("-dt")},
      {{"-d", "--time"}, missing("--time")},
      {{"--cou"}, missing("--cou")},
  };
  for (const auto& c : kCases) {
    SCOPED_TRACE(text(c.arguments));
    const Process::Outcome outcome = RunTool(c.arguments);
    EXPECT_EQ(outcome.status, kInvalid);
    EXPECT_EQ(outcome.out, "");
    EXPECT_EQ(outcome.err, kError + c.message);
  }
}

// What the setters got shows in the trace of each sensor.
TEST_F(DriverTest, TakesGoodCommandLines) {
  const struct {
    Words arguments;
    std::string trace;
  } kCases[] = {
      {{"-n", "0x10", "-r", "2.5", "accel"}, "accel.s -n16 -r2.5"},
      {{"-n010", "-r1e1", "accel"}, "accel.s -n8 -r10.0"},
      {{"-n", "-1", "--rate= 0x10", "accel"}, "accel.s -n4294967295 -r16.0"},
      {{"-n", "", "-r", "", "accel"}, "accel.s -n0 -r10.0"},
      {{"-n4294967297", "-a4294967296", "-a3", "accel"}, "accel.s -n1 -r10.0"},
      {{"-r50", "accel", "-n1", "gyro", "-r5"},
       "accel.s -n0 -r50.0\nfennick: gyro.s -n1 -r50.0"},
      {{"-r50", "accel", "-r0", "gyro", "-d"},
       "accel.s -n0 -r50.0\nfennick: gyro.s -n0 -r10.0"},
      {{"-n1", "gyro", "-v9", "-n2", "accel"},
       "accel.s -n2 -r10.0\nfennick: gyro.s -n1 -r10.0"},
      {{"-n1", "--", "-x"}, "-x.s -n1 -r10.0"},
      {{"--str", "--d", "-dspn1", "accel"}, "accel.s -n1 -r10.0"},
      {{"-n1", "", "--acc", "2"}, ".s -n1 -r10.0"},
      {{"-n1", "nosuch", "accel", "nosuch"}, "accel.s -n1 -r10.0"},
  };
  hub_.faults = {{"SendRequests", 5}};
  for (const auto& c : kCases) {
    SCOPED_TRACE(text(c.arguments));
    Words arguments = {"-v3", "-v", "3", "-t1"};
    arguments.insert(arguments.end(), c.arguments.begin(), c.arguments.end());
    const Process::Outcome outcome = RunTool(arguments);
    EXPECT_EQ(outcome.status, 5);
    EXPECT_THAT(outcome.err, EndsWith("fennick: " + c.trace + '\n'));
  }
}

TEST_F(DriverTest, AnswersOnlyOnceConnected) {
  const std::string kVersion = "fennick version 2.0\n";
  const struct {
    Words arguments;
    std::string out;
  } kCases[] = {
      {{"-h"}, kUsageText},           {{"--he", "accel"}, kUsageText},
      {{"accel", "-dh"}, kUsageText}, {{"--version", "-x"}, kVersion},
      {{"list", "-h"}, kUsageText},   {{"list", "--version"}, kVersion},
  };
  for (const int status : {0, 13}) {
    if (status != 0) hub_.faults = {{"Create", status}};
    for (const auto& c : kCases) {
      SCOPED_TRACE(text(c.arguments));
      const Process::Outcome outcome = RunTool(c.arguments);
      EXPECT_EQ(outcome.status, status);
      EXPECT_EQ(outcome.out, status == 0 ? c.out : "");
      EXPECT_EQ(outcome.err, "");
    }
  }
}

TEST_F(DriverTest, StreamsUntilTheLimit) {
  const Process::Outcome outcome = RunTool({"-n", "5", "gyro", "accel", "-d"});
  EXPECT_EQ(outcome.status, 0);
  EXPECT_EQ(outcome.err, "");
  std::string expected =
      "Sampling from sensor type accel.s: imu.\n"
      "Sampling from sensor type gyro.s: imu.\n";
  for (const char* line :
       {"100000000 Delta: 0", "200000000 Delta: 100000000",
        "300000000 Delta: 100000000", "400000000 Delta: 100000000",
        "500000000 Delta: 100000000"}) {
    for (const char* sensor : {"accel", "gyro"}) {
      expected += std::string("Sensor: ") + sensor + ".s TS: " + line +
                  " Data: 1.500000 0.000000\n";
    }
  }
  // The fifth sample of the first ends the session, perhaps before the other's.
  expected.resize(expected.rfind("Sensor: gyro"));
  EXPECT_EQ(outcome.out.substr(0, expected.size()), expected);
  EXPECT_THAT(mask_times(outcome.out),
              HasSubstr("\n\nTime: <n> seconds\naccel.s 5 samples @ ~<n> Hz, "
                        "average period = 100000000\ngyro.s "));
}

// The order in which a run ends, as a library sees it.
TEST_F(DriverTest, TearsDownInOrder) {
  const struct {
    Words arguments;
    std::vector<platform::Fault> faults;
    std::string calls;
  } kCases[] = {
      {{"-v9"}, {}, "openLogFile;"},
      {{}, {{"Create", -5}}, "openLogFile;Create;closeLogFile;~Connection;"},
      {{}, {}, "openLogFile;Create;closeLogFile;~Client;~Connection;"},
      {{"-v1", "list", "nosuch"},
       {},
       "openLogFile;setLogLevel 1;Create;~Client;~Client;~Client;"
       "closeLogFile;~Client;~Connection;"},
      {{"-h"}, {}, "openLogFile;Create;~Client;~Connection;"},
      {{"-x"}, {}, "openLogFile;Create;~Client;~Connection;"},
      {{"accel", "-a9"},
       {},
       "openLogFile;Create;~Client;~Client;~Client;~Client;~Connection;"},
      {{"-n1", "accel"},
       {{"SendRequests", 7}},
       "openLogFile;Create;~Client;~Client;~Client;RegisterClient;"
       "SendRequests;SendRequests;UnregisterClient;closeLogFile;~Client;"
       "~Connection;"},
  };
  hub_.observer = [](const std::string& call) {
    if (call.starts_with("Lookup") || call.starts_with("Load")) return;
    std::fprintf(stderr, "%s;", call.c_str());
    if (call == "openLogFile") vesk::setLogLevel(vesk::log_level(-1));
  };
  for (const auto& c : kCases) {
    SCOPED_TRACE(text(c.arguments));
    hub_.faults = c.faults;
    std::string calls = RunTool(c.arguments).err;
    // What the observer itself does, and what the usage text adds.
    const std::string kOwn = "setLogLevel -1;";
    const size_t own = calls.find(kOwn);
    if (own != std::string::npos) calls.erase(own, kOwn.size());
    const size_t usage = calls.find(kUsageText);
    if (usage != std::string::npos) calls.erase(usage, kUsageText.size());
    EXPECT_EQ(calls, c.calls);
  }
}

}  // namespace
