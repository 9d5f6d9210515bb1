#include <fuzzer/FuzzedDataProvider.h>
#include <getopt.h>

#include <algorithm>
#include <iterator>
#include <string>
#include <string_view>
#include <vector>

#include "driver/run.h"
#include "fuzz/harness.h"
#include "streamer/sensor_streamer.h"

// Whole runs of the program with the arguments that the input holds, each up to
// a semicolon.

namespace {

// Light sensors that share a name make a chain of them a long business.
constexpr int kCallBudget = 200;

constexpr std::string_view kWords[] = {
    // Options
    "--accuracy;", "--accuracy=", "--count;", "--count=", "--diff;", "--help;",
    "--on-change;", "--one-shot;", "--passive;", "--rate;",
    "--rate=", "--streaming;", "--time;", "--time=", "--verbose;",
    "--verbose=", "--version;", "--ver", "--o", "--", "--;", "-a", "-a;", "-c;",
    "-d;", "-h;", "-n", "-n;", "-o;", "-p;", "-r", "-r;", "-s;", "-t", "-t;",
    "-v", "-v;", "-x", "-dp",
    // Datatypes and what goes with them
    "list;", "list;", "accel;", "accel", "light;", "light", "motion;", "odd;",
    "full;", "full;", "nosuch;", ".", ".0;", ".1;", ".2;", ";",
    // Values
    "0;", "3;", "4;", "5;", "0x10;", "010;", "-1;", "4294967296;",
    "99999999999999999999;", "2.5;", "1e-46;", "1e39;", "inf;", "nan;",
    "0x1p-3;", " 1;", "1 ;", "%s%n", "\xff"};

platform::VirtualSensor make_sensor(const char* name, const char* datatype,
                                    long index, long type) {
  static uint64_t uid = 0;
  return {.uid = {++uid, 0},
          .datatype = datatype,
          .attributes = {{SNS_ATTR_DATATYPE, datatype},
                         {SNS_ATTR_NAME, name},
                         {SNS_ATTR_HW_ID, index},
                         {SNS_ATTR_PHYSICAL_SENSOR, true},
                         {SNS_ATTR_STREAM_TYPE, type}}};
}

// Only the last sensor has all the attributes that there are to report; they
// take their time.
platform::HubModel make_hub() {
  platform::HubModel hub = {
      make_sensor("imu_a", "accel", 0, SNS_STREAM_TYPE_STREAMING),
      make_sensor("imu_b", "accel", 1, SNS_STREAM_TYPE_STREAMING),
      make_sensor("light_a", "light", 0, SNS_STREAM_TYPE_STREAMING),
      make_sensor("light_a", "light", 0, SNS_STREAM_TYPE_ON_CHANGE),
      make_sensor("core", "motion", 0, SNS_STREAM_TYPE_SINGLE_OUTPUT),
      make_sensor("\xff%n", "odd", -1, SNS_STREAM_TYPE_STREAMING),
      make_sensor("odd", "odd", 1, SNS_STREAM_TYPE_STREAMING),
  };
  platform::VirtualSensor& odd = hub[5];
  odd.attributes[SNS_ATTR_DATATYPE] = "%s%n";
  odd.attributes[SNS_ATTR_DISPLAY_NAME] = true;
  odd.attributes[SNS_ATTR_RATES] = std::vector<long>{1};
  odd.attributes[SNS_ATTR_RIGID_BODY] = 9L;
  platform::VirtualSensor& unreadable = hub[6];
  unreadable.load_status = -EIO;
  platform::VirtualSensor& full =
      hub.emplace_back(platform::default_hub().front());
  full.datatype = "full";
  return hub;
}

std::vector<platform::Fault> make_faults(FuzzedDataProvider* input) {
  constexpr const char* kCalls[] = {"Create", "Lookup", "LoadAttributes",
                                    "SendRequests"};
  // It would write to a file of the device.
  std::vector<platform::Fault> faults = {
      {.call = "openLogFile", .status = -EACCES}};
  if (input->ConsumeIntegralInRange(0, 7) == 7) {
    faults.push_back({.call = input->PickValueInArray(kCalls),
                      .status = -EIO,
                      .nth = input->ConsumeIntegralInRange(0, 9)});
  }
  return faults;
}

// Ends a session that would wait: for a signal, for a time, or for a limit
// that may never be reached.
void end_wait() {
  if (fuzz::interrupt_session(sig_handler)) return;
  fuzz::CallMonitor::FailRequests(-EIO);
}

// The program's name and the arguments.
// `text` with one of the words in the place of each byte above 127, so that a
// change of one byte makes another sensible command line.
std::string expand(const std::string& text) {
  static_assert(std::size(kWords) <= 128);
  std::string expanded;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte < 128) {
      expanded += c;
    } else {
      expanded += kWords[byte % std::size(kWords)];
    }
  }
  return expanded;
}

std::vector<std::string> split(const std::string& text) {
  std::vector<std::string> arguments = {"fennick"};
  size_t begin = 0;
  while (begin < text.size()) {
    const size_t end = std::min(text.find(';', begin), text.size());
    // What is behind a zero byte cannot be passed.
    arguments.emplace_back(text.substr(begin, end - begin).c_str());
    begin = end + 1;
  }
  return arguments;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const platform::HubModel hub = make_hub();
  FuzzedDataProvider input(data, size);
  platform::SimulatedClock clock(0);
  fuzz::CallMonitor monitor(kCallBudget);
  int connections = 0;
  platform::StandIn& setup = platform::stand_in();
  setup.observer = nullptr;
  vesk::setLogLevel(vesk::kInfo);
  setup.model = hub;
  setup.clock = &clock;
  setup.faults = make_faults(&input);
  setup.observer = [&](const std::string& call) {
    monitor.Note(call);
    connections += (call == "Create") - (call == "~Connection");
    if (call == "SendRequests") end_wait();
  };

  std::vector<std::string> arguments =
      split(expand(input.ConsumeRemainingBytesAsString()));
  std::vector<char*> argv;
  for (std::string& argument : arguments) argv.push_back(argument.data());
  argv.push_back(nullptr);
  const int argc = static_cast<int>(arguments.size());

  const fuzz::SignalActions restored_after;
  optind = 0;  // has getopt forget the run before
  const int status = run(argc, argv.data());
  setup.observer = nullptr;
  fuzz::require(status <= 0, "0 or a negated errno code is the status");
  fuzz::require(connections == 0, "the connection is ended");
  fuzz::require(monitor.registrations() == 0, "all is unregistered");
  return 0;
}
