#ifndef HUB_LOG_H_
#define HUB_LOG_H_

namespace vesk {

/// The level of a diagnostic. setLogLevel(n) shows the levels 0 to n at least.
enum log_level : int {
  kError = 0,     // failures
  kWarning = 1,   // warnings and fallbacks
  kInfo = 2,      // automatic choices; the verbosity until setLogLevel
  kDebug = 3,     // tracing
  kFunction = 4,  // function entry and exit
};

// All of these may be called on any thread.

/// Opens the log file; false when that failed.
bool openLogFile(const char* path);
void closeLogFile();

/// Sets the verbosity.
void setLogLevel(log_level level);

/// A diagnostic, printf style, without a newline at its end.
[[gnu::format(printf, 2, 3)]] void log(log_level level, const char* format,
                                       ...);

/// The output of a stream session, printf style, newlines included.
[[gnu::format(printf, 1, 2)]] void say(const char* format, ...);

/// A trace line for a function's entry ("-->") or exit ("<--").
void logFunc(const char* function, const char* marker);

/// A hub timestamp in hub ticks, as seconds.
double ticksToSeconds(unsigned long ticks);

}  // namespace vesk

#endif  // HUB_LOG_H_
