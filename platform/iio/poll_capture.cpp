#include <utils/SystemClock.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <condition_variable>
#include <mutex>

#include "hub/message_ids.h"
#include "platform/iio/attribute.h"
#include "platform/iio/capture.h"

namespace platform {
namespace {

using Clock = std::chrono::steady_clock;
using Seconds = std::chrono::duration<double>;

constexpr Seconds kPatience(4);

// The attribute that holds a channel's value.
Attribute value_attribute(const IioSensor& sensor, iio_channel* channel) {
  const bool raw = iio_channel_find_attr(channel, "raw") != nullptr;
  return {Attribute::kChannel, sensor.device, channel, raw ? "raw" : "input"};
}

// Samples are due on a grid that begins when it is opened; those that come due
// while one is being read or waited for are left out.
class PollCapture final : public Capture {
 public:
  PollCapture(const IioSensor& sensor, float rate)
      : sensor_(sensor), rate_(rate), start_(Clock::now()) {}

  int Open();
  int Read() override;
  int GoOn(int status) override;
  void Cancel() override;
  void AddSamples(const IioSensor& sensor,
                  sns_client_event_msg* message) override;
  std::string Source() const override;

 private:
  struct Value {
    Attribute attribute;
    Scale scale;
  };

  int ReadValues();

  const IioSensor& sensor_;
  const double rate_;
  const Clock::time_point start_;
  std::vector<Value> values_;
  double number_ = 0;   // on the grid, of the sample that is due next
  size_t reading_ = 0;  // the value that is, or was, read
  int reported_ = 0;    // the failure that was reported last
  int64_t read_at_ = 0;
  sns_std_sensor_event sample_;
  std::mutex mutex_;  // guards what follows
  bool cancelled_ = false;
  std::condition_variable cancel_;
};

// Reads once, so that what cannot be read is refused.
int PollCapture::Open() {
  for (iio_channel* channel : sensor_.channels) {
    values_.push_back({value_attribute(sensor_, channel), {}});
    Value& value = values_.back();
    if (value.attribute.name == "raw") {
      const int status = read_scale(sensor_, channel, &value.scale);
      if (status != 0) return status;
    } else {
      value.scale.gain = sensor_.factor;
    }
  }
  const int status = ReadValues();
  number_ = 1;
  return status == 0 ? 0 : report(sensor_.device, Source(), status);
}

int PollCapture::Read() {
  const Clock::time_point now = Clock::now();
  number_ = std::max(number_, std::ceil(Seconds(now - start_).count() * rate_));
  const Seconds left = Seconds(number_ / rate_) - (now - start_);
  {
    std::unique_lock<std::mutex> lock(mutex_);
    const auto wake_up = now + std::chrono::duration_cast<Clock::duration>(
                                   std::min(left, kPatience));
    if (cancel_.wait_until(lock, wake_up, [this] { return cancelled_; })) {
      return -ECANCELED;
    }
  }
  if (left > kPatience) return kNothingYet;
  ++number_;
  return ReadValues();
}

int PollCapture::ReadValues() {
  sample_.Clear();
  sample_.set_status(SNS_SAMPLE_STATUS_HIGH);
  read_at_ = android::elapsedRealtimeNano();
  std::vector<double> numbers;
  for (reading_ = 0; reading_ < values_.size(); ++reading_) {
    const Value& value = values_[reading_];
    const int status = value.attribute.ReadNumbers(&numbers);
    if (status != 0) return status;
    for (const double x : numbers) sample_.add_data(value.scale.Apply(x));
  }
  return 0;
}

// A sample that cannot be read is left out.
int PollCapture::GoOn(int status) {
  if (status != kNothingYet && status != reported_) {
    reported_ = report(sensor_.device, Source(), status);
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
  add_sample(read_at_, sample_, message);
}

std::string PollCapture::Source() const {
  return values_[std::min(reading_, values_.size() - 1)].attribute.FileName();
}

}  // namespace

int open_poll(const IioSensor& sensor, float rate,
              std::unique_ptr<Capture>* capture) {
  auto opened = std::make_unique<PollCapture>(sensor, rate);
  const int status = opened->Open();
  if (status == 0) *capture = std::move(opened);
  return status;
}

void add_sample(int64_t timestamp, const sns_std_sensor_event& values,
                sns_client_event_msg* message) {
  sns_client_event* event = message->add_events();
  event->set_msg_id(vesk::kSensorEvent);
  event->set_timestamp(static_cast<uint64_t>(timestamp));
  values.SerializeToString(event->mutable_payload());
}

int read_scale(const IioSensor& sensor, iio_channel* channel, Scale* scale) {
  for (const auto& [name, number] : {std::pair("offset", &scale->offset),
                                     std::pair("scale", &scale->gain)}) {
    const auto attribute = find_attribute(sensor.device, channel, name);
    if (!attribute.has_value()) continue;
    const int status = attribute->ReadNumber(number);
    if (status != 0) return attribute->Report(status);
  }
  scale->gain *= sensor.factor;
  return 0;
}

}  // namespace platform
