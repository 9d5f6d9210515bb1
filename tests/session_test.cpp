#include <sys/syscall.h>
#include <utils/SystemClock.h>

#include <cmath>

#include "tests/support.h"

// In place of the system's, for every test of this program: a session lasts
// half a second by it.
int64_t android::elapsedRealtimeNano() {
  static int64_t now = 0;
  return now += 500'000'000;
}

// In place of the C library's: the first wait is ended by another signal, and
// right before the second one the signal comes.
extern "C" int sigsuspend(const sigset_t* mask) {
  sigset_t blocked;
  pthread_sigmask(SIG_BLOCK, nullptr, &blocked);
  const bool is_safe = sigismember(&blocked, SIGINT) == 1 &&
                       sigismember(&blocked, SIGHUP) == 1 &&
                       sigismember(mask, SIGINT) == 0;
  vesk::say(is_safe ? "[waits]\n" : "[may wait forever]\n");
  static bool is_first = true;
  if (std::exchange(is_first, false)) return -1;
  raise(SIGINT);
  return static_cast<int>(syscall(SYS_rt_sigsuspend, mask, 8));
}

namespace {

class SessionTest : public HubTest {};

TEST_F(SessionTest, ChoosesRates) {
  const std::string unknown =
      warning("Unable to retrieve supported rates for accel.s") +
      info("accel.s -n0 -r1.0");
  const auto chosen = [](const std::string& rate) {
    return info("Auto-selected " + rate + " Hz sample rate for accel.s") +
           info("accel.s -n0 -r" + rate);
  };
  const struct {
    const char* wanted;
    platform::AttrValue supported;
    std::string log;
  } kRows[] = {
      {"0", Floats{0, 5, 1, 10}, chosen("1.0")},
      {"-0", Floats{-3, 2.5f}, chosen("2.5")},
      {"nan", Floats{5, NAN, 9}, chosen("5.0")},
      {"7", Floats{5, 10}, info("accel.s -n0 -r7.0")},
      {"0", Floats{}, unknown},
      {"0", Floats{0, -1, NAN}, unknown},
      {"0", true, unknown},
  };
  faults_ = {{"SendRequests", 5}};
  for (const auto& row : kRows) {
    (*setup_.model)[0].attributes[SNS_ATTR_RATES] = row.supported;
    const Outcome outcome = run_tool({"-v3", "-t1", "-r", row.wanted, "accel"});
    EXPECT_EQ(outcome.err, row.log);
  }
}

// What the library sees of a session in each mode, in one order with what is
// printed. The requests fail, which ends the wait for a limit; without one a
// signal does, and is no longer blocked afterwards.
TEST_F(SessionTest, EnablesWaitsAndDisables) {
  ShowCalls({"RegisterClient", "UnregisterClient", "SendRequests", "Enable",
             "Disable"});
  const std::string announced =
      "Sampling from sensor type light.0.c: light.\n"
      "Sampling from sensor type motion.o: core.\n[RegisterClient]\n";
  const std::string enabled =
      "[SendRequests]\n"
      "[Enable 00000000-0000-0000-0000-000000000003 -1 Hz]\n"
      "[Enable 00000000-0000-0000-0000-000000000004 -1 Hz passive]\n";
  const std::string disabled =
      "[SendRequests]\n"
      "[Disable 00000000-0000-0000-0000-000000000003]\n"
      "[Disable 00000000-0000-0000-0000-000000000004]\n"
      "[UnregisterClient]\n" +
      summary("light.0.c 0 samples\nmotion.o 0 samples\n");
  // The second naming of a sensor takes the place of the first.
  const Words sensors = {"-c", "-p", "light", "light.0", "-po", "motion"};
  const auto run = [&](Words words, const std::string& out) {
    words.insert(words.end(), sensors.begin(), sensors.end());
    return Case{words, {7, out}, {{"SendRequests", 7}}};
  };
  expect_runs({run({}, announced + enabled + "[waits]\n[waits]\n" + disabled),
               run({"-n0"}, announced + enabled + disabled),
               run({"-t9"}, announced + "[RegisterClient]\n" + enabled +
                                "[UnregisterClient]\n" + disabled)});
}

// A signal counts also if it comes while the requests are sent, and another one
// at the end does no harm. After the wait both are open, whatever the parent
// has blocked. They are caught only where they are what ends the session.
TEST_F(SessionTest, TakesASignalWheneverItComes) {
  ShowCalls({"RegisterClient", "UnregisterClient"});
  const std::string announced = "Sampling from sensor type accel.s: imu.\n";
  const std::string before = announced + "[RegisterClient; HUP blocked]\n";
  const std::string end = summary("accel.s 0 samples @ ~0.0 Hz\n");
  const std::string after = "[UnregisterClient]\n" + end;
  const Outcome nested = {7, before + "[RegisterClient; HUP blocked]\n" +
                                 "[UnregisterClient; HUP blocked]\n" +
                                 "[UnregisterClient; HUP blocked]\n" + end};
  expect_runs({{{"-p", "accel"}, {0, before + "[waits]\n[waits]\n" + after}},
               {{"-t9", "-n1", "-p", "accel"}, nested, {{"SendRequests", 7}}}},
              [] { block_signal(SIGHUP); });
  int number = 0;
  OnCall([&](const std::string& call) {
    if (call == "SendRequests" || call == "UnregisterClient") raise(number);
  });
  const std::string sent = announced + "[RegisterClient]\n";
  for (const int each : {SIGINT, SIGHUP}) {
    number = each;
    expect_runs({{{"-p", "accel"}, {0, sent + after}},
                 {{"-n9", "accel"}, {-each, sent}}});
  }
}

// Where a timed session gets no thread for its sample limit, a later sample
// ends it.
TEST_F(SessionTest, SaysThatTheLimitMayBeLate) {
  SimulatedClock endless;
  setup_.clock = &endless;
  OnCall([](const std::string& call) {
    if (call != "RegisterClient") return;
    pthread_attr_t attributes;
    pthread_attr_init(&attributes);
    pthread_attr_setstacksize(&attributes, size_t{1} << 60);
    pthread_setattr_default_np(&attributes);
  });
  const Outcome outcome = run_tool({"-v1", "-t", "100000", "-n2", "accel"});
  EXPECT_EQ(outcome.status, 0);
  EXPECT_EQ(outcome.err, warning("Unable to start a thread; "
                                 "the sample limit may end the session late"));
}

}  // namespace
