#include <getopt.h>

#include <climits>
#include <limits>

#include "lister/sensor_lister.h"
#include "tests/support.h"

namespace {

using platform::Range;

constexpr char kUid1[] = "00000000-0000-0000-0000-000000000001\n";
constexpr char kUid2[] = "00000000-0000-0000-0000-000000000002\n";
constexpr char kUid3[] = "00000000-0000-0000-0000-000000000003\n";

class ListerTest : public HubTest {
 protected:
  // A sensor whose report is its UID alone, if it is not looked up by name.
  static platform::VirtualSensor Bare(uint64_t id, const char* datatype) {
    return {.uid = {id, 0}, .datatype = datatype};
  }

  static platform::VirtualSensor WithType(uint64_t id, long stream_type) {
    return {.uid = {id, 0},
            .datatype = "light",
            .attributes = {{SNS_ATTR_STREAM_TYPE, stream_type}}};
  }

  Captured List(const std::string& command_line, int status) {
    const auto connection = Connect();
    Words words = split("list " + command_line);
    std::vector<char*> argv;
    for (std::string& word : words) argv.push_back(word.data());
    argv.push_back(nullptr);
    opterr = 0;
    optind = 0;  // forgets where the last case ended within a cluster
    getopt_long(1, argv.data(), "+", nullptr, nullptr);
    const SensorLister lister(connection.get());
    return capture([&] {
      EXPECT_EQ(lister.List(static_cast<int>(words.size()), argv.data()),
                status);
    });
  }
};

TEST_F(ListerTest, ReportsEveryAttribute) {
  auto sensor = Bare(1, "all");
  sensor.attributes = {
      {SNS_ATTR_DATATYPE, "all 100%s"},
      {SNS_ATTR_VENDOR, ""},
      {SNS_ATTR_NAME, "\xff\x01"},
      {SNS_ATTR_DISPLAY_NAME, std::string("cut\0off", 7)},
      {SNS_ATTR_ACTIVE_CURRENT, std::vector<long>{LONG_MIN, 0, LONG_MAX}},
      {SNS_ATTR_API, std::vector<std::string>{"a", "", "%d\""}},
      {SNS_ATTR_AVAILABLE, true},
      {SNS_ATTR_DRI, false},
      {SNS_ATTR_DYNAMIC, true},
      {SNS_ATTR_EVENT_SIZE, LONG_MIN},
      {SNS_ATTR_FIFO_SIZE, LONG_MAX},
      {SNS_ATTR_HW_ID, long{INT_MIN}},
      {SNS_ATTR_LOW_LATENCY_RATES, std::vector<float>{9, 3}},
      {SNS_ATTR_OP_MODES, std::vector<std::string>{}},
      {SNS_ATTR_PASSIVE_REQUEST, false},
      {SNS_ATTR_PHYSICAL_SENSOR, true},
      {SNS_ATTR_PHYSICAL_SENSOR_TESTS, std::vector<long>{}},
      {SNS_ATTR_PLACEMENT, std::vector<float>{-0.0f, 0.5f}},
      {SNS_ATTR_RANGES, std::vector<Range>{{-4, 4}, {-8, 8}}},
      {SNS_ATTR_RATES, std::vector<float>{}},
      {SNS_ATTR_RESOLUTIONS,
       std::vector<float>{std::numeric_limits<float>::denorm_min(),
                          std::numeric_limits<float>::quiet_NaN(),
                          std::numeric_limits<float>::infinity()}},
      {SNS_ATTR_RIGID_BODY, 2L},
      {SNS_ATTR_SELECTED_RANGE, Range{-4, 4.25f}},
      {SNS_ATTR_SELECTED_RESOLUTION, std::numeric_limits<float>::lowest()},
      {SNS_ATTR_SLEEP_CURRENT, -1L},
      {SNS_ATTR_STREAM_SYNC, false},
      {SNS_ATTR_STREAM_TYPE, 1L},
      {SNS_ATTR_VERSION, 65538L},
  };
  hub_.model = {sensor, Bare(2, "none")};
  EXPECT_EQ(
      List("all", 0).out,
      std::string(kUid1) +
          "TYPE              all 100%s\n"
          "VENDOR            \n"
          "NAME              \xff\x01\n"
          "DISPLAY_NAME      cut\n"
          "ACTIVE_CURRENT    [ -9223372036854775808 0 9223372036854775807 ]\n"
          "API               [ \"a\" \"\" \"%d\"\" ]\n"
          "AVAILABLE         true\n"
          "DRI               false\n"
          "DYNAMIC           true\n"
          "EVENT_SIZE        -9223372036854775808\n"
          "FIFO_SIZE         9223372036854775807\n"
          "HW_ID             -2147483648\n"
          "LOW_LAT_RATES     [ 9.000000 3.000000 ]\n"
          "OP_MODES          [ ]\n"
          "PASSIVE_REQUEST   false\n"
          "PHYSICAL_SENSOR   true\n"
          "PHYS_SNS_TESTS    [ ]\n"
          "PLACEMENT         [ -0.000000 0.500000 ]\n"
          "RANGES            [ (-4.000000, 4.000000) (-8.000000, 8.000000) ]\n"
          "RATES             [ ]\n"
          "RESOLUTIONS       [ 0.000000 nan inf ]\n"
          "RIGID_BODY        EXTERNAL\n"
          "SELECTED_RANGE    (-4.000000, 4.250000)\n"
          "SEL_RESOLUTION    -340282346638528859811704183484516925440.000000\n"
          "SLEEP_CURRENT     -1\n"
          "STREAM_SYNC       false\n"
          "STREAM_TYPE       ON_CHANGE\n"
          "VERSION           65538\n\n");
  EXPECT_EQ(List("none", 0).out, std::string(kUid2) + '\n');
}

TEST_F(ListerTest, NamesEnumerationValues) {
  const struct {
    platform::AttrValue value;
    std::string body;
    std::string stream;
  } kCases[] = {
      {0L, "DISPLAY", "STREAMING"},      {1L, "KEYBOARD", "ON_CHANGE"},
      {2L, "EXTERNAL", "SINGLE_OUTPUT"}, {3L, "<unknown>", "<unknown>"},
      {-1L, "<unknown>", "<unknown>"},
  };
  for (const auto& c : kCases) {
    auto sensor = Bare(1, "enum");
    sensor.attributes = {{SNS_ATTR_RIGID_BODY, c.value},
                         {SNS_ATTR_STREAM_TYPE, c.value}};
    hub_.model = {sensor};
    EXPECT_EQ(List("enum", 0).out, kUid1 + ("RIGID_BODY        " + c.body) +
                                       "\nSTREAM_TYPE       " + c.stream +
                                       "\n\n");
  }
}

TEST_F(ListerTest, ShowsTheOverviewInOrder) {
  auto unreadable = [](uint64_t id, sns_std_attr_id attribute) {
    auto sensor = make_sensor(id, "b", "parts", 7);
    sensor.attributes[attribute] = Range{0, 0};
    return sensor;
  };
  auto virtual_one = make_sensor(20, "v", "parts", 0);
  virtual_one.attributes[SNS_ATTR_PHYSICAL_SENSOR] = false;
  auto faulty = make_sensor(21, "f", "parts", 0);
  faulty.load_status = -5;
  auto blank = unreadable(22, SNS_ATTR_DATATYPE);
  blank.attributes[SNS_ATTR_NAME] = "blank";
  hub_.model = {
      make_sensor(1, "b", "parts", 10),
      unreadable(2, SNS_ATTR_HW_ID),
      make_sensor(3, "b", "parts", 2),
      unreadable(4, SNS_ATTR_DATATYPE),
      make_sensor(5, "b", "parts", -3),
      make_sensor(6, "ba", "parts", 0),
      unreadable(7, SNS_ATTR_NAME),
      make_sensor(8, "a%s", "parts", 1),
      make_sensor(9, "\xe9", "parts", 0),
      make_sensor(10, "b", "parts", 2),
      unreadable(11, SNS_ATTR_PHYSICAL_SENSOR),
      make_sensor(12, "z", "Parts", 0),
      make_sensor(13, "z", "", 3),
      virtual_one,
      faulty,
      blank,
  };
  const std::string kOverview =
      "\n  z.3\n\n"
      "Parts\n  z\n\n"
      "blank\n\n"
      "parts\n  a%s.1\n  b.2.2.10\n  ba\n  \xe9\n\n";
  for (const char* words : {"", "-c", "-v 3", "--str --"}) {
    EXPECT_EQ(List(words, 0).out, kOverview);
  }
  hub_.faults = {{"Lookup", 9}};
  EXPECT_EQ(List("", 9).out, "");
}

TEST_F(ListerTest, ReadsItsOptions) {
  const std::string kUsage =
      "Usage: fennick list {[-cos] DATATYPE{.(DATATYPE|INDEX)}}\n";
  const auto invalid = [&](const std::string& option) {
    return "fennick: error: Invalid 'list' option '" + option + "'\n" + kUsage;
  };
  hub_.model = {WithType(2, 1), WithType(1, 0), WithType(3, 2),
                Bare(4, "typeless")};
  const std::string s = kUid1 + std::string("STREAM_TYPE       STREAMING\n\n");
  const std::string c = kUid2 + std::string("STREAM_TYPE       ON_CHANGE\n\n");
  const std::string o =
      kUid3 + std::string("STREAM_TYPE       SINGLE_OUTPUT\n\n");
  const struct {
    const char* words;
    int status;
    std::string out;
    std::string err;
  } kCases[] = {
      {"light", 0, s + c + o, ""},
      {"-c light", 0, c, ""},
      {"-co light", 0, o, ""},
      {"-o --streaming light", 0, s, ""},
      {"-c light light", 0, c + s + c + o, ""},
      {"-s light -v 9 --one-shot light", 0, s + o, ""},
      {"light -c", 0, s + c + o, ""},
      {"-s light -h", SensorLister::kShowUsage, s, ""},
      {"-s light --version", SensorLister::kShowVersion, s, ""},
      {"nosuch light.9", 0, "", ""},
      {"-- -x", 0, "", ""},
      {"-x", -EINVAL, "", invalid("-x")},
      {"-s light -sx light", -EINVAL, s, invalid("-sx")},
      {"-v", -EINVAL, "", invalid("-v")},
      {"-v=1 --verbose", -EINVAL, "", invalid("--verbose")},
      {"--help=1", -EINVAL, "", invalid("--help=1")},
      {"--ver", -EINVAL, "", invalid("--ver")},
      // The first failure is the result; the rest is listed all the same.
      {"-s typeless -s light", -ENOENT, s, ""},
  };
  for (const auto& test : kCases) {
    SCOPED_TRACE(test.words);
    const Captured captured = List(test.words, test.status);
    EXPECT_EQ(captured.out, test.out);
    EXPECT_EQ(captured.err, test.err);
  }
}

TEST_F(ListerTest, GoesOnAfterFailedLoads) {
  hub_.model = {Bare(1, "a"), Bare(2, "a"), Bare(3, "a")};
  // Each sensor is loaded once for the match; these are the reports' loads.
  hub_.faults = {{"LoadAttributes", 7, 4}, {"LoadAttributes", 9, 4}};
  const Captured captured = List("a", 9);
  EXPECT_EQ(captured.out, "\n\n" + std::string(kUid3) + '\n');
  EXPECT_EQ(captured.err, std::string("fennick: error: No attributes for ") +
                              kUid1 + "fennick: error: No attributes for " +
                              kUid2);
  hub_.faults = {{"Lookup", 4, 1}, {"Lookup", 3, 2}};
  EXPECT_EQ(List("a a a", 4).out,
            std::string(kUid1) + '\n' + kUid2 + '\n' + kUid3 + '\n');
}

}  // namespace
