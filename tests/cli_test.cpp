#include <fcntl.h>
#include <unistd.h>

#include <csignal>

#include "tests/support.h"

namespace {

using testing::Not;

const Text kAny = testing::_;
const auto kNoOutput = logged("error: Unable to write to standard output");
const std::string kSummaryEnd = "\nStandard Deviation:\n";

// ---- The program itself, on its default hub and in real time ---------------

TEST(Program, KeepsTheRateAndTheTime) {
  Process process("./fennick -v1 -t1 -r50 accel");
  EXPECT_EQ(process.Wait().status, 0);
  std::smatch numbers;
  ASSERT_TRUE(std::regex_search(
      process.read_so_far, numbers,
      std::regex(" A.\n(TS: \\d+ Data:[-. 0-9]+\n)+\nTime: (.+) seconds\n"
                 "accel.s (\\d+) samples @ ~(.+) Hz, average period = "
                 "(20000000|19999999|20000001)\n")));
  const double seconds = std::stod(numbers[2]);
  EXPECT_TRUE(seconds >= 1 && seconds < 1000) << seconds;
  EXPECT_NEAR(std::stod(numbers[4]), std::stod(numbers[3]) / seconds, 0.1);
}

TEST(Program, LivesWithClosedDescriptors) {
  const auto close_fd = [](int fd) { return [fd] { close(fd); }; };
  const Text reports = HasSubstr(kNoOutput);
  expect_run("./fennick list", 0, HasSubstr("imu_a\n"), kAny, close_fd(0));
  expect_run("./fennick list", 251, "", reports, close_fd(1));
  expect_run("./fennick -v1 -n2 -r400 accel", 0, "", reports, close_fd(1));
  expect_run("./fennick list -x", 234, "", "", close_fd(2));
}

// ---- The same code on hubs that the tests make up --------------------------

class CliTest : public HubTest {
 protected:
  // Raises the signal when the process makes its first call of `function`.
  void RaiseAt(const std::string& function, int signal) {
    hub_.observer = [=, next = observer_](const std::string& call) mutable {
      next(call);
      if (call.starts_with(function)) raise(std::exchange(signal, 0));
    };
  }

  const std::function<void(const std::string&)> observer_ = hub_.observer;
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
  const int terminal = posix_openpt(O_RDWR | O_NOCTTY);
  ASSERT_EQ(grantpt(terminal) + unlockpt(terminal), 0);
  // The first one that a session opens is its own.
  Process process("accel", [terminal] {
    setsid();
    open(ptsname(terminal), O_RDWR);
  });
  process.ReadUntil("TS: ");
  EXPECT_EQ(write(terminal, "\x03", 1), 1);
  expect(process.Wait(), 0, HasSubstr(kSummaryEnd));
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
  platform::SimulatedClock endless;
  hub_.clock = &endless;
  for (const auto handler : {SIG_DFL, SIG_IGN}) {
    Process process("-n20000 accel", [=] { signal(SIGPIPE, handler); });
    process.ReadUntil("TS: ");
    close(process.out);
    process.out = -1;
    expect(process.Wait(), -SIGPIPE, kAny);
  }
}

// A reader through a pipe of one page, also one that does not block.
TEST_F(CliTest, WaitsForASlowReader) {
  platform::SimulatedClock clock(500 * platform::kTicksPerSecond);
  hub_.clock = &clock;
  const Outcome all = Process("-n5000 accel").Wait();
  EXPECT_THAT(all.out, HasSubstr("accel.s 5000 samples"));
  for (const int flags : {0, O_NONBLOCK}) {
    expect_run("-n5000 accel", 0, all.out, "", [flags] {
      fcntl(STDOUT_FILENO, F_SETPIPE_SZ, 4096);
      fcntl(STDOUT_FILENO, F_SETFL, flags);
    });
  }
}

// The lines of what is due at a time together, the others one by one. The pipe
// keeps each write apart.
TEST_F(CliTest, StreamsUntilTheLimit) {
  hub_.model = make_sensors("1,accel,imu,0 2,gyro,imu,0");
  Process process("-v2 -n2 accel -d gyro",
                  [] { fcntl(STDOUT_FILENO, F_SETFL, O_DIRECT); });
  std::array<char, 4096> text;
  for (ssize_t size = 0; (size = read(process.out, text.data(), 4096)) > 0;) {
    process.read_so_far.append(text.data(), static_cast<size_t>(size)) += '|';
  }
  expect(process.Wait(), 0,
         HasSubstr(
             " gyro.s: imu.\n|"
             "Sensor: accel.s TS: 100000000 Delta: 0 Data: 1.500000 0.000000\n"
             "Sensor: gyro.s TS: 100000000 Delta: 0 Data: 1.500000 0.000000\n|"
             "Sensor: accel.s TS: 200000000 Delta: 100000000 Data: "),
         logged("Auto-selected 10.0 Hz sample rate for accel.s;"
                "Auto-selected 10.0 Hz sample rate for gyro.s"));
  // Only accel is passive, so that it alone gets nothing.
  expect_run("-p nosuch accel -n4 gyro", 0, HasSubstr("\naccel.s 0 samples"),
             kAny);
}

// Each call of the library fails in turn.
TEST_F(CliTest, SurvivesFaultsOfTheHub) {
  const auto kNone = "error: No sensors were found for the given datatypes";
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
  const std::string kLongName(128 * 1024 - 1, 'x');
  std::string sensors = "1,accel,imu,0 2,wide,w%n,0";
  for (int id = 10; id < 10010; ++id) {
    sensors += ' ' + std::to_string(id) + ",many,many,1";
  }
  hub_.model = make_sensors(sensors);
  (*hub_.model)[1].axes.assign(10000, {.base = 0.25f});
  (*hub_.model)[1].attributes[SNS_ATTR_NAME] = kLongName;
  expect_run(kLongName + " -n1 accel", 0, kAny,
             logged("error: Unable to find " + kLongName + ".s"));
  expect_run("list " + repeat(".", 60000), 234, "", kAny);
  expect_run("list accel" + repeat(".accel", 999), 0, kAny);
  expect_run("-n1" + repeat(" accel", 1000), 0, kAny);
  expect_run("-n1 wide", 0,
             HasSubstr(" " + kLongName + ".\nTS: 100000000 Data:" +
                       repeat(" 0.250000", 10000) + "\n"));
  expect_run("list", 0, HasSubstr("\n  many" + repeat(".1", 10000)));
}

}  // namespace
