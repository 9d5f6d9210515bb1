#ifndef FUZZ_HARNESS_H_
#define FUZZ_HARNESS_H_

#include <cerrno>
#include <cstdlib>
#include <string>

#include "platform/library/probe.h"
#include "platform/virtual/virtual_hub.h"

namespace fuzz {

/// Sets up the default hub, on which no time passes. It takes no requests, has
/// no log file, and after `budget` calls fails altogether, which ends what
/// would take too long. Misuse of the library is a finding.
inline void set_up(int budget) {
  static platform::SimulatedClock still(0);
  platform::virtual_setup().clock = &still;
  platform::Probe& probe = platform::probe();
  probe.faults = {{"openLogFile", -EACCES}, {"SendRequests", -EIO}};
  probe.observer = [&probe, budget](const std::string& call) mutable {
    if (call.starts_with("misuse")) std::abort();
    if (--budget == 0) {
      probe.faults = {
          {"Lookup", -EIO}, {"LoadAttributes", -EIO}, {"SendRequests", -EIO}};
    }
  };
}

}  // namespace fuzz

#endif  // FUZZ_HARNESS_H_
