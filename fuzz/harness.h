#ifndef FUZZ_HARNESS_H_
#define FUZZ_HARNESS_H_

#include <signal.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "platform/library/stand_in.h"

namespace fuzz {

/// Reports a finding unless `holds`.
inline void require(bool holds, const char* what) {
  if (holds) return;
  std::fprintf(stderr, "violated: %s\n", what);
  std::abort();
}

/// Watches the calls that one input makes, for the stand-in's observer.
class CallMonitor {
 public:
  /// From the call number `budget` on every request to the hub fails, which
  /// ends what would take too long.
  explicit CallMonitor(int budget) : budget_(budget) {}

  void Note(const std::string& call) {
    require(!call.starts_with("misuse"), call.c_str());
    if (call == "RegisterClient") ++registrations_;
    if (call == "UnregisterClient") --registrations_;
    if (++calls_ == budget_) FailRequests(-ETIMEDOUT);
  }

  int registrations() const { return registrations_; }

  /// Makes every request fail from now on, the one that is noted included.
  static void FailRequests(int status) {
    platform::stand_in().faults = {{.call = "Lookup", .status = status},
                                   {.call = "LoadAttributes", .status = status},
                                   {.call = "SendRequests", .status = status}};
  }

 private:
  const int budget_;
  int calls_ = 0;
  int registrations_ = 0;
};

/// Puts the handling of SIGINT and SIGHUP, which a session changes, back to
/// the fuzzer's own.
class SignalActions {
 public:
  SignalActions() {
    sigaction(SIGINT, nullptr, &interrupt_);
    sigaction(SIGHUP, nullptr, &hangup_);
  }
  ~SignalActions() {
    sigaction(SIGINT, &interrupt_, nullptr);
    sigaction(SIGHUP, &hangup_, nullptr);
  }
  SignalActions(const SignalActions&) = delete;
  SignalActions& operator=(const SignalActions&) = delete;

 private:
  struct sigaction interrupt_;
  struct sigaction hangup_;
};

/// Interrupts a session that has installed `handler` to wait for a signal.
/// False if it has not.
inline bool interrupt_session(void (*handler)(int)) {
  struct sigaction current;
  sigaction(SIGINT, nullptr, &current);
  if (current.sa_handler != handler) return false;
  raise(SIGINT);
  return true;
}

}  // namespace fuzz

#endif  // FUZZ_HARNESS_H_
