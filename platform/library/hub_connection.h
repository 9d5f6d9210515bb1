#ifndef PLATFORM_LIBRARY_HUB_CONNECTION_H_
#define PLATFORM_LIBRARY_HUB_CONNECTION_H_

#include <pthread.h>

#include <condition_variable>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "hub/vesk.h"
#include "platform/library/hub.h"

namespace platform {

/// The connection that the library hands out: owns the hub and the delivery
/// thread. May be called on any thread, also inside a delivery.
class HubConnection final : public vesk::Connection {
 public:
  HubConnection() = default;
  ~HubConnection() override;

  /// Connects to the hub and starts the delivery thread. Returns 0 or a
  /// negated errno code.
  int Start();

  static HubConnection* From(vesk::Connection* connection) {
    return static_cast<HubConnection*>(connection);
  }

  Hub* hub() { return hub_.get(); }

  void Register(IClient* client);
  void Unregister(IClient* client);
  bool IsRegistered(IClient* client);

  /// Sends the requests in order, up to the first that fails. Returns its
  /// status: -EPERM if `client` is not registered, -EBADMSG for a malformed
  /// request, or what the hub says.
  int Send(IClient* client, const std::vector<std::string>& requests,
           std::vector<sns_client_resp_msg_v01>* responses);

 private:
  using Lock = std::unique_lock<std::mutex>;

  void RunDeliveries();
  void Deliver(Lock* lock);

  std::unique_ptr<Hub> hub_;
  // Held while the hub is told what a client wants, so that it does not hear
  // from a client after that was unregistered; taken before mutex_.
  std::mutex requests_;
  std::mutex mutex_;  // guards what follows up to stopping_
  std::map<IClient*, int> registrations_;
  // Counts up when a delivery begins and again when its lines are out, so that
  // it is odd in between.
  unsigned deliveries_ = 0;
  bool stopping_ = false;
  std::condition_variable returned_;  // a delivery is over
  // The delivery thread's own, for their memory.
  Hub::Delivery delivery_;
  std::vector<IClient*> receivers_;
  pthread_t delivery_thread_ = {};
  bool started_ = false;
};

}  // namespace platform

#endif  // PLATFORM_LIBRARY_HUB_CONNECTION_H_
