#ifndef HUB_CONNECTION_H_
#define HUB_CONNECTION_H_

#include <memory>

#include "hub/sns_messages.pb.h"

namespace vesk {

/// One connection to the sensor hub. The library derives its own class from
/// this one and starts its threads in Create, where they inherit the caller's
/// signal mask. Destroying it ends the connection; every client built on it
/// is destroyed first.
class Connection {
 public:
  /// What a connection delivers to. A registered client is called on the
  /// library's delivery thread, until it is unregistered, and calls for one
  /// client do not overlap.
  class IClient {
   public:
    /// One delivery: the events of one sensor that is enabled for this client.
    virtual void OnEvent(const sns_client_event_msg& msg) = 0;
    /// The connection to the hub was re-established.
    virtual void OnReconnect() = 0;
    /// The connection to the hub was lost.
    virtual void OnDisconnect() = 0;
    virtual ~IClient() = default;
  };

  /// Connects to the hub and fills `*connection`. Returns 0, or a nonzero
  /// status, with which `*connection` is not to be relied on.
  static int Create(std::unique_ptr<Connection>* connection);

  virtual ~Connection() = default;

  /// Starts the deliveries to `client`, which is not owned. Registrations
  /// nest: deliveries run until the outermost one is undone.
  void RegisterClient(IClient* client);

  /// Undoes one registration. After the last one no delivery to `client` is
  /// running or will start.
  void UnregisterClient(IClient* client);
};

}  // namespace vesk

#endif  // HUB_CONNECTION_H_
