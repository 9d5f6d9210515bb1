#include "platform/library/output.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/types.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstddef>
#include <cstdio>
#include <cstring>
#include <mutex>
#include <string>

#include "hub/log.h"
#include "platform/library/format.h"
#include "platform/library/hub.h"
#include "platform/library/probe.h"

// The client library's output and diagnostics.

namespace platform {
namespace {

// Writes all of it; false if that failed. Waits for a reader that is slow,
// also where the descriptor itself does not wait.
bool write_all(int fd, const char* data, size_t size) {
  while (size > 0) {
    const ssize_t written = write(fd, data, size);
    if (written >= 0) {
      data += written;
      size -= static_cast<size_t>(written);
    } else if (errno == EAGAIN) {
      pollfd writable = {fd, POLLOUT, 0};
      poll(&writable, 1, -1);
    } else if (errno != EINTR) {
      return false;
    }
  }
  return true;
}

std::string format_text(const char* format, va_list args) {
  va_list again;
  va_copy(again, args);
  const int size = std::vsnprintf(nullptr, 0, format, args);
  std::string text(size > 0 ? static_cast<size_t>(size) : 0, '\0');
  std::vsnprintf(text.data(), text.size() + 1, format, again);
  va_end(again);
  return text;
}

/// Standard output, as say uses it. Thread-safe.
class Output {
 public:
  void Print(const char* format, va_list args);
  void SetDelivering(bool delivering);

 private:
  void Write(const char* data, size_t size);
  void Flush();

  std::mutex mutex_;
  char buffer_[64 * 1024] = {};
  size_t used_ = 0;
  bool delivering_ = false;
  bool failed_ = false;
};

void Output::Print(const char* format, va_list args) {
  const std::lock_guard<std::mutex> lock(mutex_);
  char* const end = buffer_ + sizeof buffer_;
  if (char* at = format_simple(buffer_ + used_, end, format, args)) {
    used_ = static_cast<size_t>(at - buffer_);
  } else {
    const std::string text = format_text(format, args);
    if (text.size() > sizeof buffer_ - used_) Flush();
    if (text.size() > sizeof buffer_) {
      Write(text.data(), text.size());
    } else {
      std::memcpy(buffer_ + used_, text.data(), text.size());
      used_ += text.size();
    }
  }
  if (!delivering_ && used_ > 0 && buffer_[used_ - 1] == '\n') Flush();
}

void Output::SetDelivering(bool delivering) {
  const std::lock_guard<std::mutex> lock(mutex_);
  delivering_ = delivering;
  if (!delivering) Flush();
}

void Output::Write(const char* data, size_t size) {
  if (write_all(STDOUT_FILENO, data, size) || failed_) return;
  failed_ = true;
  vesk::log(vesk::kError, "Unable to write to standard output");
}

void Output::Flush() {
  Write(buffer_, used_);
  used_ = 0;
}

constinit Output output;

/// The log file, and how much is logged. Thread-safe.
class Log {
 public:
  bool Open(const char* path);
  void Close();
  void SetLevel(int level) { level_ = level; }
  bool Shows(int level) const {
    return level <= level_.load(std::memory_order_relaxed);
  }
  void Print(int level, const std::string& text);

 private:
  std::atomic<int> level_ = vesk::kInfo;
  std::mutex mutex_;  // guards the file
  int file_ = -1;
};

bool Log::Open(const char* path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  if (file_ != -1) close(file_);
  file_ = open(path, O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644);
  return file_ != -1;
}

void Log::Close() {
  const std::lock_guard<std::mutex> lock(mutex_);
  if (file_ != -1) close(file_);
  file_ = -1;
}

// Standard error gets the bare message, the log file the circumstances too.
// One write each, so that the lines of two runs do not mix.
void Log::Print(int level, const std::string& text) {
  static constexpr const char* kMarks[] = {"error: ", "warning: "};
  static constexpr const char* kNames[] = {"error", "warning", "info", "debug",
                                           "trace"};
  std::string line = "fennick: ";
  if (level <= vesk::kWarning) line += kMarks[level];
  line += text + '\n';
  write_all(STDERR_FILENO, line.data(), line.size());

  const std::lock_guard<std::mutex> lock(mutex_);
  if (file_ == -1) return;
  timespec now;
  clock_gettime(CLOCK_REALTIME, &now);
  tm utc;
  gmtime_r(&now.tv_sec, &utc);
  char stamp[64];
  const size_t size = std::strftime(stamp, sizeof stamp, "%FT%T", &utc);
  std::snprintf(stamp + size, sizeof stamp - size, ".%06ldZ %d ",
                now.tv_nsec / 1000, gettid());
  line = std::string(stamp) + kNames[level] + ": " + text + '\n';
  write_all(file_, line.data(), line.size());
}

constinit Log log_output;

}  // namespace

void begin_delivery() { output.SetDelivering(true); }
void end_delivery() { output.SetDelivering(false); }

}  // namespace platform

namespace vesk {

bool openLogFile(const char* path) {
  return platform::note_call("openLogFile") == 0 &&
         platform::log_output.Open(path);
}

void closeLogFile() {
  platform::note_call("closeLogFile");
  platform::log_output.Close();
}

void setLogLevel(log_level level) {
  platform::note_call("setLogLevel", std::to_string(level));
  platform::log_output.SetLevel(level);
}

void log(log_level level, const char* format, ...) {
  if (!platform::log_output.Shows(level)) return;
  va_list args;
  va_start(args, format);
  platform::log_output.Print(level, platform::format_text(format, args));
  va_end(args);
}

void say(const char* format, ...) {
  va_list args;
  va_start(args, format);
  platform::output.Print(format, args);
  va_end(args);
}

void logFunc(const char* function, const char* marker) {
  log(kFunction, "%s %s", marker, function);
}

double ticksToSeconds(unsigned long ticks) {
  return platform::ticks_to_seconds(ticks);
}

}  // namespace vesk
