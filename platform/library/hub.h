#ifndef PLATFORM_LIBRARY_HUB_H_
#define PLATFORM_LIBRARY_HUB_H_

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "hub/sensor_uid.h"
#include "hub/sns_messages.pb.h"

namespace platform {

/// A hub, behind the client library. May be called on any thread, by several
/// at once. Statuses are 0 or a negated errno code.
class Hub {
 public:
  /// A client of the library, known by its address only.
  using Client = const void*;

  /// What there is to tell: events to one client, or news to all of them.
  struct Delivery {
    enum Kind { kEvents, kHubLost, kHubFound };
    Kind kind = kEvents;
    Client client = nullptr;       // of kEvents
    sns_client_event_msg message;  // of kEvents
  };

  virtual ~Hub() = default;

  /// Adds the sensors of `datatype` to `*found`; the empty one means all.
  virtual int LookUp(const std::string& datatype, sns_suid_event* found) = 0;

  /// Fills `*attrs`; -ENODEV for an unknown sensor.
  virtual int LoadAttributes(const vesk::SensorUid& uid,
                             sns_std_attr_event* attrs) = 0;

  /// Carries out the requests of `client` in order, up to the first that
  /// fails, whose status is returned; those before it, `*done` of them, stay
  /// in force. Sensors that are enabled by one call start together.
  virtual int Request(Client client,
                      const std::vector<sns_client_request_msg>& requests,
                      size_t* done) = 0;

  /// Disables everything for `client`. What is still to be delivered to it
  /// may be dropped.
  virtual void Forget(Client client) = 0;

  // The delivery thread's, one call at a time:

  /// Sleeps until there is something to deliver or Wake is called; returns at
  /// once if it was called since Wait returned last. Wake: on any thread.
  virtual void Wait() = 0;
  virtual void Wake() = 0;

  /// Takes the next delivery of those that there were when Wait returned, and
  /// no others, however slow their clients are. False when none is left.
  virtual bool Take(Delivery* delivery) = 0;
};

// What the hub that the program is linked with defines.

/// Connects to the hub. Called on the main thread with SIGINT and SIGHUP
/// blocked; threads that are started later have to see to that themselves.
int open_hub(std::unique_ptr<Hub>* hub);

/// A timestamp of the hub's events, in seconds.
double ticks_to_seconds(uint64_t ticks);

}  // namespace platform

#endif  // PLATFORM_LIBRARY_HUB_H_
