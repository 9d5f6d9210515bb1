#ifndef PLATFORM_VIRTUAL_VIRTUAL_HUB_H_
#define PLATFORM_VIRTUAL_VIRTUAL_HUB_H_

#include <cstddef>
#include <deque>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/library/hub.h"
#include "platform/virtual/hub_clock.h"
#include "platform/virtual/hub_model.h"

namespace platform {

/// What the virtual hub consists of. The program leaves it as it is; tests set
/// it before they connect.
struct VirtualSetup {
  std::optional<HubModel> model = {};  // none: the default hub
  HubClock* clock = nullptr;           // not owned; null: real time
};

VirtualSetup& virtual_setup();

/// A hub that is made up: it samples what its model says when its clock says.
/// It has no thread of its own.
class VirtualHub final : public Hub {
 public:
  /// `clock` is not owned; null is real time.
  VirtualHub(HubModel model, HubClock* clock);

  int LookUp(const std::string& datatype, sns_suid_event* found) override;
  /// Returns the sensor's fault, too.
  int LoadAttributes(const vesk::SensorUid& uid,
                     sns_std_attr_event* attrs) override;
  /// -EINVAL for a rate at which nothing can run.
  int Request(Client client,
              const std::vector<sns_client_request_msg>& requests,
              size_t* done) override;
  void Forget(Client client) override;
  void Wait() override;
  void Wake() override;
  bool Take(Delivery* delivery) override;

  /// Takes the link to the hub down, or up again. The clients are told of
  /// every change; all requests give -ENOTCONN while it is down.
  void SetLink(bool up);

  /// How often the delivery thread has slept. A sleep ends when a delivery is
  /// due or something has changed.
  long sleep_count();

 private:
  using Lock = std::unique_lock<std::mutex>;

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
    float rate = 0;  // requested, Hz
    bool passive = false;
    Ticks joined = 0;
    int64_t next = 0;         // number of the sample to collect next
    Ticks due = kNever;       // when that is due
    Ticks collected_to = -1;  // samples up to then are not collected again
    std::vector<Sample> fifo = {};     // collected
    std::optional<float> config = {};  // a rate still to be reported, Hz
  };

  // All with the mutex held.
  Sensor* Find(const sns_std_suid& suid);
  std::vector<Stream>::iterator FindStream(Client client, const Sensor* sensor);
  int CarryOut(Client client, const sns_client_request_msg& request, Ticks now);
  int Enable(Client client, Sensor* sensor,
             const sns_std_sensor_config& request, Ticks now);
  void Reconfigure(Sensor* sensor, Ticks now);
  static Ticks DueAt(const Stream& stream, int64_t number);
  static Ticks NextDue(const Stream& stream);
  static void Join(Stream* stream, Ticks now);
  static void Collect(Stream* stream, Ticks now);
  Ticks NextDue() const;
  void TakeMessage(Stream* stream, sns_client_event_msg* message);

  RealClock real_clock_;
  HubClock* const clock_;
  std::mutex mutex_;            // guards what follows
  Alarm alarm_;                 // rings at any change
  std::deque<Sensor> sensors_;  // in the model's order; never moved
  std::map<vesk::SensorUid, Sensor*> by_uid_;
  std::map<std::string, std::vector<const Sensor*>> by_datatype_;
  std::vector<Stream> streams_;
  SampleEncoder encoder_;
  bool link_up_ = true;
  std::deque<bool> link_changes_;  // still to be told
  bool woken_ = false;
  Ticks round_ = 0;  // what was due by then may be taken
  long sleep_count_ = 0;
};

}  // namespace platform

#endif  // PLATFORM_VIRTUAL_VIRTUAL_HUB_H_
