#include <bit>
#include <cfloat>
#include <climits>
#include <cmath>
#include <fstream>
#include <iterator>
#include <regex>

#include "platform/library/output.h"
#include "tests/support.h"

namespace {

// What say prints in a delivery, by a formatter of its own where it can: values
// between two that can be shown, as floats and as doubles, the largest float
// below 1e12 and its neighbour, and floats of every magnitude. At the end, what
// the buffer has just no room for.
TEST(Output, FormatsAsPrintfDoes) {
  std::vector<double> values = {
      0,      -0.0,    0.5e-6f, -1.5e-6f,      1 / 128.,  -3 / 128., 0.5e-6,
      2.5e-6, -1e12f,  1e12f,   1.0000001e12f, 1e22,      NAN,       -NAN,
      -1e300, DBL_MIN, DBL_MAX, HUGE_VAL,      -HUGE_VAL, FLT_MAX};
  for (uint32_t i = 1, bits = 1; i < 20000; ++i) {
    bits = bits * 1664525 + 1013904223;
    values.push_back(std::bit_cast<float>(bits));
  }
  const auto print_with = [&](const auto& function) {
    platform::begin_delivery();
    for (const char* format : {" %f", "%.1f", "%lf;", "%.0f\n", "%9.2f"}) {
      for (const double value : values) function(format, value);
    }
    function("%5d%-3d%x%%%.3d%.*d%u", -3, 4, 5, 6, 7, 8, 9);
    function("%s.%c %ld %lu\n", "", 's', LONG_MIN, ~0ul);
    for (size_t size = 65536; size > 65526; --size) {
      function("%s%f", std::string(size, ' ').c_str(), -1.5);
    }
    platform::end_delivery();
    return 0;
  };
  EXPECT_EQ(capture([&] { return print_with(vesk::say); }),
            capture([&] { return print_with(std::printf); }));
}

TEST(Log, FiltersAndMarks) {
  const std::string path =
      testing::TempDir() + "fennick_log_" + std::to_string(getpid());
  std::ofstream(path) << "of another run\n";
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
  EXPECT_EQ(outcome.err, info("2%") + warning("1%") + error("0%") +
                             info("--> f") + error("not in the file"));
  std::ifstream file(path);
  const std::string text(std::istreambuf_iterator<char>(file), {});
  std::remove(path.c_str());
  const std::regex kStart("[-0-9]{10}T[0-9:]{8}\\.[0-9]{6}Z [0-9]+ ");
  EXPECT_EQ(std::regex_replace(text, kStart, "@"),
            "of another run\n@info: 2%\n@warning: 1%\n@error: 0%\n"
            "@trace: --> f\n");
}

class LibraryTest : public HubTest {};

TEST_F(LibraryTest, ReportsMisuse) {
  std::string misuse;
  platform::probe().observer = [&](const std::string& call) {
    if (call.starts_with("misuse")) misuse += call + '\n';
  };
  Connect();
  vesk::AttrUtil client(connection_.get());
  EXPECT_EQ(client.SendRequests({}, nullptr), -EPERM);
  connection_->UnregisterClient(&client);
  connection_->RegisterClient(&client);
  connection_.reset();
  EXPECT_EQ(misuse,
            "misuse: SendRequests of an unregistered client\n"
            "misuse: UnregisterClient of an unregistered client\n"
            "misuse: the connection of a registered client is destroyed\n");
}

}  // namespace
