#include "tests/support.h"

#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <sstream>

#include "driver/run.h"

namespace {

std::string take_whole(int fd) {
  std::ifstream file("/proc/self/fd/" + std::to_string(fd));
  close(fd);
  return {std::istreambuf_iterator<char>(file), {}};
}

std::string mask_times(const std::string& text) {
  static const std::regex kTimes("(\nTime: |samples @ ~)[0-9.]+");
  return std::regex_replace(text, kTimes, "$1<n>");
}

}  // namespace

Words split(const std::string& text, char separator) {
  Words words;
  std::istringstream stream(text);
  for (std::string word; std::getline(stream, word, separator);) {
    words.push_back(word == "''" ? "" : word);
  }
  return words;
}

std::string repeat(const std::string& text, int times) {
  std::string result;
  while (times-- > 0) result += text;
  return result;
}

std::string logged(const std::string& messages) {
  if (messages.empty()) return "";
  const std::regex separator(";");
  return "fennick: " + std::regex_replace(messages, separator, "\nfennick: ") +
         '\n';
}

platform::HubModel make_sensors(const std::string& texts) {
  platform::HubModel model;
  for (const std::string& text : split(texts)) {
    const Words parts = split(text + ",0", ',');
    model.push_back(
        {.uid = {std::stoul(parts[0]), 0},
         .datatype = parts[1],
         .attributes = {{SNS_ATTR_DATATYPE, parts[1]},
                        {SNS_ATTR_NAME, parts[2]},
                        {SNS_ATTR_HW_ID, std::stol(parts[3])},
                        {SNS_ATTR_PHYSICAL_SENSOR, true},
                        {SNS_ATTR_FIFO_SIZE, 100L},
                        {SNS_ATTR_RATES, std::vector<float>{10, 50}},
                        {SNS_ATTR_STREAM_TYPE, std::stol(parts[4])}},
         .axes = {{.base = 1.5f}, {.step = 1}}});
  }
  return model;
}

void expect(const Outcome& outcome, int status, const Text& out,
            const Text& err, const std::string& trace) {
  SCOPED_TRACE(trace.substr(0, 80));
  EXPECT_EQ(outcome.status, status);
  EXPECT_THAT(outcome.out, out);
  EXPECT_THAT(outcome.err, err);
}

Outcome capture(const std::function<int()>& action) {
  std::fflush(nullptr);
  const std::array<int, 2> saved = {dup(STDOUT_FILENO), dup(STDERR_FILENO)};
  const int out = memfd_create("out", 0);
  const int err = memfd_create("err", 0);
  dup2(out, STDOUT_FILENO);
  dup2(err, STDERR_FILENO);
  const int status = action();
  std::fflush(nullptr);
  dup2(saved[0], STDOUT_FILENO);
  dup2(saved[1], STDERR_FILENO);
  for (const int fd : saved) close(fd);
  return {status, mask_times(take_whole(out)), take_whole(err)};
}

HubTest::HubTest() {
  hub_ = {.model = make_sensors("1,accel,imu,0"), .clock = &clock_};
  hub_.observer = [this](const std::string& call) {
    calls_ += call + ' ';
    if (call == "openLogFile") vesk::setLogLevel(vesk::kError);
    if (call.starts_with("misuse")) std::abort();
  };
}

HubTest::~HubTest() {
  hub_ = {};
  vesk::setLogLevel(vesk::kInfo);
}

void HubTest::Connect() {
  EXPECT_EQ(vesk::Connection::Create(&connection_), 0);
}

void HubTest::SetFaults(const std::string& faults) {
  hub_.faults.clear();
  for (const std::string& fault : split(faults, ',')) {
    std::smatch parts;
    std::regex_match(fault, parts, std::regex("([^#]+?)#?(\\d*)=(.+)"));
    hub_.faults.push_back(
        {parts[1], std::stoi(parts[3]), std::stoi('0' + parts[2].str())});
  }
}

Process::Process(const std::string& command_line,
                 const std::function<void()>& prepare)
    : err(memfd_create("err", 0)) {
  std::array<int, 2> ends;
  EXPECT_EQ(pipe(ends.data()), 0);
  out = ends[0];
  std::fflush(nullptr);
  pid = fork();
  if (pid == 0) {
    dup2(ends[1], STDOUT_FILENO);
    dup2(err, STDERR_FILENO);
    for (const int fd : {ends[0], ends[1], err}) close(fd);
    // Whoever started the tests may ignore them.
    for (const int number : {SIGHUP, SIGINT, SIGPIPE}) signal(number, SIG_DFL);
    Words words = split(command_line);
    const bool is_program = command_line.starts_with("./fennick");
    if (is_program) words[0] = FENNICK_PROGRAM;
    const char* const emulator = *FENNICK_EMULATOR ? FENNICK_EMULATOR : "env";
    words.insert(words.begin(), is_program ? emulator : "fennick");
    std::vector<char*> argv;
    for (std::string& word : words) argv.push_back(word.data());
    argv.push_back(nullptr);
    if (prepare != nullptr) prepare();
    if (is_program) _exit(execvp(argv[0], argv.data()));
    std::exit(run(static_cast<int>(words.size()), argv.data()));
  }
  close(ends[1]);
}

void Process::ReadUntil(const std::string& text) {
  std::array<char, 4096> chunk;
  while (read_so_far.find(text) == std::string::npos) {
    const ssize_t size = read(out, chunk.data(), chunk.size());
    if (size <= 0) return;
    read_so_far.append(chunk.data(), static_cast<size_t>(size));
  }
}

Outcome Process::Wait() {
  ReadUntil(std::string(1, '\0'));
  close(out);
  int status = 0;
  waitpid(pid, &status, 0);
  return {WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status),
          mask_times(read_so_far), take_whole(err)};
}

void expect_run(const std::string& command_line, int status, const Text& out,
                const Text& err, const std::function<void()>& prepare) {
  expect(Process(command_line, prepare).Wait(), status, out, err, command_line);
}
