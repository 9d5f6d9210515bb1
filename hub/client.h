#ifndef HUB_CLIENT_H_
#define HUB_CLIENT_H_

#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <string>
#include <vector>

#include "hub/connection.h"
#include "hub/sensor_uid.h"

namespace vesk {

/// A client of the hub: builds and sends requests, and receives events while
/// it is registered with its connection. A derived class overrides OnEvent.
/// All but the IClient operations are called on the thread that owns it.
class Client : public Connection::IClient {
 public:
  /// Builds an unregistered client on `connection`, which is not owned.
  explicit Client(Connection* connection);

  /// Neither unregisters nor sends anything.
  ~Client() override = default;

  void OnReconnect() override;
  void OnDisconnect() override;

  /// The encoded request that enables `suid` at `rate` Hz (-1 for a sensor
  /// that is not streaming). A passive client gets samples only while another
  /// client keeps the sensor running.
  std::string MakeConfigRequest(const SensorUid& suid, float rate,
                                bool passive);

  /// The encoded request that disables `suid` for this client.
  std::string MakeDisableRequest(const SensorUid& suid);

  /// Sends the requests in order. `responses` may be null, else it receives
  /// one record per request. Returns 0 when all were sent.
  int SendRequests(const std::vector<std::string>& requests,
                   std::vector<sns_client_resp_msg_v01>* responses);

  /// Registers the client, sends the requests, waits on cv_ for at most
  /// `timeout`, and unregisters it. mutex_ is held from before the requests
  /// are sent until the wait releases it. Any wake-up ends the wait. Returns
  /// SendRequests' status if that is nonzero, -ETIMEDOUT if the timeout ran
  /// out or is below one second (then nothing is waited for), else status_.
  template <typename Rep, typename Period>
  int SendRequestsAndWait(const std::vector<std::string>& requests,
                          const std::chrono::duration<Rep, Period>& timeout,
                          std::vector<sns_client_resp_msg_v01>* responses);

 protected:
  std::condition_variable cv_;  // ends a wait
  Connection* connection_;      // not owned
  int status_;                  // kept by the library; guarded by mutex_
  std::mutex mutex_;            // guards the client's waits
};

template <typename Rep, typename Period>
int Client::SendRequestsAndWait(
    const std::vector<std::string>& requests,
    const std::chrono::duration<Rep, Period>& timeout,
    std::vector<sns_client_resp_msg_v01>* responses) {
  using std::chrono::steady_clock;
  using std::chrono::system_clock;
  // Holds every timeout, also one that does not fit the clocks' own unit.
  using Seconds = std::chrono::duration<double>;

  if (responses != nullptr) {
    responses->clear();
    responses->reserve(requests.size());
  }
  connection_->RegisterClient(this);
  std::unique_lock<std::mutex> lock(mutex_);
  int result = SendRequests(requests, responses);
  if (result == 0 && Seconds(timeout) < Seconds(1)) {
    result = -ETIMEDOUT;
  } else if (result == 0) {
    const steady_clock::time_point start = steady_clock::now();
    const system_clock::time_point now = system_clock::now();
    system_clock::time_point deadline = system_clock::time_point::max();
    // Less a second, for what the rounding may add.
    if (Seconds(timeout) < Seconds(deadline - now) - Seconds(1)) {
      deadline =
          now + std::chrono::duration_cast<system_clock::duration>(timeout);
    }
    cv_.wait_until(lock, deadline);
    const Seconds waited = steady_clock::now() - start;
    result = waited >= Seconds(timeout) ? -ETIMEDOUT : status_;
  }
  lock.unlock();
  connection_->UnregisterClient(this);
  return result;
}

}  // namespace vesk

#endif  // HUB_CLIENT_H_
