#ifndef PLATFORM_IIO_CONTEXT_H_
#define PLATFORM_IIO_CONTEXT_H_

#include <iio.h>
#include <signal.h>

#include <cstdio>

namespace platform {

/// Exists while a thread that does not block SIGPIPE calls libiio, which writes
/// to sockets whose daemon may be gone: meanwhile that does not end the
/// process. Of one thread.
class PipeGuard {
 public:
  PipeGuard();
  ~PipeGuard();
  PipeGuard(const PipeGuard&) = delete;
  PipeGuard& operator=(const PipeGuard&) = delete;

 private:
  sigset_t previous_;
};

/// What libiio's default context reaches: the devices of this machine, or those
/// of the one that IIOD_REMOTE names. While it is open, libiio's own remarks on
/// standard error are kept off; our messages say what matters.
class Context {
 public:
  Context() = default;
  ~Context();
  Context(const Context&) = delete;
  Context& operator=(const Context&) = delete;

  /// To be called once, while no other thread runs. Returns 0 or a negated
  /// errno code; reports its failures. No IIO in this machine's kernel is no
  /// failure.
  int Open();

  /// Null if there is no IIO here.
  iio_context* get() const { return context_; }

  /// Whether the devices are reached by a daemon.
  bool IsRemote() const { return is_remote_; }

  /// To be called before something is captured that has a sample only every so
  /// many seconds. Not by two threads at a time.
  void AllowPeriod(double seconds);

 private:
  iio_context* context_ = nullptr;
  bool is_remote_ = false;
  unsigned timeout_ms_ = 5000;
  FILE* standard_error_ = nullptr;  // as it was found, if it was replaced
};

}  // namespace platform

#endif  // PLATFORM_IIO_CONTEXT_H_
