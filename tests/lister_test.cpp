#include <climits>
#include <cmath>

#include "driver/usage.h"
#include "tests/support.h"

namespace {

using platform::Range;
using Longs = std::vector<long>;

constexpr char kListUsage[] =
    "Usage: fennick list {[-cos] DATATYPE{.(DATATYPE|INDEX)}}\n";

// The lines of a sensor's report.
std::string uid_line(uint64_t id) {
  return vesk::SensorUid{id, 0}.str() + '\n';
}
std::string line(std::string label, const std::string& value) {
  label.resize(18, ' ');
  return label + value + '\n';
}

class ListerTest : public HubTest {
 protected:
  // Sensors whose reports are their UIDs alone.
  void SetBareSensors(uint64_t count, const char* datatype) {
    setup_.model.emplace();
    for (uint64_t id = 1; id <= count; ++id) {
      setup_.model->push_back({.uid = {id, 0}, .datatype = datatype});
    }
  }
};

// All attributes with everyday values are in the README's example.
TEST_F(ListerTest, ReportsAttributes) {
  const struct {
    sns_std_attr_id id;
    platform::AttrValue value;
    std::string shown;
  } kRows[] = {
      {SNS_ATTR_VENDOR, "", line("VENDOR", "")},
      {SNS_ATTR_NAME, "\xff%s", line("NAME", "\xff%s")},
      {SNS_ATTR_API, Words{"", "%d\""}, line("API", "[ \"\" \"%d\"\" ]")},
      {SNS_ATTR_DRI, false, line("DRI", "false")},
      {SNS_ATTR_DYNAMIC, true, line("DYNAMIC", "true")},
      {SNS_ATTR_EVENT_SIZE, LONG_MIN,
       line("EVENT_SIZE", "-9223372036854775808")},
      {SNS_ATTR_HW_ID, LONG_MAX, ""},
      {SNS_ATTR_OP_MODES, Words{}, line("OP_MODES", "[ ]")},
      {SNS_ATTR_PASSIVE_REQUEST, false, line("PASSIVE_REQUEST", "false")},
      {SNS_ATTR_PLACEMENT, Range{1, 2}, ""},
      {SNS_ATTR_RANGES, std::vector<Range>{{-4, 8}},
       line("RANGES", "[ (-4.000000, 8.000000) ]")},
      {SNS_ATTR_RATES, Longs{}, ""},
      {SNS_ATTR_RESOLUTIONS, Floats{NAN, -0.0f},
       line("RESOLUTIONS", "[ nan -0.000000 ]")},
      {SNS_ATTR_RIGID_BODY, 3L, line("RIGID_BODY", "<unknown>")},
      {SNS_ATTR_SELECTED_RANGE, Floats{1, 2}, ""},
      {SNS_ATTR_STREAM_SYNC, 1L, ""},
      {SNS_ATTR_STREAM_TYPE, -1L, line("STREAM_TYPE", "<unknown>")},
  };
  SetBareSensors(1, "all");
  std::string report = uid_line(1);
  for (const auto& row : kRows) {
    (*setup_.model)[0].attributes[row.id] = row.value;
    report += row.shown;
  }
  EXPECT_EQ(run_tool({"list", "all"}), (Outcome{0, report + '\n'}));
}

TEST_F(ListerTest, ShowsTheOverviewInOrder) {
  std::vector<SensorRow> rows = {
      {1, "b", "parts", 10}, {2, "b", "parts", 7},   {3, "b", "parts", 2},
      {4, "b", "parts", 7},  {5, "b", "parts", -3},  {6, "ba", "parts"},
      {7, "b", "parts", 7},  {8, "a%s", "parts", 1}, {9, "é", "parts"},
      {10, "b", "parts", 2}, {11, "b", "parts", 7},  {12, "z", "Parts"},
      {13, "z", "", 3},      {14, "v", "parts"},     {15, "f", "parts"},
      {16, "b", "blank", 7}};
  // More of one name than a sort leaves in order by chance.
  for (const long index : {7, 20, 3, 16, 12, 9, 24, 1, 5, 18, 22, 14}) {
    rows.push_back({rows.size() + 1, "x", "package", index});
    rows.push_back({rows.size() + 1, "w", "package", 25 - index});
  }
  setup_.model = make_sensors(rows);
  platform::HubModel& model = *setup_.model;
  model[1].attributes[SNS_ATTR_HW_ID] = "unreadable";
  model[3].attributes.erase(SNS_ATTR_DATATYPE);
  model[15].attributes.erase(SNS_ATTR_DATATYPE);
  model[6].attributes[SNS_ATTR_NAME] = 1L;
  model[10].attributes.erase(SNS_ATTR_PHYSICAL_SENSOR);
  model[13].attributes[SNS_ATTR_PHYSICAL_SENSOR] = false;
  model[14].load_status = -5;
  const Outcome overview = {0,
                            "\n  z.3\n\nParts\n  z\n\nblank\n\n"
                            "package\n  w.1.3.5.7.9.11.13.16.18.20.22.24\n"
                            "  x.1.3.5.7.9.12.14.16.18.20.22.24\n\n"
                            "parts\n  a%s.1\n  b.2.2.10\n  ba\n  é\n\n"};
  expect_runs({{{"list"}, overview},
               {{"list", "-c"}, overview},
               {{"list", "-v", "3", "--str", "--"}, overview},
               {{"list"}, {9}, {{"Lookup", 9}}}});
}

TEST_F(ListerTest, ReadsItsOptions) {
  SetBareSensors(4, "light");
  const char* const kBodies[] = {"DISPLAY", "KEYBOARD", "EXTERNAL"};
  const char* const kTypes[] = {"STREAMING", "ON_CHANGE", "SINGLE_OUTPUT"};
  std::string reports[3];
  for (size_t i = 0; i < 3; ++i) {
    auto& attributes = (*setup_.model)[i].attributes;
    attributes[SNS_ATTR_RIGID_BODY] = static_cast<long>(i);
    attributes[SNS_ATTR_STREAM_TYPE] = static_cast<long>(i);
    reports[i] = uid_line(i + 1) + line("RIGID_BODY", kBodies[i]) +
                 line("STREAM_TYPE", kTypes[i]) + '\n';
  }
  (*setup_.model)[3].datatype = "typeless";
  const auto& [streaming, on_change, one_shot] = reports;
  const std::string all = streaming + on_change + one_shot;
  const auto invalid = [](const std::string& option) {
    return error("Invalid 'list' option '" + option + "'") + kListUsage;
  };
  expect_runs({
      {{"list", "light", "-c"}, {0, all}},
      {{"list", "-c", "light"}, {0, on_change}},
      {{"list", "-co", "light"}, {0, one_shot}},
      {{"list", "-o", "--streaming", "light"}, {0, streaming}},
      {{"list", "-c", "light", "light"}, {0, on_change + all}},
      {{"list", "light.9", "-v", "9", "--one-shot", "light"}, {0, one_shot}},
      {{"list", "nosuch", "--", "-x"}, {0}},
      {{"list", "-s", "typeless", "-s", "light"}, {254, streaming}},
      {{"list", "-s", "typeless", "light.9", "-s"}, {254}},
      {{"list", "-s", "light", "-h"}, {0, streaming + kUsage + '\n'}},
      {{"list", "-s", "light", "-sxo"}, {234, streaming, invalid("-sxo")}},
      {{"list", "-v=1", "--verbose"}, {234, "", invalid("--verbose")}},
      {{"list", "--help=1"}, {234, "", invalid("--help=1")}},
      {{"list", "-p"}, {234, "", invalid("-p")}},
  });
}

TEST_F(ListerTest, GoesOnAfterFailures) {
  SetBareSensors(3, "a");
  const auto failed = [](uint64_t id) {
    return error("No attributes for " + vesk::SensorUid{id, 0}.str());
  };
  const std::string last = uid_line(3) + '\n';
  const std::string all = uid_line(1) + '\n' + uid_line(2) + '\n' + last;
  expect_runs({
      // Each sensor is loaded once for the match; these are the reports' loads.
      {{"list", "a"},
       {9, "\n\n" + last, failed(1) + failed(2)},
       {{"LoadAttributes", 7, 4}, {"LoadAttributes", 9, 5}}},
      {{"list", "a"}, {5}, {{"LoadAttributes", 5, 3}}},
      {{"list", "a", "a", "a"}, {4, all}, {{"Lookup", 4, 1}, {"Lookup", 3, 2}}},
  });
}

}  // namespace
