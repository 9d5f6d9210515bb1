#ifndef PLATFORM_VIRTUAL_STREAM_H_
#define PLATFORM_VIRTUAL_STREAM_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

#include "platform/library/hub.h"
#include "platform/virtual/hub_model.h"

namespace platform {

/// A sensor of the virtual hub, as it runs.
struct Sensor {
  VirtualSensor model;
  sns_std_sensor_stream_type stream_type;
  std::vector<float> rates;  // Hz, ascending
  size_t fifo_size;
  float rate = 0;  // Hz at which it runs; 0: off. Not streaming: 1 is on
  Ticks started = 0;
};

/// One sensor's samples for one client that enabled it. Not thread-safe.
struct Stream {
  Hub::Client client;
  Sensor* sensor;
  float rate = 0;  // requested, Hz
  bool passive = false;
  std::optional<float> config = {};  // a rate still to be reported, Hz

  /// Goes on with what comes after `now`, as the sensor runs now.
  void Join(Ticks now);

  /// When there is something to deliver, or kNever.
  Ticks NextDue() const;

  /// Moves what is due by now to the FIFO; nothing twice, also when the stream
  /// has been joined anew.
  void Collect(Ticks now);

  /// Takes what has piled up, oldest first.
  void TakeMessage(SampleEncoder* encoder, sns_client_event_msg* message);

  // Its own:

  struct Sample {
    Ticks due;
    Ticks started;  // the sensor's, back then
  };

  Ticks DueAt(int64_t number) const;

  Ticks joined = 0;
  int64_t next = 0;               // number of the sample to collect next
  Ticks due = kNever;             // when that is due
  Ticks collected_to = -1;        // samples up to then are not collected again
  std::vector<Sample> fifo = {};  // collected
};

}  // namespace platform

#endif  // PLATFORM_VIRTUAL_STREAM_H_
