#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/time.h>

#include <array>

#include "tests/support.h"

namespace {

class CliTest : public HubTest {};

// The program itself, in real time. The session lasts as long as it should, at
// the first attempt that the machine does not hold up, and sleeps.
TEST_F(CliTest, KeepsTheTime) {
  double seconds = 2;
  int samples = 0;
  long sleeps = 0;
  for (int i = 0; i < 10 && seconds > 1.9; ++i) {
    rusage used;
    getrusage(RUSAGE_CHILDREN, &used);
    sleeps = -used.ru_nvcsw;
    const Outcome outcome = capture(
        [] { return std::system(FENNICK_COMMAND " -v1 -t1 -r50 accel"); });
    getrusage(RUSAGE_CHILDREN, &used);
    sleeps += used.ru_nvcsw;
    const std::string end =
        outcome.out.substr(outcome.out.find("\nTime: ") + 1);
    ASSERT_EQ(std::sscanf(end.c_str(), "Time: %lf seconds\naccel.s %d samples",
                          &seconds, &samples),
              2);
  }
  EXPECT_GE(seconds, 1);
  EXPECT_LT(seconds, 1.9);
  EXPECT_NEAR(samples / seconds, 50, 25);
  EXPECT_LT(sleeps, 500);  // some three for each sample
}

TEST_F(CliTest, LivesWithClosedDescriptors) {
  OnCall([](const std::string& call) {  // as the log file would be
    if (call == "openLogFile" && open("/dev/null", O_WRONLY) < 3) std::abort();
  });
  const std::string failed = error("Unable to write to standard output");
  expect_runs({{{"list", "nosuch"}, {0}}}, [] { close(0); });
  expect_runs({{{"list"}, {251, "", failed}}}, [] { close(1); });
  expect_runs({{{"list", "-x"}, {234}}}, [] { close(2); });
}

// Quietly, also where the parent ignores the signal, or blocks it.
TEST_F(CliTest, EndsWithItsReader) {
  std::array<int, 2> ends;
  OnCall([&](const std::string& call) {
    if (call == "SendRequests") close(ends[0]);
  });
  const Action kParents[] = {[] {}, [] { signal(SIGPIPE, SIG_IGN); },
                             [] { block_signal(SIGPIPE); }};
  for (const Action& parent : kParents) {
    expect_runs({{{"-n5", "accel"}, {-SIGPIPE}}}, [&] {
      parent();
      if (pipe(ends.data()) == 0) dup2(ends[1], STDOUT_FILENO);
    });
  }
}

// Puts a pipe of one page and this process, whose end the test waits for,
// between the tool and its reader. A packet pipe shows where each write ends.
void read_slowly(int flags) {
  std::array<int, 2> ends;
  if (pipe(ends.data()) != 0) std::abort();
  fcntl(ends[1], F_SETPIPE_SZ, 4096);
  fcntl(ends[1], F_SETFL, flags);
  const bool is_tool = fork() == 0;
  if (is_tool) {
    dup2(ends[1], STDOUT_FILENO);
    prctl(PR_SET_PDEATHSIG, SIGKILL);  // the alarm is the reader's
  }
  close(ends[1]);
  if (is_tool) return;
  std::array<char, 4096> text;
  for (ssize_t size; (size = read(ends[0], text.data(), text.size())) > 0;) {
    std::fwrite(text.data(), 1, static_cast<size_t>(size), stdout);
    if (flags == O_DIRECT) std::fputc('|', stdout);
  }
  std::fflush(stdout);
  int status = 0;
  wait(&status);
  _exit(WEXITSTATUS(status));
}

// Lines of more than the pipe's page, also through a pipe that does not block,
// and while signals interrupt the writing.
TEST_F(CliTest, WaitsForASlowReader) {
  SimulatedClock clock(50 * kTicksPerSecond);
  setup_.clock = &clock;
  (*setup_.model)[0].axes.assign(1000, {.base = 0.25f});
  const Case run = {{"-n500", "accel"}, run_tool({"-n500", "accel"})};
  EXPECT_THAT(run.outcome.out,
              HasSubstr("TS: 50000000000 Data:" + repeat(" 0.250000", 1000)));
  OnCall([](const std::string& call) {  // leaves them to the delivery thread
    if (call == "RegisterClient") block_signal(SIGALRM);
  });
  for (const int flags : {0, O_NONBLOCK}) {
    expect_runs({run}, [flags] {
      read_slowly(flags);
      struct sigaction action = {};  // without SA_RESTART
      action.sa_handler = [](int) {};
      sigaction(SIGALRM, &action, nullptr);
      const itimerval often = {{0, 200}, {0, 200}};
      setitimer(ITIMER_REAL, &often, nullptr);
    });
  }
}

// The lines of what is due at a time together, the others one by one.
TEST_F(CliTest, WritesAsMuchAsIsDue) {
  SimulatedClock clock(kTicksPerSecond / 10);
  setup_.clock = &clock;
  faults_ = {{"SendRequests", 7, 2}};  // which disables
  const Outcome outcome =
      run_tool({"accel", "-n1", "-d", "gyro"}, [] { read_slowly(O_DIRECT); });
  const std::string sample =
      ".s TS: 100000000 Delta: 0 Data: 1.500000 0.000000\n";
  EXPECT_THAT(outcome.out,
              testing::StartsWith("Sampling from sensor type accel.s: imu.\n|"
                                  "Sampling from sensor type gyro.s: imu.\n|"
                                  "Sensor: accel" +
                                  sample + "Sensor: gyro" + sample + "|\n"));
  EXPECT_EQ(outcome.status, 0);
}

}  // namespace
