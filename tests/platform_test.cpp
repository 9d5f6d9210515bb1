#include <unistd.h>

#include <bit>
#include <cfloat>
#include <climits>
#include <cmath>
#include <fstream>

#include "platform/virtual/hub_clock.h"
#include "tests/support.h"

namespace {

// ---- The virtual hub -------------------------------------------------------

// As the tool shows it, by the timestamps of its samples, if the hub wakes up
// as late as that, in ticks. The rate is the one at which the sensor is
// reported to run.
TEST_F(HubTest, DeliversOnAnExactGrid) {
  hub_.model =
      make_sensors("1,accel,imu,0 2,light,light,0,1 3,motion,core,0,2");
  (*hub_.model)[0].attributes[SNS_ATTR_RATES] =
      std::vector<float>{50, 12.5f, 0, 30};
  (*hub_.model)[0].attributes[SNS_ATTR_FIFO_SIZE] = 3L;
  (*hub_.model)[0].resident_rate = 10;
  (*hub_.model)[1].change_period = 0.4f;
  (*hub_.model)[2].change_period = 0.3f;
  for (auto& sensor : *hub_.model) sensor.axes.clear();
  for (const auto& [command_line, late, times, rate] : table<4>(R"(
-n3 -r25.1 accel  | 0       | 33333320 66666680 100000000   | 30.0
-n2 -r1000 accel  | 0       | 20000000 40000000             | 50.0
-n4 -r1000 accel  | 2525000 | 80000000 100000000 120000000  | 50.0
-n2 -r50 -p accel | 0       | 80000000 160000000            | 12.5
-n3 -c light      | 0       | 0 400000000 800000000         |
-n1 -o motion     | 0       | 300000000                     |
)")) {
    platform::SimulatedClock clock(platform::kTicksPerSecond, std::stoi(late));
    hub_.clock = &clock;
    std::string samples = ".\n";
    for (const std::string& time : split(times)) {
      samples += "TS: " + time + " Data:\n";
    }
    expect_run("-v2 " + command_line, 0, HasSubstr(samples),
               HasSubstr(rate.empty() ? "" : "for " + rate + " Hz"));
  }
}

// ---- Output and log --------------------------------------------------------

// What say prints, whichever of its formatters does it.
TEST(Output, FormatsAsPrintfDoes) {
  std::vector<double> values = {0,    -0.0, 0.5e-6, 1.5e-6,  2.5e-6,  0.25,
                                1e22, NAN,  -1e300, DBL_MIN, DBL_MAX, HUGE_VAL};
  for (uint32_t i = 1, bits = 1; i < 100000; ++i) {
    bits = bits * 1664525 + 1013904223;
    values.push_back(std::bit_cast<float>(bits));
  }
  const auto print = [&](const auto& function) {
    return capture([&] {
      for (const char* format : {" %f", "%.1f", "%lf;", "%.0f\n", "%9.2f"}) {
        for (const double value : values) function(format, value);
      }
      function("%5d%-3d%x%%%.3d%.*d%u", -3, 4, 5, 6, 7, 8, 9);
      function("%s.%c %ld %lu\n", "", 's', LONG_MIN, ~0ul);
      return 0;
    });
  };
  EXPECT_EQ(print(vesk::say).out, print(std::printf).out);
}

TEST(Log, FiltersAndMarks) {
  const std::string path = testing::TempDir() + "fennick_log_test";
  unlink(path.c_str());
  EXPECT_FALSE(vesk::openLogFile((path + "/no/such").c_str()));
  ASSERT_TRUE(vesk::openLogFile(path.c_str()));
  const Outcome outcome = capture([] {
    for (const int level : {0, 1, 2, 3, 4}) {
      vesk::setLogLevel(vesk::log_level(level));
      vesk::log(vesk::log_level(4 - level), "%d%%", 4 - level);
      vesk::logFunc("f", "-->");
    }
    vesk::closeLogFile();
    vesk::log(vesk::kError, "not in the file");
    return 0;
  });
  EXPECT_EQ(outcome.err,
            logged("2%;warning: 1%;error: 0%;--> f;error: not in the file"));
  std::ifstream file(path);
  const std::string text(std::istreambuf_iterator<char>(file), {});
  const std::regex kStart("[-0-9]{10}T[0-9:]{8}\\.[0-9]{6}Z [0-9]+ ");
  EXPECT_EQ(std::regex_replace(text, kStart, "@"),
            "@info: 2%\n@warning: 1%\n@error: 0%\n@trace: --> f\n");
}

}  // namespace
