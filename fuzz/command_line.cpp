#include <getopt.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <sstream>
#include <string>
#include <vector>

#include "driver/run.h"
#include "platform/library/probe.h"
#include "platform/virtual/virtual_hub.h"
#include "streamer/sensor_streamer.h"

// Whole runs of the program, on the arguments that the input holds behind its
// first byte, each up to a line's end. No time passes, and there is no log
// file. The hub takes no requests, and fails altogether after 200 calls, which
// ends what would take too long. Misuse of the library is a finding.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static platform::SimulatedClock still(0);
  platform::virtual_setup().clock = &still;
  platform::Probe& probe = platform::probe();
  probe.faults = {{"openLogFile", -EACCES}, {"SendRequests", -EIO}};
  probe.observer = [&probe, calls = 0](const std::string& call) mutable {
    if (call.starts_with("misuse")) std::abort();
    if (++calls == 200) {
      probe.faults = {
          {"Lookup", -EIO}, {"LoadAttributes", -EIO}, {"SendRequests", -EIO}};
    }
  };
  sig_handler(0);  // no session waits for a signal
  std::vector<std::string> words = {"fennick"};
  std::istringstream lines(std::string(data, data + size));
  if (lines.get() % 2 == 0) words.emplace_back("list");
  for (std::string word; std::getline(lines, word);) words.push_back(word);
  std::vector<char*> argv;
  for (std::string& word : words) argv.push_back(word.data());
  argv.push_back(nullptr);
  optind = 0;  // has getopt forget the run before
  // 0 or a negated errno code.
  if (run(static_cast<int>(words.size()), argv.data()) > 0) std::abort();
  return 0;
}
