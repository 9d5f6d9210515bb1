#include "platform/iio/unit.h"

#include <signal.h>

#include <algorithm>
#include <cerrno>
#include <optional>
#include <utility>

#include "platform/iio/attribute.h"
#include "platform/iio/rates.h"

namespace platform {

Unit::Unit(Context* context, Guardian* guardian, Owner* owner, int number,
           Sensors sensors, bool has_device)
    : context_(context),
      owner_(owner),
      sensors_(std::move(sensors)),
      has_device_(has_device),
      changes_(guardian, number) {}

Unit::~Unit() { Stop(); }

int Unit::Run(const Sensors& sensors, float rate) {
  if (sensors == requested_ && (sensors.empty() || rate == requested_rate_)) {
    return 0;
  }
  Stop();
  if (sensors.empty()) return 0;
  if (IsLost()) return -ENOTCONN;
  requested_ = sensors;
  requested_rate_ = rate;
  const int status = Start();
  if (status == 0) return 0;
  if (FindLoss(status) != 0) {
    SetLost();
    owner_->OnLoss();
  }
  Stop();
  return status;
}

int Unit::Start() {
  const IioSensor& first = *requested_[0];
  int status = first.buffered ? PrepareBuffer() : 0;
  float rate = 0;
  if (status == 0) status = SetRates(&rate);
  if (status != 0) return status;
  std::unique_ptr<Capture> capture;
  status = first.buffered ? open_buffer(context_, requested_, rate, &capture)
                          : open_poll(first, rate, &capture);
  if (status != 0) return status;
  {
    const Lock lock(mutex_);
    capture_ = std::move(capture);
    running_rate_ = rate;
  }
  return StartThread();
}

int Unit::StartThread() {
  const auto run = [](void* self) -> void* {
    pthread_setname_np(pthread_self(), "vesk-iio");
    static_cast<Unit*>(self)->ReadBlocks();
    return nullptr;
  };
  sigset_t signals;
  sigset_t previous;
  sigemptyset(&signals);
  for (const int each : {SIGINT, SIGHUP, SIGPIPE}) sigaddset(&signals, each);
  pthread_sigmask(SIG_BLOCK, &signals, &previous);
  const int error = pthread_create(&thread_, nullptr, run, this);
  pthread_sigmask(SIG_SETMASK, &previous, nullptr);
  has_thread_ = error == 0;
  return error == 0 ? 0 : report(sensors_[0]->device, "thread", -error);
}

void Unit::ReadBlocks() {
  for (;;) {
    int status = capture_->Read();
    if (status == 0) {
      HandOver();
      if (IsStopping()) return;
      continue;
    }
    if (IsStopping()) return;
    const int loss = FindLoss(status);
    status = loss != 0 ? loss : capture_->GoOn(status);
    if (status == 0) continue;
    Lose(status);
    return;
  }
}

// Returns when the block has been taken, or when the unit is to stop.
void Unit::HandOver() {
  Lock lock(mutex_);
  has_block_ = true;
  lock.unlock();
  owner_->OnBlock();
  lock.lock();
  released_.wait(lock, [this] { return is_stopping_ || !has_block_; });
}

// What has become of the device after a reading that returned `status`: 0 if it
// is still there.
int Unit::FindLoss(int status) const {
  const IioSensor& sensor = *sensors_[0];
  // To a daemon that does not answer nothing more is said, as each word would
  // have to wait.
  const auto is_cut_off = [this](int failure) {
    return context_->IsRemote() &&
           (failure == -EPIPE || failure == -ECONNRESET);
  };
  if (is_cut_off(status)) return status;
  // Any file of the device will do, best one that does not ask the sensor.
  const Attribute probe =
      find_attribute(sensor.device, nullptr, kTimestampClock)
          .value_or(Attribute{Attribute::kChannel, sensor.device,
                              sensor.channels[0],
                              iio_channel_get_attr(sensor.channels[0], 0)});
  std::string text;
  const int answer = probe.Read(&text);
  if (answer == -ENOENT || answer == -ENODEV) return -ENODEV;
  return is_cut_off(answer) ? answer : 0;
}

void Unit::Lose(int status) {
  if (IsLost() || IsStopping()) return;
  report(sensors_[0]->device,
         capture_ != nullptr ? capture_->Source() : "settings", status);
  SetLost();
  owner_->OnLoss();
}

// Also what has only half been started.
void Unit::Stop() {
  if (has_thread_) {
    Lock lock(mutex_);
    is_stopping_ = true;
    released_.notify_all();
    lock.unlock();
    capture_->Cancel();
    pthread_join(thread_, nullptr);
    has_thread_ = false;
    lock.lock();
    is_stopping_ = false;
  }
  // What is gone is not asked to put back one setting after the other.
  if (changes_.HasBegun() && !IsLost()) {
    const int loss = FindLoss(0);
    if (loss != 0) Lose(loss);
  }
  Lock lock(mutex_);
  std::unique_ptr<Capture> ended = std::move(capture_);
  running_rate_ = 0;
  has_block_ = false;
  is_taken_ = false;
  const bool is_lost = is_lost_;
  lock.unlock();
  ended.reset();
  requested_.clear();
  if (!changes_.HasBegun()) return;
  is_lost ? changes_.GiveUp() : changes_.PutBack();
}

int Unit::PrepareBuffer() {
  iio_device* const device = sensors_[0]->device;
  const auto file = [device](const std::string& name) {
    return Attribute{Attribute::kDevice, device, nullptr, name};
  };
  // What a daemon has of these files is out of sight, and its own matter.
  const Attribute enable = file("buffer/enable");
  int status = changes_.Begin(device, true);
  if (status != 0) return enable.Report(status);
  changes_.Keep(enable);
  std::string enabled;
  // libiio would end another process's capture without a word.
  if (enable.Read(&enabled) == 0 && enabled != "0") {
    return enable.Report(-EBUSY);
  }
  for (unsigned i = 0; i < iio_device_get_channels_count(device); ++i) {
    const iio_channel* channel = iio_device_get_channel(device, i);
    const char* name = iio_channel_get_name(channel);
    changes_.Keep(
        file(std::string("scan_elements/in_") + iio_channel_get_id(channel) +
             (name != nullptr ? std::string("_") + name : "") + "_en"));
  }
  const iio_device* trigger = nullptr;
  if (!find_trigger(device, &trigger)) {
    return report(device, "trigger", -ENODEV);
  }
  if (trigger != nullptr) {
    const Attribute current = trigger_attribute(device);
    status = changes_.Set(current, iio_device_get_id(trigger));
    if (status != 0) return current.Report(status);
  }
  const Attribute clock = file(kTimestampClock);
  status = changes_.Set(clock, "boottime");
  return status == 0 ? 0 : clock.Report(status);
}

// Sets the rate that was requested, and finds the one at which the sensors run
// then, 0 if that is not known.
int Unit::SetRates(float* running) {
  const bool buffered = sensors_[0]->buffered;
  *running = buffered ? 0 : std::min(requested_rate_, kFastestPoll);
  std::vector<Attribute> rates;
  for (const IioSensor* sensor : requested_) {
    for (const Attribute& rate : find_rates(*sensor)) {
      // One of the whole device is left to its buffer.
      const bool is_free = rate.kind == Attribute::kChannel || has_device_;
      if (is_free) rates.push_back(rate);
    }
  }
  if (rates.empty()) return 0;
  // A polled sensor is read as often as was requested all the same, if somebody
  // else has the device.
  if (!buffered && changes_.Begin(sensors_[0]->device, false) != 0) return 0;
  // What cannot be put back is not changed. All are kept before one is changed,
  // since some drivers have one rate behind several files.
  std::erase_if(rates, [this](const Attribute& rate) {
    return changes_.Keep(rate) != 0;
  });
  for (const Attribute& rate : rates) {
    const int status = SetRate(rate);
    if (buffered && status != 0) return rate.Report(status);
    if (status != 0) rate.Report(status, vesk::kWarning);
    double present = 0;
    if (buffered && rate.ReadNumber(&present) == 0) {
      *running = std::max(*running, static_cast<float>(present));
    }
  }
  return 0;
}

int Unit::SetRate(const Attribute& attribute) {
  double present = 0;
  if (attribute.ReadNumber(&present) != 0) return 0;
  Choices choices;
  const auto list = find_choices(attribute);
  if (!list.has_value() || read_choices(*list, &choices) != 0) {
    // Whether it can be changed is not known before it is tried.
    if (static_cast<float>(present) != requested_rate_) {
      (void)attribute.Write(to_text(requested_rate_));
    }
    return 0;
  }
  const double rate = choose_rate(choices, requested_rate_);
  const bool is_set = static_cast<float>(present) == static_cast<float>(rate);
  return is_set ? 0 : attribute.Write(to_text(rate));
}

float Unit::RunningRate() const {
  const Lock lock(mutex_);
  return running_rate_;
}

bool Unit::BeginTaking() {
  const Lock lock(mutex_);
  is_taken_ = has_block_;
  return is_taken_;
}

void Unit::AddSamples(const IioSensor* sensor, sns_client_event_msg* message) {
  const Lock lock(mutex_);
  if (is_taken_) capture_->AddSamples(*sensor, message);
}

void Unit::Release() {
  const Lock lock(mutex_);
  if (!is_taken_) return;
  is_taken_ = false;
  has_block_ = false;
  released_.notify_all();
}

void Unit::SetLost() {
  const Lock lock(mutex_);
  is_lost_ = true;
}

bool Unit::IsLost() const {
  const Lock lock(mutex_);
  return is_lost_;
}

bool Unit::IsStopping() const {
  const Lock lock(mutex_);
  return is_stopping_;
}

}  // namespace platform
