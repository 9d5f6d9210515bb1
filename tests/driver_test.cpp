#include <csignal>
#include <cstdio>

#include "driver/usage.h"
#include "tests/support.h"

namespace {

const std::string kUsageText = std::string(kUsage) + '\n';

// Runs the whole tool, each time in a process of its own.
class DriverTest : public HubTest {
 protected:
  DriverTest() {
    hub_.model =
        make_sensors("1,accel,imu,0 2,gyro,imu,0 3,-x,odd,0 4,light,light,0,1");
    (*hub_.model)[1].attributes[SNS_ATTR_DISPLAY_NAME] = "Gyroscope 100%d";
    (*hub_.model)[2].attributes[SNS_ATTR_RATES] = true;  // unreadable
    (*hub_.model)[3].attributes.erase(SNS_ATTR_NAME);
  }
};

// The option at the end is the bad one.
TEST_F(DriverTest, RejectsBadCommandLines) {
  for (const auto& [command_line, message] : table<2>(R"(
-v 0;-v 5;-v x;-v 3x;-v '';-h -v 9   | LEVEL must be between 1 and 4, inclusive
-v -1;-x -v 2 -v9;-v 4294967299x     | LEVEL must be between 1 and 4, inclusive
-a 4;-a -1;-a 2.0                  | Accuracy LEVEL must be in the range [0, 3]
-n 12abc;-n 08;accel -n x list            | SAMPLES must be an unsigned integer
--count 99999999999999999999              | SAMPLES must be an unsigned integer
-r -0.5;-r fast;-r 1e99;-r 1e-99                    | RATE must be non-negative
-t 0;-t '';-t 1.5;-t 4294967296            | SECONDS must be a positive integer
-x;-dxp;accel -dpx;accel -?                                    | Invalid option
--bogus=1;--help=1;--ver;accel --o                             | Invalid option
accel -t;-dt;-d --time;--cou                      | Missing argument for option
)")) {
    const std::string option = " '" + split(command_line).back() + "'";
    const bool names_it = message.ends_with("option");
    expect_run(command_line, 234 /* -EINVAL */, "",
               logged("error: " + message + (names_it ? option : "")) +
                   (names_it ? kUsageText : ""));
  }
}

// What the setters got shows in the trace of each sensor.
TEST_F(DriverTest, TakesGoodCommandLines) {
  SetFaults("SendRequests=5");
  for (const auto& [command_line, trace] : table<2>(R"(
-n 0x10 -r 0.5 accel                | accel.s -n16 -r0.5
-n010 -r1e1 accel                   | accel.s -n8 -r10.0
-n -1 --rate=0x10 accel             | accel.s -n4294967295 -r16.0
-n '' -r '' accel                   | accel.s -n0 -r10.0
-n4294967297 -a4294967296 -a3 accel | accel.s -n1 -r10.0
-r50 gyro -r0 accel                 | accel.s -n0 -r10.0;gyro.s -n0 -r50.0
gyro -v9 -n2 accel -d               | accel.s -n2 -r10.0;gyro.s -n0 -r10.0
-n1 -- -x                           | -x.s -n1 -r1.0
--str --d -dspn1 accel              | accel.s -n1 -r10.0
-n1 '' --acc 2                      | .s -n1 -r10.0
)")) {
    expect_run("-v3 -v 3 -t1 " + command_line, 5, testing::_,
               testing::EndsWith(logged(trace)));
  }
  // The same sensor again takes the place of the first.
  expect_run("-t1 -r20 gyro accel -r9 accel.0 -c light", 5,
             "Sampling from sensor type accel.0.s: imu.\n"
             "Sampling from sensor type gyro.s: Gyroscope 100%d.\n"
             "Sampling from sensor type light.c: light.\n\nTime: <n> seconds\n"
             "accel.0.s 0 samples @ ~<n> Hz\ngyro.s 0 samples @ ~<n> Hz\n"
             "light.c 0 samples\n\nAverage:\n\nStandard Deviation:\n");
}

TEST_F(DriverTest, ChoosesRates) {
  SetFaults("SendRequests=5");
  for (const auto& [wanted, supported, used, log] : table<4>(R"(
0;-0;nan | 0 5 1 10 | 1.0 | Auto-selected 1.0 Hz sample rate for
0        | -3 2.5   | 2.5 | Auto-selected 2.5 Hz sample rate for
7        | 5 10     | 7.0 |
0        |          | 1.0 | warning: Unable to retrieve supported rates for
0        | 0 -1 nan | 1.0 | warning: Unable to retrieve supported rates for
)")) {
    std::vector<float> rates;
    for (const auto& rate : split(supported)) rates.push_back(std::stof(rate));
    (*hub_.model)[0].attributes[SNS_ATTR_RATES] = rates;
    expect_run("-v3 -t1 -r" + wanted + " accel", 5, testing::_,
               logged((log.empty() ? "" : log + " accel.s;") +
                      "accel.s -n0 -r" + used));
  }
}

TEST_F(DriverTest, AnswersOnlyOnceConnected) {
  for (const auto& [command_line, shown] : table<2>(R"(
-h;--he accel;accel -dh;list -h | usage
--version -x;list --version     | fennick version 2.0
)")) {
    expect_run(command_line, 0, shown == "usage" ? kUsageText : shown + '\n');
  }
  hub_.observer = nullptr;  // which would keep the warning back
  SetFaults("openLogFile=1,Create=13");
  expect_run("-h", 13, "", logged("warning: Failed to open log file"));
}

// The order in which a run ends, as a library sees it: the calls by their
// first three letters, marked where the signals are blocked.
TEST_F(DriverTest, TearsDownInOrder) {
  hub_.observer = [](const std::string& call) {
    if (call == "openLogFile") {
      vesk::setLogLevel(vesk::log_level(-1));
    } else if (call[0] != 'L' && call != "setLogLevel -1") {
      sigset_t blocked;
      pthread_sigmask(SIG_BLOCK, nullptr, &blocked);
      const int count =
          sigismember(&blocked, SIGINT) + sigismember(&blocked, SIGHUP);
      std::fprintf(stderr, count == 2 ? "%.3s! " : "%.3s ", call.c_str());
    }
  };
  for (const auto& [command_line, faults, calls] : table<3>(R"(
-v9       |                |
          | Create=-5      | Cre! clo ~Co
          |                | Cre! clo ~Cl ~Co
-h        |                | Cre! ~Cl ~Co
-v1 list  |                | set Cre! ~Cl ~Cl clo ~Cl ~Co
nosuch -a9|                | Cre! ~Cl ~Cl ~Cl ~Co
nosuch    |                | Cre! ~Cl ~Cl clo ~Cl ~Co
-n1 accel | SendRequests=7 | Cre! ~Cl ~Cl ~Cl Reg Sen Sen Unr clo ~Cl ~Co
-t9 accel | SendRequests=7 | Cre! ~Cl ~Cl ~Cl Reg Reg Sen Unr Sen Unr clo ~Cl ~Co
)")) {
    SetFaults(faults);
    const std::string err = Process(command_line).Wait().err;
    EXPECT_EQ(split(err), split(calls)) << command_line;
  }
}

}  // namespace
