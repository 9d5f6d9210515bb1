#include "platform/iio/capture.h"

#include <utils/SystemClock.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <utility>

#include "hub/message_ids.h"

namespace platform {
namespace {

using Clock = std::chrono::steady_clock;

constexpr double kLongestBlock = 0.02;  // seconds
constexpr unsigned kKernelBlocks = 16;  // for a reader that is late

// How a channel's value comes about.
struct Scale {
  double offset;
  double gain;
  float Apply(double raw) const {
    return static_cast<float>((raw + offset) * gain);
  }
};

void add_sample(int64_t timestamp, const sns_std_sensor_event& values,
                sns_client_event_msg* message) {
  sns_client_event* event = message->add_events();
  event->set_msg_id(vesk::kSensorEvent);
  event->set_timestamp(static_cast<uint64_t>(timestamp));
  values.SerializeToString(event->mutable_payload());
}

int read_scales(const IioSensor& sensor, std::vector<Scale>* scales) {
  for (iio_channel* channel : sensor.channels) {
    Scale& scale = scales->emplace_back();
    const int status = read_scale(sensor, channel, &scale.offset, &scale.gain);
    if (status != 0) return status;
  }
  return 0;
}

class BufferCapture final : public Capture {
 public:
  ~BufferCapture() override;

  int Open(const Sensors& sensors, double rate, bool has_timestamps);
  int Read() override;
  void Cancel() override;
  void AddSamples(const IioSensor& sensor,
                  sns_client_event_msg* message) override;

 private:
  struct Column {  // of the block
    const iio_channel* channel;
    const iio_data_format* format;
    Scale scale;
    const char* next;
  };

  static void AddValues(const Column& column, sns_std_sensor_event* values);

  iio_device* device_ = nullptr;
  iio_buffer* buffer_ = nullptr;
  const iio_channel* timestamps_ = nullptr;  // null: not the kernel's
  int64_t read_at_ = 0;
  std::vector<std::pair<const IioSensor*, std::vector<Column>>> columns_;
  std::atomic<bool> cancelled_ = false;
  sns_std_sensor_event values_;  // for its memory
};

BufferCapture::~BufferCapture() {
  if (buffer_ != nullptr) iio_buffer_destroy(buffer_);
  for (const auto& [sensor, columns] : columns_) {
    for (iio_channel* channel : sensor->channels) iio_channel_disable(channel);
  }
}

int BufferCapture::Open(const Sensors& sensors, double rate,
                        bool has_timestamps) {
  device_ = sensors[0]->device;
  for (unsigned i = 0; i < iio_device_get_channels_count(device_); ++i) {
    iio_channel* channel = iio_device_get_channel(device_, i);
    const bool is_wanted = has_timestamps &&
                           iio_channel_is_scan_element(channel) &&
                           iio_channel_get_type(channel) == IIO_TIMESTAMP;
    if (is_wanted) timestamps_ = channel;
    is_wanted ? iio_channel_enable(channel) : iio_channel_disable(channel);
  }
  for (const IioSensor* sensor : sensors) {
    std::vector<Scale> scales;
    const int status = read_scales(*sensor, &scales);
    if (status != 0) return status;
    auto& columns = columns_.emplace_back(sensor, 0).second;
    for (size_t i = 0; i < scales.size(); ++i) {
      iio_channel* channel = sensor->channels[i];
      iio_channel_enable(channel);
      columns.push_back(
          {channel, iio_channel_get_data_format(channel), scales[i], nullptr});
    }
  }
  // Without timestamps a sample has to be read when it comes.
  const double length = has_timestamps ? rate * kLongestBlock : 1;
  const auto samples = static_cast<size_t>(std::clamp(length, 1.0, 1e5));
  // Where it cannot be set the default serves, too.
  (void)iio_device_set_kernel_buffers_count(device_, kKernelBlocks);
  buffer_ = iio_device_create_buffer(device_, samples, false);
  return buffer_ != nullptr ? 0 : report(device_, "buffer", -errno);
}

int BufferCapture::Read() {
  const ssize_t status = iio_buffer_refill(buffer_);
  if (status >= 0) {
    read_at_ = android::elapsedRealtimeNano();
    return 0;
  }
  const int error = static_cast<int>(status);
  return cancelled_ ? error : report(device_, "buffer", error);
}

void BufferCapture::Cancel() {
  cancelled_ = true;
  iio_buffer_cancel(buffer_);
}

void BufferCapture::AddSamples(const IioSensor& sensor,
                               sns_client_event_msg* message) {
  const auto found =
      std::find_if(columns_.begin(), columns_.end(),
                   [&](const auto& entry) { return entry.first == &sensor; });
  if (found == columns_.end()) return;
  const char* timestamp = nullptr;
  if (timestamps_ != nullptr) {
    timestamp =
        static_cast<const char*>(iio_buffer_first(buffer_, timestamps_));
  }
  for (Column& column : found->second) {
    column.next =
        static_cast<const char*>(iio_buffer_first(buffer_, column.channel));
  }
  const char* const end = static_cast<const char*>(iio_buffer_end(buffer_));
  const ptrdiff_t step = iio_buffer_step(buffer_);
  // A scan that the buffer holds in part is none.
  while (found->second[0].next < end) {
    values_.clear_data();
    values_.set_status(SNS_SAMPLE_STATUS_HIGH);
    for (Column& column : found->second) {
      AddValues(column, &values_);
      column.next += step;
    }
    int64_t time = read_at_;
    if (timestamp != nullptr) {
      iio_channel_convert(timestamps_, &time, timestamp);
      timestamp += step;
    }
    add_sample(time, values_, message);
  }
}

// A channel may hold several values, as a quaternion does.
void BufferCapture::AddValues(const Column& column,
                              sns_std_sensor_event* values) {
  std::array<int64_t, 64> integers = {};
  const iio_data_format& format = *column.format;
  const size_t bytes = format.length / 8;
  const size_t count = std::max(format.repeat, 1U);
  if (bytes > 8 || bytes * count > sizeof integers) return;
  iio_channel_convert(column.channel, integers.data(), column.next);
  const char* next = reinterpret_cast<const char*>(integers.data());
  const unsigned unused = 64 - static_cast<unsigned>(bytes) * 8;
  for (size_t i = 0; i < count; ++i, next += bytes) {
    uint64_t bits = 0;
    std::memcpy(&bits, next, bytes);  // the low bytes: ours are little-endian
    bits <<= unused;
    const double raw =
        format.is_signed
            ? static_cast<double>(static_cast<int64_t>(bits) >> unused)
            : static_cast<double>(bits >> unused);
    values->add_data(column.scale.Apply(raw));
  }
}

// Samples are due on a grid that begins when it is opened; those that come due
// while one is being read or waited for are left out.
class PollCapture final : public Capture {
 public:
  PollCapture(const IioSensor& sensor, double rate)
      : sensor_(sensor), rate_(rate), start_(Clock::now()) {}

  int Open();
  int Read() override;
  void Cancel() override;
  void AddSamples(const IioSensor& sensor,
                  sns_client_event_msg* message) override;

 private:
  int ReadValues();

  const IioSensor& sensor_;
  const double rate_;
  const Clock::time_point start_;
  std::vector<Scale> scales_;
  double number_ = 0;  // of the sample on the grid
  int64_t read_at_ = 0;
  sns_std_sensor_event values_;
  std::mutex mutex_;  // guards what follows
  bool cancelled_ = false;
  std::condition_variable cancel_;
};

// Reads once, so that what cannot be read is refused.
int PollCapture::Open() {
  const int status = read_scales(sensor_, &scales_);
  return status != 0 ? status : ReadValues();
}

int PollCapture::Read() {
  const double elapsed =
      std::chrono::duration<double>(Clock::now() - start_).count();
  number_ = std::max(number_ + 1, std::ceil(elapsed * rate_));
  constexpr double kFarthest = 1e9;  // seconds, which the clock can hold
  const auto due =
      start_ +
      std::chrono::duration_cast<Clock::duration>(
          std::chrono::duration<double>(std::min(number_ / rate_, kFarthest)));
  {
    std::unique_lock<std::mutex> lock(mutex_);
    if (cancel_.wait_until(lock, due, [&] { return cancelled_; })) {
      return -ECANCELED;
    }
  }
  return ReadValues();
}

int PollCapture::ReadValues() {
  values_.Clear();
  values_.set_status(SNS_SAMPLE_STATUS_HIGH);
  read_at_ = android::elapsedRealtimeNano();
  std::vector<double> numbers;
  for (size_t i = 0; i < scales_.size(); ++i) {
    const int status =
        value_attribute(sensor_, sensor_.channels[i]).ReadNumbers(&numbers);
    if (status != 0) return status;
    for (const double x : numbers) values_.add_data(scales_[i].Apply(x));
  }
  return 0;
}

void PollCapture::Cancel() {
  const std::lock_guard<std::mutex> lock(mutex_);
  cancelled_ = true;
  cancel_.notify_all();
}

void PollCapture::AddSamples(const IioSensor& /*sensor*/,
                             sns_client_event_msg* message) {
  add_sample(read_at_, values_, message);
}

}  // namespace

int open_buffer(const Capture::Sensors& sensors, double rate,
                bool has_timestamps, std::unique_ptr<Capture>* capture) {
  auto opened = std::make_unique<BufferCapture>();
  const int status = opened->Open(sensors, rate, has_timestamps);
  if (status == 0) *capture = std::move(opened);
  return status;
}

int open_poll(const IioSensor& sensor, double rate,
              std::unique_ptr<Capture>* capture) {
  auto opened = std::make_unique<PollCapture>(sensor, rate);
  const int status = opened->Open();
  if (status == 0) *capture = std::move(opened);
  return status;
}

}  // namespace platform
