#ifndef TESTS_SUPPORT_H_
#define TESTS_SUPPORT_H_

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/types.h>

#include <array>
#include <functional>
#include <memory>
#include <regex>
#include <string>
#include <utility>
#include <vector>

#include "hub/vesk.h"
#include "platform/library/stand_in.h"

using testing::HasSubstr;
using Text = testing::Matcher<const std::string&>;
using Words = std::vector<std::string>;

/// The words between the separators; '' stands for an empty one.
Words split(const std::string& text, char separator = ' ');

/// `text`, `times` over.
std::string repeat(const std::string& text, int times);

/// The diagnostics, between semicolons, as standard error shows them.
std::string logged(const std::string& messages);

/// The rows of a table as text: one a line, of cells between bars. Blanks
/// around a bar do not count, and cells that are missing are empty. A line is
/// one row for each of the first cell's alternatives, between semicolons.
template <size_t columns>
std::vector<std::array<std::string, columns>> table(const std::string& text) {
  std::vector<std::array<std::string, columns>> rows;
  for (const std::string& line : split(text, '\n')) {
    const Words cells =
        split(std::regex_replace(line, std::regex(" *\\| *"), "|"), '|');
    if (cells.empty()) continue;
    EXPECT_LE(cells.size(), columns) << line;
    for (const std::string& first : split(cells[0] + ';', ';')) {
      std::copy(cells.begin(), cells.end(), rows.emplace_back().begin());
      rows.back()[0] = first;
    }
  }
  return rows;
}

/// Sensors, by blanks: UID,DATATYPE,NAME,INDEX or UID,DATATYPE,NAME,INDEX,TYPE.
platform::HubModel make_sensors(const std::string& texts);

/// What became of a run: its status, which is minus the signal that ended a
/// process, and what it wrote. The elapsed time and the rates in a summary,
/// which depend on real time, are replaced by <n>.
struct Outcome {
  int status;
  std::string out;
  std::string err;
};
void expect(const Outcome& outcome, int status, const Text& out,
            const Text& err = "", const std::string& trace = "");

/// The outcome of an action of this process.
Outcome capture(const std::function<int()>& action);

/// A stand-in hub for each test, with an accelerometer and a second of hub
/// time. Its observer notes the calls of the library, ends the process on
/// misuse, and has a run report errors only, as neither its log file nor its
/// choices are of interest, until it sets the level itself.
class HubTest : public testing::Test {
 protected:
  HubTest();
  ~HubTest() override;

  void Connect();
  /// Sets the faults of the hub, CALL=STATUS or CALL#NTH=STATUS, by commas.
  void SetFaults(const std::string& faults);

  platform::StandIn& hub_ = platform::stand_in();
  platform::SimulatedClock clock_{platform::kTicksPerSecond};
  std::string calls_;  // so far, each with a blank
  std::unique_ptr<vesk::Connection> connection_;
};

/// A process that runs the tool: the linked one, on the stand-in as it is set
/// up when the process starts, or, if the command line starts with ./fennick,
/// the program itself.
struct Process {
  /// `prepare` runs in the new process first.
  explicit Process(const std::string& command_line,
                   const std::function<void()>& prepare = nullptr);

  /// Reads standard output until it holds `text` or ends.
  void ReadUntil(const std::string& text);
  Outcome Wait();

  pid_t pid;
  int out;  // the reading end of its standard output
  int err;
  std::string read_so_far;
};

/// Runs the tool to its end on a command line.
void expect_run(const std::string& command_line, int status, const Text& out,
                const Text& err = "",
                const std::function<void()>& prepare = nullptr);

#endif  // TESTS_SUPPORT_H_
