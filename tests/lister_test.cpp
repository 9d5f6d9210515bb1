#include <climits>
#include <cmath>

#include "driver/usage.h"
#include "tests/support.h"

namespace {

using platform::Range;
using Floats = std::vector<float>;
using Longs = std::vector<long>;
using Ranges = std::vector<Range>;

const char* const kBodies[] = {"DISPLAY", "KEYBOARD", "EXTERNAL"};
const char* const kStreamTypes[] = {"STREAMING", "ON_CHANGE", "SINGLE_OUTPUT"};

// The lines of a sensor's report.
std::string uid_line(uint64_t id) {
  return vesk::SensorUid{id, 0}.str() + '\n';
}
std::string line(std::string label, const std::string& value) {
  label.resize(18, ' ');
  return label + value + '\n';
}

// A sensor whose report is its UID alone, if it is not looked up by name.
platform::VirtualSensor bare(uint64_t id, const char* datatype) {
  return {.uid = {id, 0}, .datatype = datatype};
}

class ListerTest : public HubTest {};

TEST_F(ListerTest, ReportsEveryAttribute) {
  const std::tuple<platform::AttrValue, const char*, const char*> kRows[] = {
      // In the order of the attributes' ids.
      {"all 100%s", "TYPE", "all 100%s"},
      {"", "VENDOR", ""},
      {"\xff\x01", "NAME", "\xff\x01"},
      {std::string("cut\0off", 7), "DISPLAY_NAME", "cut"},
      {Longs{-1, LONG_MAX}, "ACTIVE_CURRENT", "[ -1 9223372036854775807 ]"},
      {Words{"a", "", "%d\""}, "API", "[ \"a\" \"\" \"%d\"\" ]"},
      {true, "AVAILABLE", "true"},
      {false, "DRI", "false"},
      {true, "DYNAMIC", "true"},
      {LONG_MIN, "EVENT_SIZE", "-9223372036854775808"},
      {LONG_MAX, "FIFO_SIZE", "9223372036854775807"},
      {long{INT_MIN}, "HW_ID", "-2147483648"},
      {Floats{9, 3}, "LOW_LAT_RATES", "[ 9.000000 3.000000 ]"},
      {Words{}, "OP_MODES", "[ ]"},
      {false, "PASSIVE_REQUEST", "false"},
      {true, "PHYSICAL_SENSOR", "true"},
      {Longs{}, "PHYS_SNS_TESTS", "[ ]"},
      {Floats{-0.0f, 0.5f}, "PLACEMENT", "[ -0.000000 0.500000 ]"},
      {Ranges{{-4, 4}, {8, 9}}, "RANGES",
       "[ (-4.000000, 4.000000) (8.000000, 9.000000) ]"},
      {Floats{}, "RATES", "[ ]"},
      {Floats{NAN, INFINITY}, "RESOLUTIONS", "[ nan inf ]"},
      {3L, "RIGID_BODY", "<unknown>"},
      {Range{-4, 4.25f}, "SELECTED_RANGE", "(-4.000000, 4.250000)"},
      {-1e30f, "SEL_RESOLUTION", "-1000000015047466219876688855040.000000"},
      {-1L, "SLEEP_CURRENT", "-1"},
      {false, "STREAM_SYNC", "false"},
      {-1L, "STREAM_TYPE", "<unknown>"},
      {65538L, "VERSION", "65538"},
  };
  hub_.model.emplace({bare(1, "all"), bare(2, "none")});
  std::string report = uid_line(1);
  int id = 0;
  for (const auto& [value, label, shown] : kRows) {
    const auto attribute = static_cast<sns_std_attr_id>(++id);
    (*hub_.model)[0].attributes[attribute] = value;
    report += line(label, shown);
  }
  expect_run("list all", 0, report + '\n');
  expect_run("list none", 0, uid_line(2) + '\n');
}

TEST_F(ListerTest, ShowsTheOverviewInOrder) {
  hub_.model = make_sensors(
      "1,b,parts,10 2,b,parts,7 3,b,parts,2 4,b,parts,7 5,b,parts,-3 "
      "6,ba,parts,0 7,b,parts,7 8,a%s,parts,1 9,é,parts,0 10,b,parts,2 "
      "11,b,parts,7 12,z,Parts,0 13,z,,3 14,v,parts,0 15,f,parts,0 "
      "16,b,blank,7");
  (*hub_.model)[1].attributes[SNS_ATTR_HW_ID] = "unreadable";
  (*hub_.model)[3].attributes.erase(SNS_ATTR_DATATYPE);
  (*hub_.model)[15].attributes.erase(SNS_ATTR_DATATYPE);
  (*hub_.model)[6].attributes[SNS_ATTR_NAME] = 1L;
  (*hub_.model)[10].attributes.erase(SNS_ATTR_PHYSICAL_SENSOR);
  (*hub_.model)[13].attributes[SNS_ATTR_PHYSICAL_SENSOR] = false;
  (*hub_.model)[14].load_status = -5;
  for (const char* options : {"", " -c", " -v 3", " --str --"}) {
    expect_run(std::string("list") + options, 0,
               "\n  z.3\n\nParts\n  z\n\nblank\n\n"
               "parts\n  a%s.1\n  b.2.2.10\n  ba\n  é\n\n");
  }
  SetFaults("Lookup=9");
  expect_run("list", 9, "");
}

// Which of the sensors 0 to 2 it reports; they are of these types. The option
// at the end is the invalid one.
TEST_F(ListerTest, ReadsItsOptions) {
  hub_.model.emplace({bare(1, "light"), bare(0, "light"), bare(2, "light"),
                      bare(4, "typeless")});
  std::string reports[3];
  for (size_t i = 0; i < 3; ++i) {
    const uint64_t id = (*hub_.model)[i].uid.low;
    for (const auto attribute : {SNS_ATTR_RIGID_BODY, SNS_ATTR_STREAM_TYPE}) {
      (*hub_.model)[i].attributes[attribute] = static_cast<long>(id);
    }
    reports[id] = uid_line(id) + line("RIGID_BODY", kBodies[id]) +
                  line("STREAM_TYPE", kStreamTypes[id]) + '\n';
  }
  for (const auto& [words, status, types] : table<3>(R"(
light;light -c                      | 0   | 012
-c light                            | 0   | 1
-co light                           | 0   | 2
-o --streaming light                | 0   | 0
-c light light                      | 0   | 1012
-s light -v 9 --one-shot light      | 0   | 02
nosuch light.9;-- -x                | 0   |
-s typeless -s light                | 254 | 0
-x;-v;-v=1 --verbose;--help=1;--ver | 234 |
-s light -sx                        | 234 | 0
)")) {
    std::string out;
    for (const char type : types) out += reports[type - '0'];
    const std::string err =
        logged("error: Invalid 'list' option '" + split(words).back() + "'") +
        "Usage: fennick list {[-cos] DATATYPE{.(DATATYPE|INDEX)}}\n";
    expect_run("list " + words, std::stoi(status), out,
               status == "234" ? err : "");
  }
  expect_run("list -s light -h", 0, reports[0] + kUsage + '\n');
}

TEST_F(ListerTest, GoesOnAfterFailedLoads) {
  hub_.model.emplace({bare(1, "a"), bare(2, "a"), bare(3, "a")});
  // Each sensor is loaded once for the match; these are the reports' loads.
  SetFaults("LoadAttributes#4=7,LoadAttributes#4=9");
  const std::string kFailed = "fennick: error: No attributes for ";
  expect_run("list a", 9, "\n\n" + uid_line(3) + '\n',
             kFailed + uid_line(1) + kFailed + uid_line(2));
  SetFaults("Lookup#1=4,Lookup#2=3");
  expect_run("list a a a", 4,
             uid_line(1) + '\n' + uid_line(2) + '\n' + uid_line(3) + '\n');
}

}  // namespace
