#ifndef PLATFORM_STAND_IN_H_
#define PLATFORM_STAND_IN_H_

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "hub/connection.h"
#include "platform/hub_clock.h"
#include "platform/hub_model.h"

namespace platform {

/// A call of the library that fails. A call is named by its function and, if
/// it has one, what it is about: "Lookup accel", "LoadAttributes <uid>",
/// "SendRequests".
struct Fault {
  std::string call;  // with or without what it is about
  int status;
  int nth = 0;  // only the nth such call, counted from 1; 0: every one
  int seen = 0;
};

/// What the library runs on: the program leaves it as it is, tests set it up
/// before they connect.
struct StandIn {
  std::optional<HubModel> model = {};  // none: the default hub
  HubClock* clock = nullptr;           // not owned; null: real time
  std::vector<Fault> faults = {};
  /// Told of every call, and of every misuse of the library, on the calling
  /// thread and before the call does anything.
  std::function<void(const std::string& call)> observer = nullptr;
};

StandIn& stand_in();

/// Tells the observer of a call and returns the status with which it is to
/// fail, or 0.
int note_call(const char* function, const std::string& about = "");

/// Takes the connection to the hub down, or up again: its clients are told on
/// the delivery thread, and no request gets through while it is down.
void set_link(vesk::Connection* connection, bool up);

/// How often the delivery thread has slept. A sleep ends when a delivery is
/// due or a request has come.
long sleep_count(vesk::Connection* connection);

}  // namespace platform

#endif  // PLATFORM_STAND_IN_H_
