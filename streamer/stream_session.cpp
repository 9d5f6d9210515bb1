#include <pthread.h>
#include <utils/SystemClock.h>

#include <cerrno>
#include <chrono>
#include <cmath>
#include <limits>
#include <mutex>
#include <thread>

#include "streamer/sensor_streamer.h"

namespace {

// Written by sig_handler alone, on the main thread; never cleared.
std::atomic<bool> signal_received = false;
static_assert(std::atomic<bool>::is_always_lock_free);

// One spelling of "not a number" on every architecture: which sign the bit
// pattern of a NaN gets differs between them.
double printable(double value) {
  return std::isnan(value) ? std::numeric_limits<double>::quiet_NaN() : value;
}

}  // namespace

void sig_handler(int /*signal_number*/) { signal_received = true; }

sigset_t stop_signals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGHUP);
  return signals;
}

int SensorStreamer::Stream() {
  if (sensors_.empty()) {
    vesk::log(vesk::kError, "No sensors were found for the given datatypes");
    return -ENOENT;
  }
  std::vector<std::string> config_requests;
  std::vector<std::string> disable_requests;
  BuildRequests(&config_requests, &disable_requests);

  connection_->RegisterClient(this);
  const int64_t start_ns = android::elapsedRealtimeNano();
  int result = 0;
  if (time_limit_ != 0) {
    result = WaitForTime(config_requests);
  } else if (has_sample_limit_) {
    result = WaitForCount(config_requests);
  } else {
    result = WaitForSignal(config_requests);
  }
  // Some of the sensors may run even when not all could be enabled.
  SendRequests(disable_requests, nullptr);
  // From here on no delivery is running, and sensors_ is this thread's again.
  connection_->UnregisterClient(this);
  const int64_t elapsed_ns = android::elapsedRealtimeNano() - start_ns;
  TurnSumsIntoMeans();
  PrintSummary(static_cast<float>(elapsed_ns) / 1e9f);
  return result;
}

void SensorStreamer::BuildRequests(std::vector<std::string>* config_requests,
                                   std::vector<std::string>* disable_requests) {
  for (const auto& [uid, config] : sensors_) {
    vesk::say("Sampling from sensor type %s.%c: %s.\n", config.datatype.c_str(),
              config.stream_type_char, config.display_name.c_str());
    vesk::log(vesk::kDebug, "%s.%c -n%u -r%.1f", config.datatype.c_str(),
              config.stream_type_char, config.sample_limit,
              static_cast<double>(config.sample_rate));
    const bool streaming = config.stream_type == SNS_STREAM_TYPE_STREAMING;
    config_requests->push_back(MakeConfigRequest(
        uid, streaming ? config.sample_rate : -1, config.passive));
    disable_requests->push_back(MakeDisableRequest(uid));
  }
}

int SensorStreamer::WaitForTime(
    const std::vector<std::string>& config_requests) {
  pthread_t forwarder;
  const bool forwards = has_sample_limit_ && StartForwarder(&forwarder);
  const std::chrono::duration<int64_t> limit(time_limit_);
  const int result = SendRequestsAndWait(config_requests, limit, nullptr);
  timed_wait_over_ = true;
  limit_reached_ = true;
  limit_reached_.notify_all();
  if (forwards) pthread_join(forwarder, nullptr);
  return result == -ETIMEDOUT ? 0 : result;
}

// Starts the thread of ForwardLimit; without it OnEvent's own notification
// still ends the wait, if not now, then at a later sample.
bool SensorStreamer::StartForwarder(pthread_t* thread) {
  const auto forward = [](void* self) -> void* {
    static_cast<SensorStreamer*>(self)->ForwardLimit();
    return nullptr;
  };
  const sigset_t signals = stop_signals();
  sigset_t previous;
  pthread_sigmask(SIG_BLOCK, &signals, &previous);
  const bool started = pthread_create(thread, nullptr, forward, this) == 0;
  pthread_sigmask(SIG_SETMASK, &previous, nullptr);
  if (!started) {
    vesk::log(vesk::kWarning,
              "Unable to start a thread; "
              "the sample limit may end the session late");
  }
  return started;
}

// Runs on a thread of its own beside a timed wait, which has no condition that
// it checks before it sleeps: a limit that is reached while the requests are
// being sent would wake nobody. mutex_ can be had only while the main thread
// is not sending, so that a notification behind it finds the main thread
// waiting, unless it has not locked mutex_ yet; hence the loop.
void SensorStreamer::ForwardLimit() {
  limit_reached_.wait(false);
  while (!timed_wait_over_) {
    { const std::lock_guard<std::mutex> not_sending(mutex_); }
    cv_.notify_all();
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
}

int SensorStreamer::WaitForCount(
    const std::vector<std::string>& config_requests) {
  std::unique_lock<std::mutex> lock(mutex_);
  const int result = SendRequests(config_requests, nullptr);
  lock.unlock();
  // Not on cv_: OnEvent, which may not wait for mutex_, could notify between a
  // check of the limit and the wait. And nothing else ends this wait.
  if (result == 0) limit_reached_.wait(false);
  return result;
}

int SensorStreamer::WaitForSignal(
    const std::vector<std::string>& config_requests) {
  struct sigaction action = {};
  action.sa_handler = sig_handler;
  sigemptyset(&action.sa_mask);
  sigaction(SIGINT, &action, nullptr);
  sigaction(SIGHUP, &action, nullptr);
  const int result = SendRequests(config_requests, nullptr);

  const sigset_t signals = stop_signals();
  sigset_t previous;
  // While both are blocked, none can slip in between the check and the wait.
  pthread_sigmask(SIG_BLOCK, &signals, &previous);
  while (!signal_received) sigsuspend(&previous);
  pthread_sigmask(SIG_UNBLOCK, &signals, nullptr);
  return result;
}

void SensorStreamer::TurnSumsIntoMeans() {
  for (auto& [uid, config] : sensors_) {
    for (double& sum : config.sums) sum /= config.sample_count;
  }
}

void SensorStreamer::PrintSummary(float elapsed_seconds) const {
  if (elapsed_seconds > 0) PrintCounts(elapsed_seconds);
  PrintAverages();
  PrintDeviations();
}

void SensorStreamer::PrintCounts(float elapsed_seconds) const {
  vesk::say("\nTime: %f seconds\n", static_cast<double>(elapsed_seconds));
  for (const auto& [uid, config] : sensors_) {
    vesk::say("%s.%c %u samples", config.datatype.c_str(),
              config.stream_type_char, config.sample_count);
    if (config.stream_type == SNS_STREAM_TYPE_STREAMING) {
      const float rate =
          static_cast<float>(config.sample_count) / elapsed_seconds;
      vesk::say(" @ ~%.1f Hz", static_cast<double>(rate));
      if (config.sample_count >= 2) {
        const int64_t span =
            Elapsed(config.first_timestamp, config.last_timestamp);
        const int64_t periods = config.sample_count - 1;
        vesk::say(", average period = %ld", span / periods);
      }
    }
    vesk::say("\n");
  }
}

void SensorStreamer::PrintAverages() const {
  vesk::say("\nAverage:\n");
  for (const auto& [uid, config] : sensors_) {
    if (config.sample_count == 0) continue;
    vesk::say("%s.%c ", config.datatype.c_str(), config.stream_type_char);
    for (const double mean : config.sums) {
      vesk::say(" %lf", printable(mean));
    }
    vesk::say("\n");
  }
}

// The sample standard deviation of each value position, from its mean and its
// sum of squares.
void SensorStreamer::PrintDeviations() const {
  vesk::say("\nStandard Deviation:\n");
  for (const auto& [uid, config] : sensors_) {
    if (config.sample_count < 2) continue;
    vesk::say("%s.%c ", config.datatype.c_str(), config.stream_type_char);
    const double n = config.sample_count;
    const double n_minus_1 = config.sample_count - 1;
    for (size_t i = 0; i < config.sums_of_squares.size(); ++i) {
      const double mean = config.sums[i];
      const double variance =
          (config.sums_of_squares[i] - mean * mean * n) / n_minus_1;
      // Rounding may take the variance of equal values below zero.
      const double deviation = variance < 0 ? 0 : std::sqrt(variance);
      vesk::say(" %lf", printable(deviation));
    }
    vesk::say("\n");
  }
}
