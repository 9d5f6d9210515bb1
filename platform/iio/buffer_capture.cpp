#include <algorithm>
#include <array>
#include <cerrno>
#include <cstddef>
#include <cstring>
#include <mutex>
#include <utility>

#include "platform/iio/attribute.h"
#include "platform/iio/capture.h"

namespace platform {
namespace {

constexpr double kLongestBlock = 0.02;  // seconds
constexpr unsigned kKernelBlocks = 16;  // for a reader that is late

class BufferCapture final : public Capture {
 public:
  BufferCapture(const Context& context, iio_device* device)
      : is_remote_(context.IsRemote()), device_(device) {}
  ~BufferCapture() override;

  int Open(const Sensors& sensors, float rate);
  int Read() override;
  int GoOn(int status) override;
  void Cancel() override;
  void AddSamples(const IioSensor& sensor,
                  sns_client_event_msg* message) override;
  std::string Source() const override { return "buffer"; }

 private:
  struct Column {  // of the block
    const iio_channel* channel;
    Scale scale;
    ptrdiff_t offset;  // of the value in a scan
  };

  int OpenBuffer();
  void CloseBuffer();

  const bool is_remote_;
  iio_device* const device_;
  const iio_channel* timestamps_ = nullptr;
  size_t block_size_ = 1;  // samples
  std::vector<std::pair<const IioSensor*, std::vector<Column>>> columns_;
  sns_std_sensor_event values_;  // for its memory
  std::mutex mutex_;             // guards what follows against Cancel
  iio_buffer* buffer_ = nullptr;
  bool cancelled_ = false;
};

BufferCapture::~BufferCapture() {
  CloseBuffer();
  for (unsigned i = 0; i < iio_device_get_channels_count(device_); ++i) {
    iio_channel_disable(iio_device_get_channel(device_, i));
  }
}

int BufferCapture::Open(const Sensors& sensors, float rate) {
  for (unsigned i = 0; i < iio_device_get_channels_count(device_); ++i) {
    iio_channel_disable(iio_device_get_channel(device_, i));
  }
  iio_channel* const timestamps = find_timestamps(device_);
  if (timestamps == nullptr) return report(device_, "timestamp", -ENODEV);
  iio_channel_enable(timestamps);
  timestamps_ = timestamps;
  for (const IioSensor* sensor : sensors) {
    auto& columns = columns_.emplace_back(sensor, 0).second;
    for (iio_channel* channel : sensor->channels) {
      columns.push_back({channel, {}, 0});
      const int status = read_scale(*sensor, channel, &columns.back().scale);
      if (status != 0) return status;
      iio_channel_enable(channel);
    }
  }
  block_size_ = static_cast<size_t>(std::clamp(rate * kLongestBlock, 1.0, 1e5));
  // Where it cannot be set the default serves, too.
  (void)iio_device_set_kernel_buffers_count(device_, kKernelBlocks);
  const int status = OpenBuffer();
  return status == 0 ? 0 : report(device_, Source(), status);
}

int BufferCapture::OpenBuffer() {
  errno = 0;
  iio_buffer* opened = iio_device_create_buffer(device_, block_size_, false);
  if (opened == nullptr) return errno != 0 ? -errno : -EIO;
  const std::lock_guard<std::mutex> lock(mutex_);
  buffer_ = opened;
  if (cancelled_) iio_buffer_cancel(buffer_);
  return 0;
}

void BufferCapture::CloseBuffer() {
  const std::lock_guard<std::mutex> lock(mutex_);
  if (buffer_ != nullptr) iio_buffer_destroy(buffer_);
  buffer_ = nullptr;
}

int BufferCapture::Read() {
  const ssize_t status = iio_buffer_refill(buffer_);
  if (status >= 0) return 0;
  return status == -ETIMEDOUT ? kNothingYet : static_cast<int>(status);
}

// A daemon ends a capture that has been silent for some time.
int BufferCapture::GoOn(int status) {
  if (status != kNothingYet) return status;
  if (!is_remote_) return 0;
  CloseBuffer();
  return OpenBuffer();
}

void BufferCapture::Cancel() {
  const std::lock_guard<std::mutex> lock(mutex_);
  cancelled_ = true;
  if (buffer_ != nullptr) iio_buffer_cancel(buffer_);
}

void BufferCapture::AddSamples(const IioSensor& sensor,
                               sns_client_event_msg* message) {
  const auto found =
      std::find_if(columns_.begin(), columns_.end(),
                   [&](const auto& entry) { return entry.first == &sensor; });
  if (found == columns_.end()) return;
  const char* scan = static_cast<const char*>(iio_buffer_start(buffer_));
  const char* const end = static_cast<const char*>(iio_buffer_end(buffer_));
  const ptrdiff_t size = iio_buffer_step(buffer_);
  const auto find = [&](const iio_channel* channel, ptrdiff_t* offset) {
    const void* const first = iio_buffer_first(buffer_, channel);
    *offset = static_cast<const char*>(first) - scan;
    const iio_data_format* format = iio_channel_get_data_format(channel);
    return *offset >= 0 && *offset + format->length / 8 <= size;
  };
  // What a scan consists of is what a daemon says.
  ptrdiff_t timestamp = 0;
  if (size <= 0 || !find(timestamps_, &timestamp)) return;
  for (Column& column : found->second) {
    if (!find(column.channel, &column.offset)) return;
  }
  values_.set_status(SNS_SAMPLE_STATUS_HIGH);
  for (; end - scan >= size; scan += size) {
    values_.clear_data();
    int64_t time = 0;
    iio_channel_convert(timestamps_, &time, scan + timestamp);
    for (const Column& column : found->second) {
      uint64_t value = 0;
      iio_channel_convert(column.channel, &value, scan + column.offset);
      values_.add_data(column.scale.Apply(converted_value(
          *iio_channel_get_data_format(column.channel), &value)));
    }
    add_sample(time, values_, message);
  }
}

}  // namespace

// libiio leaves the value in the low bytes, whose number is the format's.
double converted_value(const iio_data_format& format, const void* data) {
  const unsigned unused = 64 - format.length;
  uint64_t bits = 0;
  std::memcpy(&bits, data, format.length / 8);  // we are little-endian
  bits <<= unused;
  return format.is_signed
             ? static_cast<double>(static_cast<int64_t>(bits) >> unused)
             : static_cast<double>(bits >> unused);
}

int open_buffer(Context* context, const Capture::Sensors& sensors, float rate,
                std::unique_ptr<Capture>* capture) {
  if (rate > 0) context->AllowPeriod(1 / rate);
  auto opened = std::make_unique<BufferCapture>(*context, sensors[0]->device);
  const int status = opened->Open(sensors, rate);
  if (status == 0) *capture = std::move(opened);
  return status;
}

}  // namespace platform
