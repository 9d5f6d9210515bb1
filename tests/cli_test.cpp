#include <fcntl.h>
#include <pty.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <csignal>
#include <regex>

#include "tests/support.h"

namespace {

using testing::EndsWith;
using testing::HasSubstr;
using testing::Not;
using Words = std::vector<std::string>;

constexpr int kIoError = 251;  // -EIO as an exit status
const std::string kNoOutput =
    "fennick: error: Unable to write to standard output\n";
const std::string kSummaryEnd = "\nStandard Deviation:\n";

std::string repeat(const std::string& text, int times) {
  std::string result;
  while (times-- > 0) result += text;
  return result;
}

// ---- The program itself, on its default hub and in real time ---------------

Process::Outcome RunProgram(const Words& arguments,
                            const std::function<void()>& prepare = nullptr) {
  Words command = {FENNICK_EMULATOR, FENNICK_PROGRAM};
  if (command[0].empty()) command.erase(command.begin());
  return Process(arguments, prepare, command).Wait();
}

TEST(Program, ListsTheDefaultHub) {
  const Process::Outcome outcome = RunProgram({"list"});
  EXPECT_EQ(outcome.status, 0);
  EXPECT_EQ(outcome.out,
            "baro_a\n  pressure\n  sensor_temperature.2\n\n"
            "imu_a\n  accel\n  gyro\n  sensor_temperature\n\n"
            "imu_b\n  accel.1\n  gyro.1\n  sensor_temperature.1\n\n"
            "light_a\n  ambient_light\n\nmag_a\n  mag\n\n"
            "prox_a\n  proximity\n\nvsync_a\n  camera_vsync.1.2\n\n");
}

TEST(Program, KeepsTheRateAndTheTimeLimit) {
  const Process::Outcome outcome =
      RunProgram({"-v1", "-d", "-t1", "-r50", "accel"});
  EXPECT_EQ(outcome.status, 0);
  std::smatch found;
  int samples = 0;
  std::string rest = outcome.out;
  for (; std::regex_search(rest, found, std::regex("Delta: (\\d+) "));
       rest = found.suffix()) {
    const double delta = std::stod(found[1]);
    EXPECT_NEAR(delta, samples == 0 ? 0 : 20000000, 1);
    ++samples;
  }
  EXPECT_GE(samples, 2);
  EXPECT_LE(samples, 50);
  EXPECT_TRUE(std::regex_search(
      rest, std::regex("accel\\.s " + std::to_string(samples) +
                       " samples @ ~[0-9.]+ Hz, average period = "
                       "(20000000|19999999)\n")));
}

TEST(Program, StopsAtTheFirstOfTwoLimits) {
  const Process::Outcome outcome =
      RunProgram({"-n2", "-t1000", "-p", "accel", "-c", "ambient_light"});
  EXPECT_EQ(outcome.status, 0);
  EXPECT_THAT(outcome.out, EndsWith("\n"));
  EXPECT_THAT(outcome.out, HasSubstr(kSummaryEnd));
  EXPECT_TRUE(std::regex_search(
      outcome.out, std::regex("(accel\\.s|ambient_light\\.c) 2 samples")));
}

TEST(Program, LivesWithClosedDescriptors) {
  const struct {
    int fd;
    Words arguments;
    int status;
    std::string err;
  } kCases[] = {
      {STDIN_FILENO, {"-v1", "list"}, 0, ""},
      {STDOUT_FILENO, {"-v1", "list"}, kIoError, kNoOutput},
      {STDOUT_FILENO, {"-v1", "-n2", "-r400", "accel"}, 0, kNoOutput},
      {STDERR_FILENO, {"list", "-x"}, 234, ""},
  };
  for (const auto& c : kCases) {
    const int fd = c.fd;
    const auto outcome = RunProgram(c.arguments, [fd] { close(fd); });
    EXPECT_EQ(outcome.status, c.status);
    std::string err = outcome.err;
    const std::string kNoLog = "fennick: warning: Failed to open log file\n";
    if (err.starts_with(kNoLog)) err.erase(0, kNoLog.size());
    EXPECT_EQ(err, c.err);
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
};

TEST_F(CliTest, EndsOnSignalsAtEveryStage) {
  const auto observer = hub_.observer;
  const struct {
    const char* function;
    int nth;
    Words arguments;
    bool survives;
  } kCases[] = {
      {"Create", 1, {"accel"}, false},
      {"Lookup", 1, {"accel"}, false},
      {"RegisterClient", 1, {"accel"}, false},
      {"SendRequests", 1, {"accel"}, true},
      {"SendRequests", 1, {"-n100000", "accel"}, false},
      {"SendRequests", 1, {"-t1000", "accel"}, false},
      {"LoadAttributes", 1, {"list"}, false},
  };
  for (const int signal : {SIGINT, SIGHUP}) {
    for (const auto& c : kCases) {
      SCOPED_TRACE(c.function + testing::PrintToString(c.arguments));
      hub_.observer = observer;
      RaiseAt(c.function, c.nth, signal);
      const Process::Outcome outcome = RunTool(c.arguments);
      EXPECT_EQ(outcome.status, c.survives ? 0 : -signal);
      EXPECT_EQ(outcome.err, "");
      if (c.survives) {
        EXPECT_THAT(outcome.out, HasSubstr(kSummaryEnd));
      } else {
        EXPECT_THAT(outcome.out, Not(HasSubstr("Average")));
      }
    }
  }
}

TEST_F(CliTest, EndsOnSignalsWhileItWaits) {
  const struct {
    Words arguments;
    int status;
  } kCases[] = {{{"accel"}, 0},
                {{"-n100", "accel"}, -SIGINT},
                {{"-t1000", "accel"}, -SIGINT}};
  // Later signals, one before the disabling and one before the summary, do
  // nothing more.
  RaiseAt("SendRequests", 2, SIGINT);
  RaiseAt("UnregisterClient", 1, SIGHUP);
  for (const auto& c : kCases) {
    Process process(c.arguments);
    process.ReadUntil("TS: 1000000000 ");
    process.Signal(SIGINT);
    const Process::Outcome outcome = process.Wait();
    EXPECT_EQ(outcome.status, c.status);
    if (c.status != 0) continue;
    EXPECT_THAT(outcome.out, HasSubstr("accel.s 10 samples"));
    EXPECT_THAT(outcome.out, HasSubstr(kSummaryEnd));
  }
}

TEST_F(CliTest, EndsOnAStormOfSignals) {
  Process process({"accel"});
  process.ReadUntil("TS: ");
  for (int i = 0; i < 1000; ++i) process.Signal(i % 2 ? SIGINT : SIGHUP);
  EXPECT_EQ(process.Wait().status, 0);
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
    Words arguments;
    int status;
    std::string err;
  } kCases[] = {
      {{"-n5", "accel"}, 0, kNoOutput},
      {{"list"}, kIoError, kNoOutput},
      {{"list", "accel"}, kIoError, kNoOutput},
      {{"list", "--version"}, kIoError, kNoOutput},
      {{"list", "nosuch"}, 0, ""},
      {{"--version"}, 0, kNoOutput},
  };
  for (const auto& c : kCases) {
    SCOPED_TRACE(testing::PrintToString(c.arguments));
    const Process::Outcome outcome = Process(c.arguments, full).Wait();
    EXPECT_EQ(outcome.status, c.status);
    EXPECT_EQ(outcome.err, c.err);
  }
}

TEST_F(CliTest, EndsQuietlyWithItsReader) {
  platform::SimulatedClock endless;
  hub_.clock = &endless;
  Process reader_gone({"accel"});
  reader_gone.ReadUntil("TS: ");
  reader_gone.StopReading();
  const Process::Outcome outcome = reader_gone.Wait();
  EXPECT_EQ(outcome.status, -SIGPIPE);
  EXPECT_EQ(outcome.err, "");

  // Where the signal is ignored, it goes on to its limit.
  Process ignoring({"-n20000", "accel"}, [] { signal(SIGPIPE, SIG_IGN); });
  ignoring.ReadUntil("TS: ");
  ignoring.StopReading();
  const Process::Outcome ignored = ignoring.Wait();
  EXPECT_EQ(ignored.status, 0);
  EXPECT_EQ(ignored.err, kNoOutput);
}

// A reader through a pipe of one page, also one that does not block.
TEST_F(CliTest, WaitsForASlowReader) {
  platform::SimulatedClock endless;
  hub_.clock = &endless;
  std::string expected = "imu.\n";
  for (int sample = 1; sample <= 5000; ++sample) {
    const std::string second = std::to_string(sample / 10);
    expected += "TS Data: 1.500000 " + second + ".000000\n";
  }
  for (const int flags : {0, O_NONBLOCK}) {
    const Process::Outcome outcome = Process({"-n5000", "accel"}, [flags] {
                                       fcntl(STDOUT_FILENO, F_SETPIPE_SZ, 4096);
                                       fcntl(STDOUT_FILENO, F_SETFL, flags);
                                     }).Wait();
    EXPECT_EQ(outcome.status, 0);
    EXPECT_THAT(std::regex_replace(outcome.out, std::regex("TS: [0-9]+"), "TS"),
                HasSubstr(expected));
    EXPECT_THAT(outcome.out, HasSubstr(kSummaryEnd));
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
    Words arguments;
    int status;
    std::string err;
    std::string out;
  } kCases[] = {
      {"Create", 1, {"accel"}, kCode, "", ""},
      {"Lookup", 1, {"accel"}, 254, kNotFound + kNone, ""},
      {"LoadAttributes", 1, {"accel"}, 254, kNotFound + kNone, ""},
      {"LoadAttributes", 2, {"accel"}, 254, kNone, ""},
      {"SendRequests", 1, {"-n1", "accel"}, kCode, "", kSummaryEnd},
      {"SendRequests", 1, {"-t9", "accel"}, kCode, "", kSummaryEnd},
      {"SendRequests", 2, {"-n1", "accel"}, 0, "", kSummaryEnd},
      {"Lookup", 1, {"list"}, kCode, "", ""},
      {"Lookup", 1, {"list", "accel"}, kCode, "", ""},
      {"LoadAttributes", 1, {"list"}, 0, "", ""},
      {"LoadAttributes", 1, {"list", "accel"}, kCode, "", ""},
      {"LoadAttributes", 2, {"list", "accel"}, kCode, kNoAttributes, "\n"},
  };
  for (const int code : {7, -7}) {
    for (const auto& c : kCases) {
      SCOPED_TRACE(c.call + testing::PrintToString(c.arguments));
      hub_.faults = {{c.call, code, c.nth}};
      const Process::Outcome outcome = RunTool(c.arguments);
      EXPECT_EQ(outcome.status, c.status == kCode ? code & 0xff : c.status);
      EXPECT_EQ(outcome.err, c.err);
      EXPECT_THAT(outcome.out, HasSubstr(c.out));
      EXPECT_EQ(outcome.out.empty(), c.out.empty());
    }
  }
  // Without a limit the session waits for a signal all the same.
  hub_.faults = {{"SendRequests", 7, 1}};
  RaiseAt("SendRequests", 1, SIGINT);
  EXPECT_EQ(RunTool({"accel"}).status, 7);
}

TEST_F(CliTest, TakesWhateverItIsGiven) {
  const std::string kLongName(128 * 1024 - 1, 'x');
  auto wide = make_sensor(2, "wide", "w%n", 0);
  wide.axes.assign(10000, {.base = 0.25f});
  hub_.model.push_back(wide);
  for (uint64_t id = 10; id < 10010; ++id) {
    hub_.model.push_back(make_sensor(id, "many", "many", 1));
  }
  const auto not_found = [](const std::string& what) {
    return "fennick: error: Unable to find " + what + ".s\n";
  };
  const auto run = [](const Words& words) { return RunTool(words); };
  EXPECT_THAT(run({kLongName, "-n1", "accel"}).err,
              EndsWith(not_found(kLongName)));
  EXPECT_EQ(run({"list", repeat(".", 60000)}).status, 234);
  EXPECT_EQ(run({"list", "accel" + repeat(".accel", 999)}).status, 0);
  Words thousand(1000, "accel");
  thousand.insert(thousand.begin(), "-n1");
  EXPECT_EQ(run(thousand).status, 0);
  const std::string out = run({"-n1", "wide"}).out;
  EXPECT_THAT(out, HasSubstr("Data:" + repeat(" 0.250000", 10000) + "\n"));
  EXPECT_THAT(run({"list"}).out, HasSubstr("\n  many" + repeat(".1", 10000)));
}

}  // namespace
