#include "tests/support.h"

#include <signal.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cstdio>
#include <cstdlib>
#include <regex>
#include <sstream>

#include "driver/run.h"

namespace {

std::string read_whole(int fd) {
  std::string text;
  std::array<char, 65536> chunk;
  lseek(fd, 0, SEEK_SET);
  for (ssize_t n = 0; (n = read(fd, chunk.data(), chunk.size())) > 0;) {
    text.append(chunk.data(), static_cast<size_t>(n));
  }
  return text;
}

// A standard descriptor, redirected to memory while this exists.
class Redirection {
 public:
  explicit Redirection(int fd)
      : fd_(fd), saved_(dup(fd)), memory_(memfd_create("captured", 0)) {
    std::fflush(nullptr);
    dup2(memory_, fd_);
  }
  ~Redirection() {
    dup2(saved_, fd_);
    close(saved_);
    close(memory_);
  }
  std::string Text() const {
    std::fflush(nullptr);
    return read_whole(memory_);
  }

 private:
  int fd_;
  int saved_;
  int memory_;
};

}  // namespace

Words split(const std::string& text) {
  Words words;
  std::istringstream stream(text);
  for (std::string word; std::getline(stream, word, ' ');) {
    words.push_back(word == "''" ? "" : word);
  }
  return words;
}

std::string repeat(const std::string& text, int times) {
  std::string result;
  while (times-- > 0) result += text;
  return result;
}

platform::VirtualSensor make_sensor(uint64_t id, const std::string& datatype,
                                    const std::string& name, long index,
                                    long stream_type) {
  return {.uid = {id, 0},
          .datatype = datatype,
          .attributes = {{SNS_ATTR_DATATYPE, datatype},
                         {SNS_ATTR_NAME, name},
                         {SNS_ATTR_HW_ID, index},
                         {SNS_ATTR_PHYSICAL_SENSOR, true},
                         {SNS_ATTR_FIFO_SIZE, 100L},
                         {SNS_ATTR_RATES, std::vector<float>{10, 50}},
                         {SNS_ATTR_STREAM_TYPE, stream_type}},
          .axes = {{.base = 1.5f}, {.step = 1}}};
}

Captured capture(const std::function<void()>& action) {
  const Redirection out(STDOUT_FILENO);
  const Redirection err(STDERR_FILENO);
  action();
  return {out.Text(), err.Text()};
}

std::string mask_times(std::string text) {
  text = std::regex_replace(text, std::regex("Time: [0-9.]+"), "Time: <n>");
  return std::regex_replace(text, std::regex("@ ~[0-9.]+"), "@ ~<n>");
}

HubTest::HubTest() {
  hub_ = {.model = {}};
  hub_.observer = [this](const std::string& call) { calls_.push_back(call); };
}

HubTest::~HubTest() {
  EXPECT_EQ(Calls("misuse"), "");
  hub_ = {};
  vesk::setLogLevel(vesk::kInfo);
}

std::unique_ptr<vesk::Connection> HubTest::Connect() {
  std::unique_ptr<vesk::Connection> connection;
  EXPECT_EQ(vesk::Connection::Create(&connection), 0);
  return connection;
}

std::string HubTest::Calls(const std::string& pattern) {
  std::string found;
  for (const std::string& call : calls_) {
    if (std::regex_search(call, std::regex("^(" + pattern + ")"))) {
      found += (found.empty() ? "" : " ") + call;
    }
  }
  return found;
}

Process::Process(const Words& arguments, const std::function<void()>& prepare,
                 const Words& command)
    : err_(memfd_create("stderr", 0)) {
  std::array<int, 2> pipe_ends;
  EXPECT_EQ(pipe(pipe_ends.data()), 0);
  out_ = pipe_ends[0];
  std::fflush(nullptr);
  pid_ = fork();
  if (pid_ != 0) {
    close(pipe_ends[1]);
    return;
  }
  Words words = command;
  if (words.empty()) words = {"fennick"};
  words.insert(words.end(), arguments.begin(), arguments.end());
  std::vector<char*> argv;
  for (std::string& word : words) argv.push_back(word.data());
  argv.push_back(nullptr);
  dup2(pipe_ends[1], STDOUT_FILENO);
  dup2(err_, STDERR_FILENO);
  close(pipe_ends[0]);
  close(pipe_ends[1]);
  close(err_);
  if (prepare != nullptr) prepare();
  if (!command.empty()) {
    execvp(argv[0], argv.data());
    _exit(127);
  }
  std::exit(run(static_cast<int>(words.size()), argv.data()));
}

void Process::ReadUntil(const std::string& text) {
  std::array<char, 4096> chunk;
  while (read_.find(text) == std::string::npos) {
    const ssize_t size = read(out_, chunk.data(), chunk.size());
    if (size <= 0) return;
    read_.append(chunk.data(), static_cast<size_t>(size));
  }
}

void Process::Signal(int number) { kill(pid_, number); }

void Process::StopReading() {
  close(out_);
  out_ = -1;
}

Process::Outcome Process::Wait() {
  ReadUntil(std::string(1, '\0'));
  int status = 0;
  waitpid(pid_, &status, 0);
  Outcome outcome = {
      WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status), read_,
      read_whole(err_)};
  if (out_ != -1) close(out_);
  close(err_);
  return outcome;
}

Process::Outcome run_tool(const std::string& command_line) {
  return Process(split(command_line)).Wait();
}
