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
#include "platform/virtual/stream.h"

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

  // All with the mutex held.
  Sensor* Find(const sns_std_suid& suid);
  std::vector<Stream>::iterator FindStream(Client client, const Sensor* sensor);
  int CarryOut(Client client, const sns_client_request_msg& request, Ticks now);
  int Enable(Client client, Sensor* sensor,
             const sns_std_sensor_config& request, Ticks now);
  void Reconfigure(Sensor* sensor, Ticks now);
  Ticks NextDue() const;

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
