#include <fuzzer/FuzzedDataProvider.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <string>

#include "platform/library/probe.h"
#include "platform/virtual/virtual_hub.h"
#include "streamer/sensor_streamer.h"

// Deliveries of all kinds into a session, up to its summary. No time passes,
// and the hub takes no requests. Misuse of the library is a finding.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  // As on the wire; 770 is none of ours.
  constexpr int kIds[] = {768, 769, 770, 778, 779, 1025, 1025, 1041};
  static platform::SimulatedClock still(0);
  platform::virtual_setup().clock = &still;
  platform::probe().faults = {{"SendRequests", -EIO}};
  platform::probe().observer = [](const std::string& call) {
    if (call.starts_with("misuse")) std::abort();
  };
  static std::unique_ptr<vesk::Connection> connection;  // of every input
  if (connection == nullptr) vesk::Connection::Create(&connection);
  FuzzedDataProvider input(data, size);
  SensorStreamer streamer(connection.get());
  if (input.ConsumeBool()) streamer.SetShowTimestampDiffs();
  streamer.SetMinimumAccuracy(
      static_cast<sns_std_sensor_sample_status>(input.ConsumeBool()));
  streamer.SetSampleLimit(input.ConsumeIntegral<uint8_t>());
  streamer.AddSensor("accel");
  while (input.remaining_bytes() > 0) {
    sns_client_event_msg message;
    if (input.ConsumeBool()) message.mutable_suid()->set_suid_low(1);
    for (int events = input.ConsumeIntegralInRange(0, 3); events > 0;
         --events) {
      sns_client_event* event = message.add_events();
      event->set_msg_id(input.PickValueInArray(kIds));
      event->set_timestamp(input.ConsumeIntegral<uint64_t>());
      event->set_payload(input.ConsumeRandomLengthString());
    }
    streamer.OnEvent(message);
  }
  if (streamer.Stream() != -EIO) std::abort();
  return 0;
}
