#include <fcntl.h>
#include <sys/resource.h>
#include <time.h>

#include "tests/support.h"

namespace {

class CliTest : public HubTest {};

// The program itself, in real time. The session lasts as long as it should, at
// the first attempt that the machine does not hold up, and sleeps.
TEST_F(CliTest, KeepsTheRateAndTheTime) {
  double seconds = 0;
  for (int i = 0; i < 10 && (seconds < 1 || seconds > 1.9); ++i) {
    FILE* const pipe = popen(FENNICK_COMMAND " -v1 -t1 -r50 accel 2>&1", "r");
    std::string text(10000, '\0');
    text.resize(std::fread(text.data(), 1, text.size(), pipe));
    EXPECT_EQ(pclose(pipe), 0);
    int samples = 0;
    double rate = 0;
    double period = 0;
    ASSERT_EQ(std::sscanf(text.c_str() + text.rfind("\nTime"),
                          "\nTime: %lf seconds\n"
                          "accel.s %d samples @ ~%lf Hz, average period = %lf",
                          &seconds, &samples, &rate, &period),
              4)
        << text;
    EXPECT_GE(seconds, 1);
    EXPECT_NEAR(rate, samples / seconds, 0.1);
    EXPECT_NEAR(period, 20e6, 1);
    rusage used;
    getrusage(RUSAGE_CHILDREN, &used);
    EXPECT_LT(used.ru_nvcsw, 500 * (i + 1));  // some three for each sample
  }
  EXPECT_LT(seconds, 1.9);
}

TEST_F(CliTest, LivesWithClosedDescriptors) {
  const std::string failed = error("Unable to write to standard output");
  const Outcome overview = {0, "imu\n  accel\n\n"};
  expect_runs({{{"list"}, overview}}, [] { close(0); });
  expect_runs({{{"list"}, {251, "", failed}}}, [] { close(1); });
  expect_runs({{{"list", "-x"}, {234}}}, [] { close(2); });
}

// Caught only where they are what ends the session.
TEST_F(CliTest, EndsOnSignals) {
  for (const int signal : {SIGINT, SIGHUP}) {
    for (const std::string limit : {"-d", "-n100", "-t1000"}) {
      Process process({limit, "accel"});
      process.ReadUntil("TS: 1000000000 ");
      for (int i = 0; i < 100; ++i) process.Signal(signal);
      const bool is_caught = limit == "-d";
      const Outcome outcome = process.Wait();
      EXPECT_EQ(outcome.status, is_caught ? 0 : -signal);
      EXPECT_EQ(outcome.out.find("Average") != std::string::npos, is_caught);
    }
  }
  OnCall([](const std::string& call) {
    if (call == "Lookup accel") raise(SIGHUP);
  });
  expect_runs({{{"accel"}, {-SIGHUP}}});
}

// Quietly, also where the parent ignores the signal, or blocks it.
TEST_F(CliTest, EndsWithItsReader) {
  SimulatedClock endless;
  setup_.clock = &endless;
  const Action kParents[] = {[] { signal(SIGPIPE, SIG_DFL); },
                             [] { signal(SIGPIPE, SIG_IGN); },
                             [] { block_signal(SIGPIPE); }};
  for (const Action& parent : kParents) {
    Process process({"-n20000", "accel"}, parent);
    process.ReadUntil("TS: ");
    process.CloseOutput();
    const Outcome outcome = process.Wait();
    EXPECT_EQ(outcome.status, -SIGPIPE);
    EXPECT_EQ(outcome.err, "");
  }
}

// Lines of more than the one page that the pipe to the reader has, also through
// one that does not block, and while signals interrupt the writing.
TEST_F(CliTest, WaitsForASlowReader) {
  SimulatedClock clock(50 * kTicksPerSecond);
  setup_.clock = &clock;
  (*setup_.model)[0].axes.assign(1000, {.base = 0.25f});
  const Case run = {{"-n500", "accel"}, Process({"-n500", "accel"}).Wait()};
  EXPECT_THAT(run.outcome.out,
              HasSubstr("TS: 50000000000 Data:" + repeat(" 0.250000", 1000)));
  OnCall([](const std::string& call) {  // leaves them to the delivery thread
    if (call == "RegisterClient") block_signal(SIGUSR1);
  });
  for (const int flags : {0, O_NONBLOCK}) {
    expect_runs({run}, [flags] {
      fcntl(STDOUT_FILENO, F_SETPIPE_SZ, 4096);
      fcntl(STDOUT_FILENO, F_SETFL, flags);
      struct sigaction action = {};
      action.sa_handler = [](int) {};
      sigaction(SIGUSR1, &action, nullptr);
      sigevent event = {};
      event.sigev_signo = SIGUSR1;
      timer_t timer;
      timer_create(CLOCK_MONOTONIC, &event, &timer);
      const itimerspec often = {{0, 200000}, {0, 200000}};
      timer_settime(timer, 0, &often, nullptr);
    });
  }
}

// The lines of what is due at a time together, the others one by one. The pipe
// keeps each write apart.
TEST_F(CliTest, WritesAsMuchAsIsDue) {
  SimulatedClock clock(kTicksPerSecond / 10);
  setup_ = {.model = make_sensors({{1, "accel", "imu"}, {2, "gyro", "imu"}}),
            .clock = &clock};
  std::array<int, 2> ends;
  ASSERT_EQ(pipe2(ends.data(), O_DIRECT), 0);
  // That nothing can be disabled does not matter any more.
  expect_runs({{{"-n1", "accel", "-d", "gyro"}, {}, {{"SendRequests", 7, 2}}}},
              [&] { dup2(ends[1], STDOUT_FILENO); });
  close(ends[1]);
  std::array<char, 4096> text;
  Words writes;
  for (ssize_t size = 0; (size = read(ends[0], text.data(), 4096)) > 0;) {
    writes.emplace_back(text.data(), static_cast<size_t>(size));
  }
  close(ends[0]);
  EXPECT_THAT(writes,
              testing::IsSupersetOf({"Sampling from sensor type gyro.s: imu.\n",
                                     "Sensor: accel.s TS: 100000000 Delta: 0 "
                                     "Data: 1.500000 0.000000\n"
                                     "Sensor: gyro.s TS: 100000000 Delta: 0 "
                                     "Data: 1.500000 0.000000\n",
                                     "accel.s 1 samples @ ~2.0 Hz\n"}));
}

}  // namespace
