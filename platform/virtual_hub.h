#ifndef PLATFORM_VIRTUAL_HUB_H_
#define PLATFORM_VIRTUAL_HUB_H_

#include <cstddef>
#include <deque>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "platform/hub_model.h"

namespace platform {

/// The hub itself, without threads or a clock of its own: every call says what
/// time it is, and times never go back. What enters and leaves is encoded.
/// Not thread-safe.
class VirtualHub {
 public:
  /// A client is known by its address only.
  using Client = const void*;

  /// One encoded sns_client_event_msg on its way to a client.
  struct Delivery {
    Client client = nullptr;
    std::string message;
  };

  explicit VirtualHub(HubModel model);

  /// The encoded sns_suid_event for `datatype`; the empty one means all.
  std::string LookUp(const std::string& datatype) const;

  /// Fills in the sensor's encoded attribute list. Returns 0, -ENODEV for an
  /// unknown sensor, or the sensor's fault.
  int LoadAttributes(const vesk::SensorUid& uid, std::string* encoded) const;

  /// Takes an encoded sns_client_request_msg. Returns 0, -EBADMSG for a
  /// malformed one, -ENODEV for an unknown sensor, or -EINVAL for a rate at
  /// which nothing can run.
  int Request(Client client, const std::string& encoded, Ticks now);

  /// Disables everything for `client`.
  void Forget(Client client, Ticks now);

  /// When the next delivery is due, or kNever.
  Ticks NextDue() const;

  /// Takes the delivery that has been due longest, with that sensor's samples
  /// up to `now`. False when none was due by `due_by`, which is not after it.
  bool TakeDue(Ticks due_by, Ticks now, Delivery* delivery);

 private:
  struct Sensor {
    VirtualSensor model;
    sns_std_sensor_stream_type stream_type;
    std::vector<float> rates;  // Hz, ascending
    size_t fifo_size;
    float rate = 0;  // Hz at which it runs; 0: off. Not streaming: 1 is on
    Ticks started = 0;
  };

  struct Sample {
    Ticks due;
    Ticks started;  // the sensor's, back then
  };

  // One sensor's samples for one client that enabled it.
  struct Stream {
    Client client;
    Sensor* sensor;
    float rate;  // requested, Hz
    bool passive;
    Ticks joined;
    int64_t next;             // number of the first sample not collected yet
    std::deque<Sample> fifo;  // collected
    std::optional<float> config;  // a rate still to be reported, Hz
  };

  Sensor* Find(const sns_std_suid& suid);
  std::vector<Stream>::iterator FindStream(Client client, const Sensor* sensor);
  int Enable(Client client, Sensor* sensor,
             const sns_std_sensor_config& request, Ticks now);
  void Reconfigure(Sensor* sensor, Ticks now);
  static Ticks DueAt(const Stream& stream, int64_t number);
  static Ticks NextDue(const Stream& stream);
  static int64_t FirstAfter(const Sensor& sensor, Ticks time);
  static void Collect(Stream* stream, Ticks now);
  void TakeMessage(Stream* stream, std::string* encoded);

  std::deque<Sensor> sensors_;  // in the model's order; never moved
  std::map<vesk::SensorUid, Sensor*> by_uid_;
  std::map<std::string, std::vector<const Sensor*>> by_datatype_;
  std::vector<Stream> streams_;
  sns_client_event_msg message_;  // TakeMessage's, for its memory
};

}  // namespace platform

#endif  // PLATFORM_VIRTUAL_HUB_H_
