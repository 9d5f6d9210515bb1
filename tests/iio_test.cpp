#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include "platform/iio/capture.h"
#include "platform/iio/rates.h"
#include "platform/iio/sensors.h"

// What of the hub of a machine's own sensors needs no kernel, on contexts that
// libiio makes of texts.

namespace platform {
namespace {

using testing::ElementsAre;

struct Closer {
  void operator()(iio_context* context) const { iio_context_destroy(context); }
};
using XmlContext = std::unique_ptr<iio_context, Closer>;

// libxml2 remarks on everything that is not declared.
constexpr char kDeclarations[] =
    "<?xml version=\"1.0\"?><!DOCTYPE context [<!ELEMENT context ANY>"
    "<!ELEMENT device ANY><!ELEMENT channel ANY><!ELEMENT attribute EMPTY>"
    "<!ELEMENT scan-element EMPTY><!ATTLIST context name CDATA #IMPLIED>"
    "<!ATTLIST device id CDATA #IMPLIED name CDATA #IMPLIED>"
    "<!ATTLIST channel id CDATA #IMPLIED type CDATA #IMPLIED>"
    "<!ATTLIST attribute name CDATA #IMPLIED filename CDATA #IMPLIED>"
    "<!ATTLIST scan-element index CDATA #IMPLIED format CDATA #IMPLIED>]>";

XmlContext make_context(const std::string& devices) {
  const std::string xml =
      kDeclarations + ("<context name=\"xml\">" + devices) + "</context>";
  return XmlContext(iio_create_xml_context_mem(xml.data(), xml.size()));
}

std::string device(int number, const std::string& name,
                   const std::string& content) {
  return "<device id=\"iio:device" + std::to_string(number) + "\" name=\"" +
         name + "\">" + content + "</device>";
}

std::string trigger(int number, const std::string& name) {
  return "<device id=\"trigger" + std::to_string(number) + "\" name=\"" + name +
         "\"/>";
}

// A channel with these attributes, in the scan if it has a format.
std::string channel(const std::string& id,
                    const std::vector<std::string>& attributes,
                    const std::string& format = "") {
  static int index = 0;
  std::string text = "<channel id=\"" + id + "\" type=\"input\">";
  if (!format.empty()) {
    text += "<scan-element index=\"" + std::to_string(index++) +
            "\" format=\"" + format + "\"/>";
  }
  for (const std::string& name : attributes) {
    text += "<attribute name=\"" + name + "\" filename=\"in_" + id + '_' +
            name + "\"/>";
  }
  return text + "</channel>";
}

const std::string kClock = "<attribute name=\"current_timestamp_clock\"/>";
const std::string kTimestamp = channel("timestamp", {}, "le:s64/64&gt;&gt;0");

std::vector<std::string> ids_of(const IioSensor& sensor) {
  std::vector<std::string> ids;
  for (const iio_channel* each : sensor.channels) {
    ids.push_back(iio_channel_get_id(each));
  }
  return ids;
}

TEST(IioSensors, AreTheChannelsThatBelongTogether) {
  const XmlContext context = make_context(
      device(0, "part",
             channel("accel_z", {"raw"}) + channel("accel_x", {"raw"}) +
                 channel("temp", {"scale"}) + channel("accel_y", {"raw"}) +
                 channel("voltage10", {"raw"}) + channel("voltage9", {"raw"}) +
                 channel("voltage0-voltage1", {"raw"})) +
      device(1, "part", channel("pressure", {"input"})) +
      device(2, "other", channel("voltage0", {"raw"})));
  const std::vector<IioSensor> sensors = find_sensors(context.get());
  const struct {
    const char* datatype;
    const char* name;
    long index;
    double factor;
    std::vector<std::string> channels;
  } kRows[] = {
      {"accel", "part (iio:device0)", 0, 1, {"accel_x", "accel_y", "accel_z"}},
      {"voltage", "part (iio:device0)", 0, 1, {"voltage9"}},
      {"voltage", "part (iio:device0)", 1, 1, {"voltage10"}},
      {"voltage", "part (iio:device0)", 2, 1, {"voltage0-voltage1"}},
      {"pressure", "part (iio:device1)", 0, 10, {"pressure"}},
      {"voltage", "other", 3, 1, {"voltage0"}},
  };
  ASSERT_EQ(sensors.size(), std::size(kRows));
  for (size_t i = 0; i < sensors.size(); ++i) {
    SCOPED_TRACE(i);
    EXPECT_EQ(sensors[i].datatype, kRows[i].datatype);
    EXPECT_EQ(sensors[i].name, kRows[i].name);
    EXPECT_EQ(sensors[i].index, kRows[i].index);
    EXPECT_EQ(sensors[i].factor, kRows[i].factor);
    EXPECT_EQ(ids_of(sensors[i]), kRows[i].channels);
  }
}

TEST(IioSensors, AreCapturedWhereLibiioCopes) {
  const std::string good = "le:s16/32&gt;&gt;0";
  const struct {
    const char* what;
    std::string content;
    bool buffered;
  } kRows[] = {
      {"a scan with timestamps",
       kClock + kTimestamp + channel("accel_x", {"raw"}, good), true},
      {"24 bits",
       kClock + kTimestamp + channel("accel_x", {"raw"}, "be:u24/24&gt;&gt;0"),
       true},
      {"not in the scan", kClock + kTimestamp + channel("accel_x", {"raw"}),
       false},
      {"one value not in the scan",
       kClock + kTimestamp + channel("accel_x", {"raw"}, good) +
           channel("accel_y", {"raw"}),
       false},
      {"no clock", kTimestamp + channel("accel_x", {"raw"}, good), false},
      {"no timestamps", kClock + channel("accel_x", {"raw"}, good), false},
      {"short timestamps",
       kClock + channel("timestamp", {}, "le:s32/32&gt;&gt;0") +
           channel("accel_x", {"raw"}, good),
       false},
      {"repeated timestamps",
       kClock + channel("timestamp", {}, "le:s64/64X2&gt;&gt;0") +
           channel("accel_x", {"raw"}, good),
       false},
      {"a quaternion",
       kClock + kTimestamp +
           channel("rot_quaternion", {"raw"}, "le:s16/32X4&gt;&gt;0"),
       false},
      {"12 bits of space",
       kClock + kTimestamp + channel("accel_x", {"raw"}, "le:s12/12&gt;&gt;0"),
       false},
      {"16 bytes",
       kClock + kTimestamp +
           channel("accel_x", {"raw"}, "le:s128/128&gt;&gt;0"),
       false},
      {"more bits than space",
       kClock + kTimestamp + channel("accel_x", {"raw"}, "le:s16/16&gt;&gt;4"),
       false},
      {"no bits at all",
       kClock + kTimestamp + channel("accel_x", {"raw"}, "le:s0/0&gt;&gt;0"),
       false},
      {"no bits in another channel",
       kClock + kTimestamp + channel("accel_x", {"raw"}, good) +
           channel("count", {}, "le:s0/0&gt;&gt;0"),
       false},
  };
  for (const auto& row : kRows) {
    const XmlContext context = make_context(device(0, "part", row.content));
    const std::vector<IioSensor> sensors = find_sensors(context.get());
    ASSERT_EQ(sensors.size(), 1u) << row.what;
    EXPECT_EQ(sensors[0].buffered, row.buffered) << row.what;
  }
}

TEST(IioTriggers, OfADeviceAreFoundByName) {
  const struct {
    std::vector<const char*> triggers;
    const char* own;  // null: none of them
  } kRows[] = {
      {{"bmc150-any-motion-dev3", "bmc150-dev3"}, "bmc150-dev3"},
      {{"bmc150", "bmc150-dev3"}, "bmc150-dev3"},
      {{"bmc150-trigger"}, "bmc150-trigger"},
      {{"bmc150-any-motion-dev3", "bmc150-dev31", "bmc150-dev1", "bmc1500",
        "other-dev3"},
       nullptr},
  };
  for (const auto& row : kRows) {
    std::string devices = device(3, "bmc150", "");
    int number = 0;
    for (const char* name : row.triggers) devices += trigger(number++, name);
    const XmlContext context = make_context(devices);
    const iio_device* own =
        find_own_trigger(iio_context_get_device(context.get(), 0));
    EXPECT_STREQ(own == nullptr ? nullptr : iio_device_get_name(own), row.own);
  }
}

TEST(IioRates, AreTheSmallestThatIsEnough) {
  const struct {
    const char* available;
    float request;
    std::string set;
  } kRows[] = {
      {"15.62 31.26 62.5", 31.26f, "31.26"},
      {"15.62 31.26 62.5", 31.27f, "62.5"},
      {"1600 0.781 1.563", 0.781f, "0.781"},
      {"104.166667 208.333333", 104, "104.166667"},
      {"12.5 25", 100, "25"},
      {"[0.1 0.1 100]", 0.3f, "0.30000000000000004"},
      {"[0.1 0.1 100]", 0.31f, "0.4"},
      {"[0.1 0.1 100]", 0.01f, "0.1"},
      {"[0.1 0.1 100]", 1e30f, "100"},
      {"[1 0 8]", 5, "8"},
  };
  for (const auto& row : kRows) {
    Choices choices;
    ASSERT_TRUE(parse_choices(row.available, &choices)) << row.available;
    EXPECT_EQ(to_text(choose_rate(choices, row.request)), row.set)
        << row.available << " for " << row.request;
  }
  for (const char* bad : {"", "fast", "1 2x", "[1 2]", "nan", "1e999"}) {
    Choices choices;
    EXPECT_FALSE(parse_choices(bad, &choices)) << bad;
  }
}

TEST(IioRates, AreFoundInEveryFile) {
  const XmlContext context = make_context(
      device(0, "own",
             channel("accel_x", {"raw", "sampling_frequency"}) +
                 "<attribute name=\"sampling_frequency\"/>") +
      device(1, "device",
             channel("accel_x", {"raw"}) +
                 "<attribute name=\"sampling_frequency\"/>") +
      device(2, "whole",
             channel("accel_x", {"raw"}) + channel("sampling", {"frequency"})) +
      device(3, "none", channel("accel_x", {"raw"})));
  std::vector<std::string> files;
  for (const IioSensor& sensor : find_sensors(context.get())) {
    for (const Attribute& rate : find_rates(sensor)) {
      files.push_back(sensor.name + ' ' + rate.FileName());
    }
  }
  EXPECT_THAT(files, ElementsAre("own in_accel_x_sampling_frequency",
                                 "device sampling_frequency",
                                 "whole in_sampling_frequency"));
}

TEST(IioScans, HoldValuesInManyFormats) {
  const struct {
    const char* format;
    std::vector<unsigned char> bytes;
    double value;
  } kRows[] = {
      {"le:s16/16&gt;&gt;0", {0x38, 0xff}, -200},
      {"be:u16/16&gt;&gt;0", {0xff, 0x38}, 65336},
      {"le:s12/16&gt;&gt;4", {0x8f, 0xf3}, -200},
      {"be:s24/32&gt;&gt;8", {0xff, 0xff, 0x38, 0x77}, -200},
      {"le:u8/8&gt;&gt;0", {0xff}, 255},
      {"le:s64/64&gt;&gt;0", {0, 0, 0, 0, 0, 0, 0, 0x80}, -0x1p63},
  };
  for (const auto& row : kRows) {
    const XmlContext context =
        make_context(device(0, "part", channel("accel_x", {}, row.format)));
    const iio_channel* accel =
        iio_device_get_channel(iio_context_get_device(context.get(), 0), 0);
    uint64_t converted = 0;
    iio_channel_convert(accel, &converted, row.bytes.data());
    EXPECT_EQ(converted_value(*iio_channel_get_data_format(accel), &converted),
              row.value)
        << row.format;
  }
}

}  // namespace
}  // namespace platform
