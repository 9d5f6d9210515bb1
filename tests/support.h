#ifndef TESTS_SUPPORT_H_
#define TESTS_SUPPORT_H_

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/types.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "hub/vesk.h"
#include "platform/stand_in.h"

using Words = std::vector<std::string>;

/// The words between single blanks; '' stands for an empty one.
Words split(const std::string& text);

/// `text`, `times` over.
std::string repeat(const std::string& text, int times);

/// A sensor whose UID is the number `id`. Attributes that are not wanted are
/// erased, others added, afterwards.
platform::VirtualSensor make_sensor(uint64_t id, const std::string& datatype,
                                    const std::string& name, long index,
                                    long stream_type = 0);

/// What went to standard output and standard error while `action` ran.
struct Captured {
  std::string out;
  std::string err;
};
Captured capture(const std::function<void()>& action);

/// The text with every number that depends on real time replaced by <n>: the
/// summary's elapsed time and rates.
std::string mask_times(std::string text);

/// A stand-in hub for each test, which notes the calls of the library.
class HubTest : public testing::Test {
 protected:
  HubTest();
  ~HubTest() override;

  std::unique_ptr<vesk::Connection> Connect();
  /// The calls so far that match `pattern` from their start, joined by blanks.
  std::string Calls(const std::string& pattern);

  platform::StandIn& hub_ = platform::stand_in();
  std::vector<std::string> calls_;
};

/// A process that runs the tool: the linked one, on the stand-in as it is set
/// up when the process starts, or `command` with the arguments behind it.
class Process {
 public:
  struct Outcome {
    int status;  // exit status, or minus the signal that ended it
    std::string out;
    std::string err;
  };

  /// `prepare` runs in the new process first.
  explicit Process(const Words& arguments,
                   const std::function<void()>& prepare = nullptr,
                   const Words& command = {});

  /// Reads standard output until it holds `text` or ends.
  void ReadUntil(const std::string& text);
  void Signal(int number);
  /// Closes the reading end of standard output.
  void StopReading();
  Outcome Wait();

 private:
  pid_t pid_;
  int out_;
  int err_;
  std::string read_;
};

/// Runs the tool to its end on the words of a command line.
Process::Outcome run_tool(const std::string& command_line);

#endif  // TESTS_SUPPORT_H_
