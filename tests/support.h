#ifndef TESTS_SUPPORT_H_
#define TESTS_SUPPORT_H_

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <memory>
#include <ostream>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "driver/run.h"
#include "hub/vesk.h"
#include "platform/library/probe.h"
#include "platform/virtual/virtual_hub.h"

// The vocabulary of the tests: a virtual hub of a test's own, and runs of the
// tool on it.

using platform::kTicksPerSecond;
using platform::SimulatedClock;
using testing::ElementsAre;
using testing::HasSubstr;
using Words = std::vector<std::string>;
using Floats = std::vector<float>;
using Action = std::function<void()>;

// A diagnostic as standard error shows it.
inline std::string info(const std::string& message) {
  return "fennick: " + message + '\n';
}
inline std::string warning(const std::string& message) {
  return info("warning: " + message);
}
inline std::string error(const std::string& message) {
  return info("error: " + message);
}

inline std::string repeat(const std::string& text, int times) {
  std::string result;
  while (times-- > 0) result += text;
  return result;
}

/// The summary of a session without samples, which has these lines of counts.
inline std::string summary(const std::string& counts) {
  return "\nTime: 0.500000 seconds\n" + counts +
         "\nAverage:\n\nStandard Deviation:\n";
}

/// A sensor at 10 or 50 Hz, or one that does not change while anybody looks.
/// Its values are 1.5 and 0.
struct SensorRow {
  uint64_t uid;
  const char* datatype;
  const char* name;
  long index = 0;
  sns_std_sensor_stream_type type = SNS_STREAM_TYPE_STREAMING;
};
inline platform::HubModel make_sensors(const std::vector<SensorRow>& rows) {
  platform::HubModel model;
  for (const SensorRow& row : rows) {
    model.push_back(
        {.uid = {row.uid, 0},
         .datatype = row.datatype,
         .attributes = {{SNS_ATTR_DATATYPE, row.datatype},
                        {SNS_ATTR_NAME, row.name},
                        {SNS_ATTR_HW_ID, row.index},
                        {SNS_ATTR_PHYSICAL_SENSOR, true},
                        {SNS_ATTR_FIFO_SIZE, 100L},
                        {SNS_ATTR_RATES, Floats{50, 10}},
                        {SNS_ATTR_STREAM_TYPE, static_cast<long>(row.type)}},
         .axes = {{.base = 1.5f}, {}},
         .change_period = 1e6f});
  }
  return model;
}

/// What became of a run: its status, which is minus the signal that ended a
/// process, and what it wrote.
struct Outcome {
  int status = 0;
  std::string out = "";
  std::string err = "";
  bool operator==(const Outcome&) const = default;
};
inline void PrintTo(const Outcome& outcome, std::ostream* stream) {
  *stream << "status " << outcome.status << "\n--- output:\n"
          << outcome.out.substr(0, 2000) << "--- errors:\n"
          << outcome.err.substr(0, 2000);
}

/// The outcome of an action of this process. Nothing is checked inside of it,
/// because a failure's message would be captured as well.
inline Outcome capture(const std::function<int()>& action) {
  testing::internal::CaptureStdout();
  testing::internal::CaptureStderr();
  const int status = action();
  const std::string out = testing::internal::GetCapturedStdout();
  return {status, out, testing::internal::GetCapturedStderr()};
}

/// The outcome of a run of the tool on the hub that is set up, in a process of
/// its own, after `prepare`. It ends after a minute in any case, with SIGALRM.
inline Outcome run_tool(Words words, const Action& prepare = {}) {
  return capture([&] {
    const pid_t tool = fork();
    if (tool == 0) {
      // Whoever started the tests may ignore them.
      for (const int each : {SIGHUP, SIGINT, SIGPIPE}) signal(each, SIG_DFL);
      alarm(60);
      if (prepare) prepare();
      words.insert(words.begin(), "fennick");
      std::vector<char*> argv;
      for (std::string& word : words) argv.push_back(word.data());
      argv.push_back(nullptr);
      const int status = run(static_cast<int>(words.size()), argv.data());
      std::fflush(nullptr);
      // Without a search for leaks, which remarks on threads that just ended.
      _exit(status);
    }
    int status = 0;
    waitpid(tool, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
  });
}

/// A run of the tool, and how it ends.
struct Case {
  Words words;
  Outcome outcome;
  std::vector<platform::Fault> faults = {};  // of the hub
};
inline void expect_runs(const std::vector<Case>& runs,
                        const Action& prepare = {}) {
  for (const Case& run : runs) {
    platform::probe().faults = run.faults;
    EXPECT_EQ(run_tool(run.words, prepare), run.outcome)
        << testing::PrintToString(run.words).substr(0, 200);
  }
}

/// A virtual hub for each test, with a few sensors and a second of hub time.
/// The library's misuse ends the process. Runs of the tool report errors only,
/// until they set the level themselves, and last half a second by the clock of
/// session_test.cpp.
class HubTest : public testing::Test {
 protected:
  HubTest() {
    setup_.clock = &clock_;
    setup_.model =
        make_sensors({{1, "accel", "imu"},
                      {2, "gyro", "imu"},
                      {3, "light", "light", 0, SNS_STREAM_TYPE_ON_CHANGE},
                      {4, "motion", "core", 0, SNS_STREAM_TYPE_SINGLE_OUTPUT}});
    OnCall([](const std::string& call) {
      if (call == "openLogFile") vesk::setLogLevel(vesk::kError);
      if (!call.starts_with("misuse")) return;
      std::fprintf(stderr, "%s\n", call.c_str());
      std::abort();
    });
  }
  ~HubTest() override {
    connection_.reset();
    setup_ = {};
    platform::probe() = {};
    vesk::setLogLevel(vesk::kInfo);
  }

  /// Does something at each call of the library, too, before it.
  static void OnCall(const std::function<void(const std::string&)>& action) {
    auto& observer = platform::probe().observer;
    observer = [action, next = observer](const std::string& call) {
      if (next) next(call);
      action(call);
    };
  }

  /// Shows the library's calls of these functions among what is printed:
  /// "[CALL]", or "[CALL; HUP INT blocked]" where these signals are.
  static void ShowCalls(const std::set<std::string>& functions) {
    OnCall([=](const std::string& call) {
      if (!functions.contains(call.substr(0, call.find(' ')))) return;
      sigset_t blocked;
      pthread_sigmask(SIG_BLOCK, nullptr, &blocked);
      std::string signals;
      if (sigismember(&blocked, SIGHUP) == 1) signals += " HUP";
      if (sigismember(&blocked, SIGINT) == 1) signals += " INT";
      if (!signals.empty()) signals = ';' + signals + " blocked";
      vesk::say("[%s%s]\n", call.c_str(), signals.c_str());
    });
  }

  void Connect() { ASSERT_EQ(vesk::Connection::Create(&connection_), 0); }

  platform::VirtualSetup& setup_ = platform::virtual_setup();
  std::vector<platform::Fault>& faults_ = platform::probe().faults;
  SimulatedClock clock_{kTicksPerSecond};
  std::unique_ptr<vesk::Connection> connection_;
};

inline void block_signal(int number) {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, number);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

#endif  // TESTS_SUPPORT_H_
