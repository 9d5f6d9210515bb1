#ifndef STREAMER_SENSOR_STREAMER_H_
#define STREAMER_SENSOR_STREAMER_H_

#include <signal.h>

#include <atomic>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "hub/vesk.h"

/// Notes a signal for the session that runs until one; safe as a handler.
void sig_handler(int signal_number);

/// SIGINT and SIGHUP, which end a session without a limit. Only the main
/// thread has them unblocked.
sigset_t stop_signals();

/// The hub client that a stream run is built around. It is configured with the
/// setters and AddSensor in command-line order, then streams once.
///
/// Threads: everything is called on the main thread but OnEvent, which runs on
/// the library's delivery thread while Stream has the streamer registered.
/// Meanwhile OnEvent alone touches sensors_; before and after, the main thread
/// does. The settings are written before the registration only; OnEvent and
/// Stream read them. A session with a time and a sample limit has a third
/// thread, ForwardLimit's, which Stream starts and joins; it touches neither.
class SensorStreamer : public vesk::Client {
 public:
  /// What a sample consists of.
  using Values = google::protobuf::RepeatedField<float>;

  /// The settings of one sensor and what was counted of its samples.
  struct SensorConfig {
    std::string datatype;      // the specification as it was typed
    std::string display_name;  // the sensor's own name
    bool passive = false;
    uint32_t sample_limit = 0;  // 0: never reached
    float sample_rate = 0;      // Hz; 0: to be chosen
    sns_std_sensor_stream_type stream_type = SNS_STREAM_TYPE_STREAMING;
    char stream_type_char = 's';   // the letter of stream_type in every label
    int64_t first_timestamp = -1;  // ns; negative: no sample yet
    int64_t last_timestamp = -1;   // ns
    uint32_t sample_count = 0;     // samples printed
    // By value position, over the samples printed; always of equal length.
    std::vector<double> sums;
    std::vector<double> sums_of_squares;
  };

  /// `connection` is not owned. The streamer is not registered yet.
  explicit SensorStreamer(vesk::Connection* connection);
  ~SensorStreamer() override;

  // Settings of every datatype that follows, until they are set again.

  /// The endpoint: 's' streaming, 'c' on-change, 'o' one-shot; any other
  /// letter counts as 's'.
  void SetStreamType(char letter);
  /// Hz; 0 or less lets AddSensor choose.
  void SetSampleRate(float rate);
  /// Samples after which a sensor ends the session; 0 never does. Whatever the
  /// number, the session then waits for a limit.
  void SetSampleLimit(uint32_t samples);

  /// A setting of the next datatype that is added successfully.
  void SetPassive();

  // Settings of the whole session; the last call wins.

  /// Samples below this accuracy are dropped.
  void SetMinimumAccuracy(sns_std_sensor_sample_status accuracy);
  void SetShowTimestampDiffs();
  /// Seconds; 0: no limit.
  void SetTimeLimit(uint32_t seconds);

  /// Selects the sensor that `datatype` specifies and records it with the
  /// current settings; a sensor that was recorded before is overwritten.
  /// Returns 0, or the status of the step that failed, with which nothing is
  /// recorded or changed.
  int AddSensor(const std::string& datatype);

  /// Runs the session: enables the sensors, waits for the time limit, a sample
  /// limit or, without either, SIGINT or SIGHUP, disables them and prints the
  /// summary. Returns 0, -ENOENT when no sensor was added, the status with
  /// which the sensors could not be enabled, or, when something other than a
  /// limit ended the wait of a timed session, the library's status_.
  int Stream();

  /// Prints and counts the samples of one delivery. Called by the library on
  /// its delivery thread, with no two calls at a time, from the registration
  /// in Stream until the unregistration there returns. Takes no lock.
  void OnEvent(const sns_client_event_msg& msg) override;

 private:
  float ChooseRate(const sns_std_attr_event& attrs,
                   const std::string& datatype) const;

  void BuildRequests(std::vector<std::string>* config_requests,
                     std::vector<std::string>* disable_requests);
  int WaitForTime(const std::vector<std::string>& config_requests);
  int WaitForCount(const std::vector<std::string>& config_requests);
  int WaitForSignal(const std::vector<std::string>& config_requests);
  bool StartForwarder(pthread_t* thread);
  void ForwardLimit();
  void PrintSummary(float elapsed_seconds) const;
  void PrintCounts(float elapsed_seconds) const;
  void TurnSumsIntoMeans();
  void PrintAverages() const;
  void PrintDeviations() const;

  // The time from one timestamp to another in ns; wraps instead of
  // overflowing, whatever the hub's timestamps are.
  static int64_t Elapsed(int64_t from, int64_t to) {
    return static_cast<int64_t>(static_cast<uint64_t>(to) -
                                static_cast<uint64_t>(from));
  }

  // Prints the line of a sample and returns its time in ns.
  int64_t PrintSample(const sns_client_event& event, const Values& values,
                      const SensorConfig& config) const;

  bool has_sample_limit_ = false;
  sns_std_sensor_sample_status minimum_accuracy_ = SNS_SAMPLE_STATUS_UNRELIABLE;
  bool show_timestamp_diffs_ = false;
  uint32_t time_limit_ = 0;  // seconds; 0: none
  SensorConfig pending_config_;
  std::map<vesk::SensorUid, SensorConfig> sensors_;

  // How a wait learns of a sample limit: OnEvent sets the first one. The end
  // of a timed wait sets both, which ends ForwardLimit.
  std::atomic<bool> limit_reached_ = false;
  std::atomic<bool> timed_wait_over_ = false;
  Values values_;  // OnEvent's, kept for their memory
};

#endif  // STREAMER_SENSOR_STREAMER_H_
