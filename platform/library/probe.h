#ifndef PLATFORM_LIBRARY_PROBE_H_
#define PLATFORM_LIBRARY_PROBE_H_

#include <functional>
#include <string>
#include <vector>

#include "hub/connection.h"
#include "platform/library/hub.h"

// What tests see and change of the client library. The program leaves it as it
// is; it is set while no other thread calls the library, or in the observer.
namespace platform {

/// A call of the library that fails. A call is named by its function and, if
/// it has one, what it is about: "Lookup accel", "LoadAttributes <uid>",
/// "SendRequests", "Enable <uid> 50 Hz passive", "Disable <uid>".
struct Fault {
  std::string call;  // with or without what it is about
  int status;
  int nth = 0;   // only the nth such call, counted from 1; 0: every one
  int seen = 0;  // such calls so far
};

struct Probe {
  /// Of several for the same call the first decides; all of them count it.
  std::vector<Fault> faults = {};
  /// Told of every call, and of every misuse of the library ("misuse: ..."),
  /// on the calling thread and before the call does anything.
  std::function<void(const std::string& call)> observer = nullptr;
};

Probe& probe();

/// Tells the observer of a call and returns the status with which it is to
/// fail, or 0.
int note_call(const char* function, const std::string& about = "");

/// The hub of a connection, which owns it.
Hub* hub_of(vesk::Connection* connection);

}  // namespace platform

#endif  // PLATFORM_LIBRARY_PROBE_H_
