#include <cstdio>

#include "driver/usage.h"
#include "tests/support.h"

namespace {

using testing::EndsWith;
using testing::HasSubstr;
using testing::StartsWith;

const std::string kUsageText = std::string(kUsage) + '\n';
constexpr int kInvalid = 234;  // -EINVAL as an exit status

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
    hub_.observer = [](const std::string& call) {
      if (call == "openLogFile") vesk::setLogLevel(vesk::kError);
    };
  }
  platform::SimulatedClock clock_{platform::kTicksPerSecond / 2};
};

TEST_F(DriverTest, RejectsBadValues) {
  const struct {
    const char* message;
    Words command_lines;
  } kCases[] = {
      {"LEVEL must be between 1 and 4, inclusive",
       {"-v 0", "-v 5", "-v x", "-v 3x", "-v 3\t", "-v ''", "-v -1", "-h -v 9",
        "-x -v 2 -v9", "--verbose=18446744073709551617"}},
      {"Accuracy LEVEL must be in the range [0, 3]",
       {"-a 4", "-a -1", "-a 2.0", "-a 99999999999999999999"}},
      {"SAMPLES must be an unsigned integer",
       {"-n 12abc", "-n 08", "--count 1e3", "accel -n x list"}},
      {"RATE must be non-negative",
       {"-r -0.5", "-r fast", "-r 1e99", "-r 1e-99", "-r 50Hz"}},
      {"SECONDS must be a positive integer",
       {"-t 0", "-t ''", "-t 1.5", "-t 4294967296", "accel -t x"}},
  };
  for (const auto& c : kCases) {
    for (const std::string& command_line : c.command_lines) {
      SCOPED_TRACE(command_line);
      const Process::Outcome outcome = run_tool(command_line);
      EXPECT_EQ(outcome.status, kInvalid);
      EXPECT_EQ(outcome.out, "");
      EXPECT_EQ(outcome.err,
                "fennick: error: " + std::string(c.message) + '\n');
    }
  }
}

TEST_F(DriverTest, RejectsBadOptions) {
  const std::string kInvalidOption = "Invalid option";
  const std::string kMissing = "Missing argument for option";
  const struct {
    const char* command_line;
    std::string message;
    const char* element;
  } kCases[] = {
      {"-x accel", kInvalidOption, "-x"},
      {"-dxp", kInvalidOption, "-dxp"},
      {"-dpx accel", kInvalidOption, "-dpx"},
      {"--bogus=1", kInvalidOption, "--bogus=1"},
      {"--help=1", kInvalidOption, "--help=1"},
      {"--ver", kInvalidOption, "--ver"},
      {"accel --o", kInvalidOption, "--o"},
      {"accel -?", kInvalidOption, "-?"},
      {"accel -t", kMissing, "-t"},
      {"-dt", kMissing, "-dt"},
      {"-d --time", kMissing, "--time"},
      {"--cou", kMissing, "--cou"},
  };
  for (const auto& c : kCases) {
    SCOPED_TRACE(c.command_line);
    const Process::Outcome outcome = run_tool(c.command_line);
    EXPECT_EQ(outcome.status, kInvalid);
    EXPECT_EQ(outcome.out, "");
    EXPECT_EQ(outcome.err, "fennick: error: " + c.message + " '" + c.element +
                               "'\n" + kUsageText);
  }
}

// What the setters got shows in the trace of each sensor.
TEST_F(DriverTest, TakesGoodCommandLines) {
  const struct {
    const char* command_line;
    std::string trace;
  } kCases[] = {
      {"-n 0x10 -r 2.5 accel", "accel.s -n16 -r2.5"},
      {"-n010 -r1e1 accel", "accel.s -n8 -r10.0"},
      {"-n -1 --rate=\t0x10 accel", "accel.s -n4294967295 -r16.0"},
      {"-n '' -r '' accel", "accel.s -n0 -r10.0"},
      {"-n4294967297 -a4294967296 -a3 accel", "accel.s -n1 -r10.0"},
      {"-r50 gyro -r0 accel", "accel.s -n0 -r10.0\nfennick: gyro.s -n0 -r50.0"},
      {"gyro -v9 -n2 accel -d",
       "accel.s -n2 -r10.0\nfennick: gyro.s -n0 -r10.0"},
      {"-n1 -- -x", "-x.s -n1 -r10.0"},
      {"--str --d -dspn1 accel", "accel.s -n1 -r10.0"},
      {"-n1 '' --acc 2", ".s -n1 -r10.0"},
      {"-n1 nosuch accel nosuch", "accel.s -n1 -r10.0"},
  };
  hub_.faults = {{"SendRequests", 5}};
  for (const auto& c : kCases) {
    SCOPED_TRACE(c.command_line);
    const auto outcome =
        run_tool(std::string("-v3 -v 3 -t1 ") + c.command_line);
    EXPECT_EQ(outcome.status, 5);
    EXPECT_THAT(outcome.err, EndsWith("fennick: " + c.trace + '\n'));
  }
}

TEST_F(DriverTest, AnswersOnlyOnceConnected) {
  const std::string kVersion = "fennick version 2.0\n";
  const std::pair<const char*, std::string> kCases[] = {
      {"-h", kUsageText},         {"--he accel", kUsageText},
      {"accel -dh", kUsageText},  {"list -h", kUsageText},
      {"--version -x", kVersion}, {"list --version", kVersion}};
  for (const int status : {0, 13}) {
    if (status != 0) hub_.faults = {{"Create", status}};
    for (const auto& [command_line, out] : kCases) {
      SCOPED_TRACE(command_line);
      const Process::Outcome outcome = run_tool(command_line);
      EXPECT_EQ(outcome.status, status);
      EXPECT_EQ(outcome.out, status == 0 ? out : "");
      EXPECT_EQ(outcome.err, "");
    }
  }
}

TEST_F(DriverTest, StreamsUntilTheLimit) {
  const Process::Outcome outcome = run_tool("-n 2 gyro accel -d");
  EXPECT_EQ(outcome.status, 0);
  EXPECT_EQ(outcome.err, "");
  EXPECT_THAT(
      outcome.out,
      StartsWith(
          "Sampling from sensor type accel.s: imu.\n"
          "Sampling from sensor type gyro.s: imu.\n"
          "Sensor: accel.s TS: 100000000 Delta: 0 Data: 1.500000 0.000000\n"
          "Sensor: gyro.s TS: 100000000 Delta: 0 Data: 1.500000 0.000000\n"
          "Sensor: accel.s TS: 200000000 Delta: 100000000 Data: 1.500000 "
          "0.000000\n"));
  EXPECT_THAT(
      mask_times(outcome.out),
      HasSubstr("samples @ ~<n> Hz, average period = 100000000\ngyro.s "));
}

// The order in which a run ends, as a library sees it.
TEST_F(DriverTest, TearsDownInOrder) {
  const struct {
    const char* command_line;
    std::vector<platform::Fault> faults;
    std::string calls;
  } kCases[] = {
      {"-v9", {}, ""},
      {"", {{"Create", -5}}, "Create;closeLogFile;~Connection;"},
      {"", {}, "Create;closeLogFile;~Client;~Connection;"},
      {"-v1 list",
       {},
       "setLogLevel 1;Create;~Client;~Client;closeLogFile;~Client;"
       "~Connection;"},
      {"-h", {}, "Create;~Client;~Connection;"},
      {"accel -a9", {}, "Create;~Client;~Client;~Client;~Client;~Connection;"},
      {"-n1 accel",
       {{"SendRequests", 7}},
       "Create;~Client;~Client;~Client;RegisterClient;SendRequests;"
       "SendRequests;UnregisterClient;closeLogFile;~Client;~Connection;"},
  };
  hub_.observer = [](const std::string& call) {
    if (call == "openLogFile") {
      vesk::setLogLevel(vesk::log_level(-1));
    } else if (call[0] != 'L' && call != "setLogLevel -1") {
      std::fprintf(stderr, "%s;", call.c_str());
    }
  };
  for (const auto& c : kCases) {
    SCOPED_TRACE(c.command_line);
    hub_.faults = c.faults;
    EXPECT_EQ(run_tool(c.command_line).err, c.calls);
  }
}

}  // namespace
