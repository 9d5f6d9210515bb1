#include "platform/iio/context.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <string_view>

#include "hub/log.h"

namespace platform {
namespace {

sigset_t broken_pipe() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGPIPE);
  return signals;
}

// What stands in for stdio's stderr, to which libiio writes its remarks, a
// line at a time. Everything else goes on to standard error.
ssize_t leave_out_remarks(void* /*cookie*/, const char* text, size_t size) {
  const std::string_view line(text, size);
  for (const char* mark : {"ERROR: ", "WARNING: "}) {
    if (line.starts_with(mark)) return static_cast<ssize_t>(size);
  }
  return write(STDERR_FILENO, text, size);
}

}  // namespace

PipeGuard::PipeGuard() {
  const sigset_t signals = broken_pipe();
  pthread_sigmask(SIG_BLOCK, &signals, &previous_);
}

PipeGuard::~PipeGuard() {
  const sigset_t signals = broken_pipe();
  const timespec at_once = {};
  sigtimedwait(&signals, nullptr, &at_once);
  pthread_sigmask(SIG_SETMASK, &previous_, nullptr);
}

int Context::Open() {
  FILE* const quiet =
      fopencookie(nullptr, "w", {nullptr, leave_out_remarks, nullptr, nullptr});
  if (quiet != nullptr) {
    std::setvbuf(quiet, nullptr, _IONBF, 0);
    standard_error_ = stderr;
    stderr = quiet;
  }
  const PipeGuard guard;
  const char* const remote = std::getenv("IIOD_REMOTE");
  errno = 0;
  context_ = iio_create_default_context();
  if (context_ == nullptr) {
    const int error = errno != 0 ? errno : ENODEV;
    if (remote == nullptr && (error == ENOENT || error == ENODEV)) return 0;
    vesk::log(vesk::kError, "Unable to reach the IIO devices%s%s: %s",
              remote != nullptr ? " of " : "", remote != nullptr ? remote : "",
              std::strerror(error));
    return -error;
  }
  is_remote_ = std::strcmp(iio_context_get_name(context_), "local") != 0;
  (void)iio_context_set_timeout(context_, timeout_ms_);
  return 0;
}

Context::~Context() {
  const PipeGuard guard;
  if (context_ != nullptr) iio_context_destroy(context_);
  if (standard_error_ == nullptr) return;
  std::swap(stderr, standard_error_);
  std::fclose(standard_error_);
}

// A daemon ends a capture that is silent for half of the timeout. It is begun
// anew then, but a sensor may count its period from the beginning.
void Context::AllowPeriod(double seconds) {
  const auto needed_ms = static_cast<unsigned>(std::min(seconds, 1e5) * 4000);
  if (!is_remote_ || needed_ms <= timeout_ms_) return;
  timeout_ms_ = needed_ms;
  (void)iio_context_set_timeout(context_, timeout_ms_);
}

}  // namespace platform
