#include <fcntl.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include "bench/ratios.h"
#include "lister/sensor_lister.h"
#include "lookup/sensor_lookup.h"
#include "platform/library/probe.h"
#include "platform/virtual/virtual_hub.h"

// Selection and listing on hubs of many sensors. The floor asks the hub the
// same, and does nothing with the answers: its time per sensor and the ratio
// to it stay about the same from the smallest hub to the largest.

namespace {

long loads = 0;  // of attribute lists, as the hub counts them

// A hub of `size` sensors of one datatype, a hundred to a name, none of which
// has index 0; only the last one is an on-change sensor.
platform::HubModel make_hub(int size) {
  platform::HubModel model = {};
  for (int i = 1; i <= size; ++i) {
    platform::VirtualSensor sensor = platform::default_hub().front();
    sensor.uid = {static_cast<uint64_t>(i), 0};
    sensor.datatype = "accel";
    sensor.attributes[SNS_ATTR_NAME] = "part_" + std::to_string(i * 7919 % 101);
    sensor.attributes[SNS_ATTR_HW_ID] = long{i};
    sensor.attributes[SNS_ATTR_STREAM_TYPE] = long{i == size};
    sensor.resident_rate = 0;
    model.push_back(sensor);
  }
  return model;
}

std::unique_ptr<vesk::Connection> connect(int size) {
  platform::virtual_setup().model = make_hub(size);
  platform::probe().observer = [](const std::string& call) {
    if (call.starts_with("LoadAttributes")) ++loads;
  };
  std::unique_ptr<vesk::Connection> connection;
  if (vesk::Connection::Create(&connection) != 0) std::abort();
  return connection;
}

// The requests of `passes` over all sensors.
void ask(vesk::Connection* connection, int passes) {
  std::vector<vesk::SensorUid> uids;
  if (vesk::SuidUtil(connection).Lookup("accel", &uids) != 0) std::abort();
  for (int pass = 0; pass < passes; ++pass) {
    vesk::AttrUtil attr_util(connection);
    for (const vesk::SensorUid& uid : uids) {
      sns_std_attr_event attrs;
      if (attr_util.LoadAttributes(uid, &attrs) != 0) std::abort();
    }
  }
}

// Looks for the last sensor: in vain for index 0, then for its endpoint.
void select(vesk::Connection* connection) {
  vesk::SensorUid uid;
  if (SensorLookup(connection)
          .Lookup("accel", SNS_STREAM_TYPE_ON_CHANGE, &uid) != 0) {
    std::abort();
  }
}

void list_all(vesk::Connection* connection) {
  if (SensorLister(connection).ListAll() != 0) std::abort();
}

void run(benchmark::State& state, int size, int passes,
         void (*work)(vesk::Connection*)) {
  const auto connection = connect(size);
  for (auto _ : state) {
    loads = 0;
    if (work != nullptr) {
      work(connection.get());
    } else {
      ask(connection.get(), passes);
    }
    if (loads != long{size} * passes) std::abort();
  }
  state.counters["ns_per_request"] =
      benchmark::Counter(static_cast<double>(size) * passes * 1e-9,
                         benchmark::Counter::kIsIterationInvariantRate |
                             benchmark::Counter::kInvert);
}

void register_pair(const std::string& name, int size, int passes,
                   void (*work)(vesk::Connection*)) {
  const std::string full_name = name + ' ' + std::to_string(size);
  benchmark::RegisterBenchmark((full_name + "/floor").c_str(), run, size,
                               passes, nullptr);
  benchmark::RegisterBenchmark(full_name.c_str(), run, size, passes, work);
}

}  // namespace

int main(int argc, char** argv) {
  dup2(open("/dev/null", O_WRONLY), STDOUT_FILENO);
  for (const int size : {10, 100, 1000, 10000}) {
    register_pair("select", size, 2, select);
  }
  for (const int size : {10, 100, 1000, 10000}) {
    register_pair("list", size, 1, list_all);
  }
  return run_with_ratios(argc, argv);
}
