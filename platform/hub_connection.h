#ifndef PLATFORM_HUB_CONNECTION_H_
#define PLATFORM_HUB_CONNECTION_H_

#include <pthread.h>

#include <condition_variable>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "hub/vesk.h"
#include "platform/hub_clock.h"
#include "platform/virtual_hub.h"

namespace platform {

/// The connection that the library hands out: owns the virtual hub and the
/// delivery thread. May be called on any thread, also inside a delivery.
class HubConnection final : public vesk::Connection {
 public:
  HubConnection(HubModel model, HubClock* clock);
  ~HubConnection() override;

  /// Starts the delivery thread. Returns 0 or a negated errno code.
  int Start();

  static HubConnection* From(vesk::Connection* connection) {
    return static_cast<HubConnection*>(connection);
  }

  void Register(IClient* client);
  void Unregister(IClient* client);
  bool IsRegistered(IClient* client);

  /// Sends the requests in order, up to the first that fails. Returns its
  /// status: -EPERM if `client` is not registered, -ENOTCONN while the hub is
  /// lost, or what the hub says.
  int Send(IClient* client, const std::vector<std::string>& requests,
           std::vector<sns_client_resp_msg_v01>* responses);

  /// Ask the hub as VirtualHub does, or return -ENOTCONN.
  int LookUp(const std::string& datatype, std::string* encoded);
  int LoadAttributes(const vesk::SensorUid& uid, std::string* encoded);

  void SetLink(bool up);
  long sleep_count();

 private:
  using Lock = std::unique_lock<std::mutex>;

  void RunDeliveries();
  void DeliverDue(Lock* lock);
  void Deliver(Lock* lock);
  void ReportLink(Lock* lock);
  template <typename Call>
  void CallClient(IClient* client, Lock* lock, Call call);

  RealClock real_clock_;
  HubClock* const clock_;
  std::mutex mutex_;  // guards what follows up to sleep_count_
  VirtualHub hub_;
  std::map<IClient*, int> registrations_;
  // Counts up when a delivery begins and again when its lines are out, so that
  // it is odd in between.
  unsigned deliveries_ = 0;
  bool link_up_ = true;
  bool link_reported_up_ = true;
  bool stopping_ = false;
  long sleep_count_ = 0;
  std::condition_variable wake_;      // the delivery thread's sleep ends
  std::condition_variable returned_;  // a delivery is over
  // The delivery thread's own, for their memory.
  VirtualHub::Delivery delivery_;
  sns_client_event_msg message_;
  pthread_t delivery_thread_ = {};
  bool started_ = false;
};

}  // namespace platform

#endif  // PLATFORM_HUB_CONNECTION_H_
