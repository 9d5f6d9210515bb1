#include <fcntl.h>
#include <pty.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <csignal>
#include <regex>

#include "tests/support.h"

namespace {

using testing::ContainsRegex;
using testing::Not;

const std::string kNoOutput =
    logged("error: Unable to write to standard output");
const std::string kSummaryEnd = "\nStandard Deviation:\n";

// ---- The program itself, on its default hub and in real time ---------------

Outcome run_program(const std::string& command_line,
                    const std::function<void()>& prepare = nullptr) {
  Words command = {FENNICK_EMULATOR, FENNICK_PROGRAM};
  if (command[0].empty()) command.erase(command.begin());
  Outcome outcome = Process(command_line, prepare, command).Wait();
  // Where there is no directory for the log file.
  outcome.err = std::regex_replace(outcome.err, std::regex(".*log file\n"), "");
  return outcome;
}

TEST(Program, KeepsTheRateAndTheLimits) {
  const std::string kPeriod = "(20000000|19999999|20000001)";
  const Outcome outcome = run_program("-v1 -d -t1 -r50 accel");
  expect(outcome, 0, ContainsRegex(" Hz, average period = " + kPeriod));
  expect(outcome, 0,
         ContainsRegex(" A.\n(TS: [0-9]+ Delta: (0|" + kPeriod +
                       ") Data:[-. 0-9]+\n)+\nTime: <n> "));
  expect(run_program("-n2 -t1000 -p accel -c ambient_light"), 0,
         ContainsRegex("(accel.s|ambient_light.c) 2 samples"), testing::_);
}

TEST(Program, LivesWithClosedDescriptors) {
  const auto close_fd = [](int fd) { return [fd] { close(fd); }; };
  expect(run_program("list", close_fd(0)), 0, HasSubstr("imu_a\n"));
  expect(run_program("list", close_fd(1)), 251, "", kNoOutput);
  expect(run_program("-v1 -n2 -r400 accel", close_fd(1)), 0, "", kNoOutput);
  expect(run_program("list -x", close_fd(2)), 234, "");
}

// ---- The same code on hubs that the tests make up --------------------------

class CliTest : public HubTest {
 protected:
  CliTest() {
    hub_.model = make_sensors("1,accel,imu,0");
    hub_.clock = &clock_;
  }

  // Raises the signal when the process makes its first call of `function`.
  void RaiseAt(const std::string& function, int signal) {
    hub_.observer = [=, next = observer_](const std::string& call) mutable {
      next(call);
      if (call.starts_with(function)) raise(std::exchange(signal, 0));
    };
  }

  const std::function<void(const std::string&)> observer_ = hub_.observer;
  platform::SimulatedClock clock_{platform::kTicksPerSecond};
  platform::SimulatedClock endless_;
};

TEST_F(CliTest, EndsOnSignalsAtEveryStage) {
  for (const int signal : {SIGINT, SIGHUP}) {
    for (const auto& [command_line, function] : table<2>(R"(
accel                        | Create
accel                        | Lookup
accel                        | RegisterClient
-n100000 accel;-t1000 accel  | SendRequests
list                         | LoadAttributes
)")) {
      RaiseAt(function, signal);
      expect_run(command_line, -signal, Not(HasSubstr(kSummaryEnd)));
    }
    RaiseAt("SendRequests", signal);
    expect_run("accel", 0, HasSubstr(kSummaryEnd));
    // Without a limit the session waits for a signal also if it failed.
    SetFaults("SendRequests#1=7");
    expect_run("accel", 7, HasSubstr(kSummaryEnd));
    SetFaults("");
    // A later one, before the summary, does nothing more.
    RaiseAt("UnregisterClient", signal);
    for (const char* words : {"accel", "-n100 accel", "-t1000 accel"}) {
      Process process(words);
      process.ReadUntil("TS: 1000000000 ");
      for (int i = 0; i < 100; ++i) kill(process.pid, signal);
      const bool waits = words[0] == 'a';
      const Text ends = HasSubstr(kSummaryEnd);
      expect(process.Wait(), waits ? 0 : -signal, waits ? ends : Not(ends));
    }
  }
}

TEST_F(CliTest, EndsOnTheTerminalsInterruptKey) {
  int master = -1;
  int terminal = -1;
  ASSERT_EQ(openpty(&master, &terminal, nullptr, nullptr, nullptr), 0);
  Process process("accel", [terminal] {
    setsid();
    ioctl(terminal, TIOCSCTTY, 0);
  });
  process.ReadUntil("TS: ");
  EXPECT_EQ(write(master, "\x03", 1), 1);
  expect(process.Wait(), 0, HasSubstr(kSummaryEnd));
  close(master);
  close(terminal);
}

TEST_F(CliTest, ReportsOutputThatFails) {
  const auto full = [] { dup2(open("/dev/full", O_WRONLY), STDOUT_FILENO); };
  expect_run("-n5 accel", 0, "", kNoOutput, full);
  expect_run("--version", 0, "", kNoOutput, full);
  expect_run("list accel", 251, "", kNoOutput, full);
  expect_run("list --version", 251, "", kNoOutput, full);
  expect_run("list accel -h", 251, "", kNoOutput, full);
  expect_run("list nosuch", 0, "", "", full);
}

// Quietly, also where the parent ignores the signal.
TEST_F(CliTest, EndsWithItsReader) {
  hub_.clock = &endless_;
  for (const auto handler : {SIG_DFL, SIG_IGN}) {
    Process process("-n20000 accel", [=] { signal(SIGPIPE, handler); });
    process.ReadUntil("TS: ");
    close(process.out);
    process.out = -1;
    expect(process.Wait(), -SIGPIPE, testing::_);
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
    Process process("-n5000 accel", [flags] {
      fcntl(STDOUT_FILENO, F_SETPIPE_SZ, 4096);
      fcntl(STDOUT_FILENO, F_SETFL, flags);
    });
    const std::regex kTime("TS: \\d+");
    EXPECT_THAT(std::regex_replace(process.Wait().out, kTime, "TS"),
                HasSubstr(expected));
  }
}

// The lines of what is due at a time together, the others one by one. The pipe
// keeps each write apart.
TEST_F(CliTest, WritesOncePerDelivery) {
  hub_.model = make_sensors("1,accel,imu,0 2,gyro,imu,0");
  Process process("-n2 accel gyro",
                  [] { fcntl(STDOUT_FILENO, F_SETFL, O_DIRECT); });
  std::array<char, 4096> text;
  for (ssize_t size = 0; (size = read(process.out, text.data(), 4096)) > 0;) {
    process.read_so_far.append(text.data(), static_cast<size_t>(size)) += '|';
  }
  expect(process.Wait(), 0,
         HasSubstr(" gyro.s: imu.\n|"
                   "Sensor: accel.s TS: 100000000 Data: 1.500000 0.000000\n"
                   "Sensor: gyro.s TS: 100000000 Data: 1.500000 0.000000\n|"));
}

// Each call of the library fails in turn.
TEST_F(CliTest, SurvivesFaultsOfTheHub) {
  const std::string kNone =
      "error: No sensors were found for the given datatypes";
  for (const auto& [fault, command_line, status, err] : table<4>(R"(
Create=7                     | accel      | 7   |
Lookup=7;LoadAttributes#1=-7 | accel      | 254 | error: Unable to find accel.s;
LoadAttributes#2=7           | accel      | 254 |
Lookup=-7                    | list       | 249 |
LoadAttributes=7             | list       | 0   |
Lookup=7;LoadAttributes#1=7  | list accel | 7   |
SendRequests#1=-7            | -n1 accel  | 249 |
SendRequests#1=7             | -t9 accel  | 7   |
SendRequests#2=7             | -n1 accel  | 0   |
)")) {
    SetFaults(fault);
    expect_run(command_line, std::stoi(status),
               fault[0] == 'S' ? HasSubstr(kSummaryEnd) : Text(""),
               logged(err + (status == "254" ? kNone : "")));
  }
}

TEST_F(CliTest, TakesWhateverItIsGiven) {
  const Text any = testing::_;
  const std::string kLongName(128 * 1024 - 1, 'x');
  std::string sensors = "1,accel,imu,0 2,wide,w%n,0";
  for (int id = 10; id < 10010; ++id) {
    sensors += ' ' + std::to_string(id) + ",many,many,1";
  }
  hub_.model = make_sensors(sensors);
  (*hub_.model)[1].axes.assign(10000, {.base = 0.25f});
  (*hub_.model)[1].attributes[SNS_ATTR_NAME] = kLongName;
  expect_run(kLongName + " -n1 accel", 0, any,
             logged("error: Unable to find " + kLongName + ".s"));
  expect_run("list " + repeat(".", 60000), 234, "", any);
  expect_run("list accel" + repeat(".accel", 999), 0, any);
  expect_run("-n1" + repeat(" accel", 1000), 0, any);
  expect_run("-n1 wide", 0, HasSubstr(" " + kLongName + ".\nTS: "));
  expect_run("-n1 wide", 0, HasSubstr(repeat(" 0.250000", 10000) + "\n"));
  expect_run("list", 0, HasSubstr("\n  many" + repeat(".1", 10000)));
}

}  // namespace
