#include <fcntl.h>
#include <pty.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <csignal>
#include <regex>

#include "tests/support.h"

namespace {

using testing::HasSubstr;

constexpr int kIoError = 251;  // -EIO as an exit status
const std::string kNoOutput =
    "fennick: error: Unable to write to standard output\n";
const std::string kSummaryEnd = "\nStandard Deviation:\n";

// ---- The program itself, on its default hub and in real time ---------------

Process::Outcome run_program(const std::string& command_line,
                             const std::function<void()>& prepare = nullptr) {
  Words command = {FENNICK_EMULATOR, FENNICK_PROGRAM};
  if (command[0].empty()) command.erase(command.begin());
  return Process(split(command_line), prepare, command).Wait();
}

TEST(Program, ListsTheDefaultHub) {
  const Process::Outcome outcome = run_program("list");
  EXPECT_EQ(outcome.status, 0);
  EXPECT_EQ(outcome.out,
            "baro_a\n  pressure\n  sensor_temperature.2\n\n"
            "imu_a\n  accel\n  gyro\n  sensor_temperature\n\n"
            "imu_b\n  accel.1\n  gyro.1\n  sensor_temperature.1\n\n"
            "light_a\n  ambient_light\n\nmag_a\n  mag\n\n"
            "prox_a\n  proximity\n\nvsync_a\n  camera_vsync.1.2\n\n");
}

TEST(Program, KeepsTheRateAndTheLimits) {
  Process::Outcome outcome = run_program("-v1 -d -t1 -r50 accel");
  EXPECT_EQ(outcome.status, 0);
  std::smatch found;
  int samples = 0;
  for (; std::regex_search(outcome.out, found, std::regex("Delta: (\\d+) "));
       outcome.out = found.suffix()) {
    EXPECT_NEAR(std::stod(found[1]), samples++ == 0 ? 0 : 20000000, 1);
  }
  EXPECT_LE(samples, 50);
  EXPECT_TRUE(std::regex_search(
      outcome.out, std::regex("accel\\.s " + std::to_string(samples) +
                              " samples @ ~[0-9.]+ Hz, average period = "
                              "(20000000|19999999)\n")));
  outcome = run_program("-n2 -t1000 -p accel -c ambient_light");
  EXPECT_EQ(outcome.status, 0);
  EXPECT_TRUE(std::regex_search(
      outcome.out, std::regex("(accel\\.s|ambient_light\\.c) 2 samples")));
}

TEST(Program, LivesWithClosedDescriptors) {
  const struct {
    int fd;
    const char* command_line;
    int status;
    std::string err;
  } kCases[] = {
      {STDIN_FILENO, "-v1 list", 0, ""},
      {STDOUT_FILENO, "-v1 list", kIoError, kNoOutput},
      {STDOUT_FILENO, "-v1 -n2 -r400 accel", 0, kNoOutput},
      {STDERR_FILENO, "list -x", 234, ""},
  };
  for (const auto& c : kCases) {
    const auto outcome = run_program(c.command_line, [&] { close(c.fd); });
    EXPECT_EQ(outcome.status, c.status);
    EXPECT_EQ(std::regex_replace(outcome.err, std::regex(".*log file\n"), ""),
              c.err);
  }
}

// ---- The same code on hubs that the tests make up --------------------------

class CliTest : public HubTest {
 protected:
  CliTest() {
    hub_.model = {make_sensor(1, "accel", "imu", 0)};
    hub_.clock = &clock_;
    hub_.observer = [](const std::string& call) {
      if (call == "openLogFile") vesk::setLogLevel(vesk::kError);
      if (call.starts_with("misuse")) _exit(99);
    };
  }

  // Raises the signal when the process makes the nth call of `function`.
  void RaiseAt(const std::string& function, int nth, int signal) {
    hub_.observer = [=, next = hub_.observer](const std::string& call) mutable {
      next(call);
      if (call.starts_with(function) && --nth == 0) raise(signal);
    };
  }

  platform::SimulatedClock clock_{platform::kTicksPerSecond};
  platform::SimulatedClock endless_;
};

TEST_F(CliTest, EndsOnSignalsAtEveryStage) {
  const auto observer = hub_.observer;
  const struct {
    const char* function;
    const char* command_line;
    bool survives;
  } kCases[] = {
      {"Create", "accel", false},
      {"Lookup", "accel", false},
      {"RegisterClient", "accel", false},
      {"SendRequests", "accel", true},
      {"SendRequests", "-n100000 accel", false},
      {"SendRequests", "-t1000 accel", false},
      {"LoadAttributes", "list", false},
  };
  for (const int signal : {SIGINT, SIGHUP}) {
    for (const auto& c : kCases) {
      SCOPED_TRACE(std::string(c.function) + ' ' + c.command_line);
      hub_.observer = observer;
      RaiseAt(c.function, 1, signal);
      const Process::Outcome outcome = run_tool(c.command_line);
      EXPECT_EQ(outcome.status, c.survives ? 0 : -signal);
      EXPECT_EQ(outcome.err, "");
      const bool has_summary =
          outcome.out.find(kSummaryEnd) != std::string::npos;
      EXPECT_EQ(has_summary, c.survives);
    }
  }
}

TEST_F(CliTest, EndsOnSignalsWhileItWaits) {
  // Later signals, before the disabling and the summary, do nothing more.
  RaiseAt("SendRequests", 2, SIGINT);
  RaiseAt("UnregisterClient", 1, SIGHUP);
  for (const auto& [command_line, status] :
       {std::pair("accel", 0), std::pair("-n100 accel", -SIGINT),
        std::pair("-t1000 accel", -SIGINT)}) {
    Process process(split(command_line));
    process.ReadUntil("TS: 1000000000 ");
    for (int i = 0; i < 100; ++i) process.Signal(SIGINT);
    const Process::Outcome outcome = process.Wait();
    EXPECT_EQ(outcome.status, status);
    if (status != 0) continue;
    EXPECT_THAT(outcome.out, HasSubstr(kSummaryEnd));
  }
}

TEST_F(CliTest, EndsOnTheTerminalsInterruptKey) {
  int master = -1;
  int terminal = -1;
  ASSERT_EQ(openpty(&master, &terminal, nullptr, nullptr, nullptr), 0);
  Process process({"accel"}, [terminal] {
    setsid();
    ioctl(terminal, TIOCSCTTY, 0);
  });
  process.ReadUntil("TS: ");
  EXPECT_EQ(write(master, "\x03", 1), 1);
  EXPECT_EQ(process.Wait().status, 0);
  close(master);
  close(terminal);
}

TEST_F(CliTest, ReportsOutputThatFails) {
  const auto full = [] { dup2(open("/dev/full", O_WRONLY), STDOUT_FILENO); };
  const struct {
    const char* command_line;
    int status;
    std::string err;
  } kCases[] = {
      {"-n5 accel", 0, kNoOutput},
      {"list accel", kIoError, kNoOutput},
      {"list --version", kIoError, kNoOutput},
      {"list nosuch", 0, ""},
      {"--version", 0, kNoOutput},
  };
  for (const auto& c : kCases) {
    SCOPED_TRACE(c.command_line);
    const auto outcome = Process(split(c.command_line), full).Wait();
    EXPECT_EQ(outcome.status, c.status);
    EXPECT_EQ(outcome.err, c.err);
  }
}

// Quietly, also where the parent ignores the signal.
TEST_F(CliTest, EndsWithItsReader) {
  hub_.clock = &endless_;
  for (const bool ignores : {false, true}) {
    Process process({"-n20000", "accel"}, [ignores] {
      if (ignores) signal(SIGPIPE, SIG_IGN);
    });
    process.ReadUntil("TS: ");
    process.StopReading();
    const Process::Outcome outcome = process.Wait();
    EXPECT_EQ(outcome.status, -SIGPIPE);
    EXPECT_EQ(outcome.err, "");
  }
}

// A reader through a pipe of one page, also one that does not block.
TEST_F(CliTest, WaitsForASlowReader) {
  hub_.clock = &endless_;
  std::string expected = "imu.\n";
  for (int sample = 1; sample <= 5000; ++sample) {
    const std::string second = std::to_string(sample / 10);
    expected += "TS Data: 1.500000 " + second + ".000000\n";
  }
  for (const int flags : {0, O_NONBLOCK}) {
    const auto outcome = Process({"-n5000", "accel"}, [flags] {
                           fcntl(STDOUT_FILENO, F_SETPIPE_SZ, 4096);
                           fcntl(STDOUT_FILENO, F_SETFL, flags);
                         }).Wait();
    EXPECT_EQ(outcome.status, 0);
    EXPECT_THAT(std::regex_replace(outcome.out, std::regex("TS: [0-9]+"), "TS"),
                HasSubstr(expected));
  }
}

// Each call of the library fails in turn.
TEST_F(CliTest, SurvivesFaultsOfTheHub) {
  constexpr int kCode = 1000;  // stands for the fault's own code
  const std::string kNone =
      "fennick: error: No sensors were found for the given datatypes\n";
  const std::string kNotFound = "fennick: error: Unable to find accel.s\n";
  const std::string kNoAttributes =
      "fennick: error: No attributes for " + vesk::SensorUid{1, 0}.str() + "\n";
  const struct {
    const char* call;
    int nth;
    const char* command_line;
    int status;
    std::string err;
    std::string out;  // empty: none at all
  } kCases[] = {
      {"Create", 1, "accel", kCode, "", ""},
      {"Lookup", 1, "accel", 254, kNotFound + kNone, ""},
      {"LoadAttributes", 1, "accel", 254, kNotFound + kNone, ""},
      {"LoadAttributes", 2, "accel", 254, kNone, ""},
      {"SendRequests", 1, "-n1 accel", kCode, "", kSummaryEnd},
      {"SendRequests", 1, "-t9 accel", kCode, "", kSummaryEnd},
      {"SendRequests", 2, "-n1 accel", 0, "", kSummaryEnd},
      {"Lookup", 1, "list", kCode, "", ""},
      {"Lookup", 1, "list accel", kCode, "", ""},
      {"LoadAttributes", 1, "list", 0, "", ""},
      {"LoadAttributes", 1, "list accel", kCode, "", ""},
      {"LoadAttributes", 2, "list accel", kCode, kNoAttributes, "\n"},
  };
  for (const int code : {7, -7}) {
    for (const auto& c : kCases) {
      SCOPED_TRACE(std::string(c.call) + ' ' + c.command_line);
      hub_.faults = {{c.call, code, c.nth}};
      const Process::Outcome outcome = run_tool(c.command_line);
      EXPECT_EQ(outcome.status, c.status == kCode ? code & 0xff : c.status);
      EXPECT_EQ(outcome.err, c.err);
      EXPECT_THAT(outcome.out, HasSubstr(c.out));
      EXPECT_EQ(outcome.out.empty(), c.out.empty());
    }
  }
  // Without a limit the session waits for a signal all the same.
  hub_.faults = {{"SendRequests", 7, 1}};
  RaiseAt("SendRequests", 1, SIGINT);
  EXPECT_EQ(run_tool("accel").status, 7);
}

TEST_F(CliTest, TakesWhateverItIsGiven) {
  const std::string kLongName(128 * 1024 - 1, 'x');
  hub_.model.push_back(make_sensor(2, "wide", "w%n", 0));
  hub_.model.back().axes.assign(10000, {.base = 0.25f});
  for (uint64_t id = 10; id < 10010; ++id) {
    hub_.model.push_back(make_sensor(id, "many", "many", 1));
  }
  EXPECT_EQ(run_tool(kLongName + " -n1 accel").err,
            "fennick: error: Unable to find " + kLongName + ".s\n");
  EXPECT_EQ(run_tool("list " + repeat(".", 60000)).status, 234);
  EXPECT_EQ(run_tool("list accel" + repeat(".accel", 999)).status, 0);
  EXPECT_EQ(run_tool("-n1" + repeat(" accel", 1000)).status, 0);
  EXPECT_THAT(run_tool("-n1 wide").out,
              HasSubstr("Data:" + repeat(" 0.250000", 10000) + "\n"));
  EXPECT_THAT(run_tool("list").out,
              HasSubstr("\n  many" + repeat(".1", 10000)));
}

}  // namespace
