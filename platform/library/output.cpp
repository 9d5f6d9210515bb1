#include "platform/library/output.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/types.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstddef>
#include <cstdio>
#include <cstring>
#include <memory>
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

std::string to_string(const char* format, va_list args) {
  va_list again;
  va_copy(again, args);
  const int size = std::vsnprintf(nullptr, 0, format, args);
  std::string text(size > 0 ? static_cast<size_t>(size) : 0, '\0');
  std::vsnprintf(text.data(), text.size() + 1, format, again);
  va_end(again);
  return text;
}

/// A delivery's text, up to the size of one write.
struct Text {
  char* end() { return data + sizeof data; }

  char* next = data;  // where what is printed goes
  char data[64 * 1024];
};

/// Standard output, as say uses it. Thread-safe.
class Output {
 public:
  /// Prints outside deliveries: writes what is complete, up to a newline.
  void Print(const char* format, va_list args);

  /// Prints in a delivery what format_simple cannot.
  void PrintInto(Text* delivered, const char* format, va_list args);

  /// Writes and empties a delivery's text.
  void Flush(Text* delivered);

 private:
  // With the mutex held.
  void Write(const char* data, size_t size);

  std::mutex mutex_;
  std::string line_;  // outside deliveries: the beginning of one
  bool failed_ = false;
};

void Output::Print(const char* format, va_list args) {
  const std::string text = to_string(format, args);
  const std::lock_guard<std::mutex> lock(mutex_);
  line_ += text;
  if (text.find('\n') == text.npos) return;
  const size_t complete = line_.rfind('\n') + 1;
  Write(line_.data(), complete);
  line_.erase(0, complete);
}

void Output::PrintInto(Text* delivered, const char* format, va_list args) {
  const std::string text = to_string(format, args);
  const auto room = static_cast<size_t>(delivered->end() - delivered->next);
  if (text.size() > room) Flush(delivered);
  if (text.size() > sizeof delivered->data) {
    const std::lock_guard<std::mutex> lock(mutex_);
    Write(text.data(), text.size());
  } else {
    delivered->next = std::copy(text.begin(), text.end(), delivered->next);
  }
}

void Output::Flush(Text* delivered) {
  const std::lock_guard<std::mutex> lock(mutex_);
  Write(line_.data(), line_.size());
  line_.clear();
  Write(delivered->data,
        static_cast<size_t>(delivered->next - delivered->data));
  delivered->next = delivered->data;
}

void Output::Write(const char* data, size_t size) {
  if (write_all(STDOUT_FILENO, data, size) || failed_) return;
  failed_ = true;
  vesk::log(vesk::kError, "Unable to write to standard output");
}

Output output;

// A delivery thread's own text, which say finds while a delivery is running.
thread_local std::unique_ptr<Text> delivery_text;
thread_local constinit Text* running_delivery = nullptr;

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

// Whatever format_simple cannot print, or not there; `text` is null outside
// deliveries.
[[gnu::cold, gnu::noinline]] void print_any(Text* text, const char* format,
                                            va_list args) {
  if (text != nullptr) {
    output.PrintInto(text, format, args);
  } else {
    output.Print(format, args);
  }
}

}  // namespace

void begin_delivery() {
  if (delivery_text == nullptr)
    delivery_text = std::make_unique_for_overwrite<Text>();
  running_delivery = delivery_text.get();
}

void end_delivery() {
  output.Flush(running_delivery);
  running_delivery = nullptr;
}

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
  platform::log_output.Print(level, platform::to_string(format, args));
  va_end(args);
}

void say(const char* format, ...) {
  va_list args;
  platform::Text* const text = platform::running_delivery;
  if (text != nullptr) {
    va_start(args, format);
    const bool printed =
        platform::format_simple(&text->next, text->end(), format, &args);
    va_end(args);
    if (printed) return;
  }
  va_start(args, format);
  platform::print_any(text, format, args);
  va_end(args);
}

void logFunc(const char* function, const char* marker) {
  if (!platform::log_output.Shows(kFunction)) return;
  log(kFunction, "%s %s", marker, function);
}

double ticksToSeconds(unsigned long ticks) {
  return platform::ticks_to_seconds(ticks);
}

}  // namespace vesk
