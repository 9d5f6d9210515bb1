#include "platform/virtual/virtual_hub.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <utility>

#include "hub/vesk.h"

namespace platform {
namespace {

// The value of an attribute if it is there and of type T, else `fallback`.
template <typename T>
T attribute_or(const Attributes& attributes, sns_std_attr_id id, T fallback) {
  const auto found = attributes.find(id);
  if (found == attributes.end()) return fallback;
  const T* value = std::get_if<T>(&found->second);
  return value != nullptr ? *value : fallback;
}

// Rates at which nothing can run are ignored.
bool is_rate(float rate) {
  return rate > 0 && rate <= static_cast<float>(kTicksPerSecond);
}

std::vector<float> rates_of(const VirtualSensor& sensor) {
  std::vector<float> rates = attribute_or<std::vector<float>>(
      sensor.attributes, SNS_ATTR_RATES, {sensor.native_rate});
  std::erase_if(rates, [](float rate) { return !is_rate(rate); });
  std::sort(rates.begin(), rates.end());
  return rates;
}

}  // namespace

VirtualSetup& virtual_setup() {
  static VirtualSetup instance;
  return instance;
}

int open_hub(std::unique_ptr<Hub>* hub) {
  const VirtualSetup& setup = virtual_setup();
  *hub = std::make_unique<VirtualHub>(
      setup.model ? *setup.model : default_hub(), setup.clock);
  return 0;
}

// The middle of the nanosecond, so that seconds * 1e9 truncates to just this
// one again, rounded twice, for weeks.
double ticks_to_seconds(uint64_t ticks) {
  constexpr double kNanosecondsPerTick = 1e9 / kTicksPerSecond;
  return (static_cast<double>(ticks) * kNanosecondsPerTick + 0.5) / 1e9;
}

VirtualHub::VirtualHub(HubModel model, HubClock* clock)
    : clock_(clock != nullptr ? clock : &real_clock_) {
  for (VirtualSensor& sensor : model) {
    const long type = attribute_or<long>(
        sensor.attributes, SNS_ATTR_STREAM_TYPE, SNS_STREAM_TYPE_STREAMING);
    const long fifo_size =
        attribute_or<long>(sensor.attributes, SNS_ATTR_FIFO_SIZE, 1);
    const auto rates = rates_of(sensor);
    sensors_.push_back({std::move(sensor),
                        static_cast<sns_std_sensor_stream_type>(type), rates,
                        static_cast<size_t>(std::max(fifo_size, 1L))});
    Sensor* added = &sensors_.back();
    by_uid_[added->model.uid] = added;
    by_datatype_[added->model.datatype].push_back(added);
    Reconfigure(added, 0);
  }
}

int VirtualHub::LookUp(const std::string& datatype, sns_suid_event* found) {
  const Lock lock(mutex_);
  if (!link_up_) return -ENOTCONN;
  const auto add = [&](const Sensor& sensor) {
    sns_std_suid* suid = found->add_suids();
    suid->set_suid_low(sensor.model.uid.low);
    suid->set_suid_high(sensor.model.uid.high);
  };
  const auto of_datatype = by_datatype_.find(datatype);
  if (datatype.empty()) {
    for (const Sensor& sensor : sensors_) add(sensor);
  } else if (of_datatype != by_datatype_.end()) {
    for (const Sensor* sensor : of_datatype->second) add(*sensor);
  }
  return 0;
}

int VirtualHub::LoadAttributes(const vesk::SensorUid& uid,
                               sns_std_attr_event* attrs) {
  const Lock lock(mutex_);
  if (!link_up_) return -ENOTCONN;
  const auto found = by_uid_.find(uid);
  if (found == by_uid_.end()) return -ENODEV;
  const VirtualSensor& model = found->second->model;
  if (model.load_status == 0) encode_attributes(model.attributes, attrs);
  return model.load_status;
}

Sensor* VirtualHub::Find(const sns_std_suid& suid) {
  const auto found = by_uid_.find({suid.suid_low(), suid.suid_high()});
  return found == by_uid_.end() ? nullptr : found->second;
}

std::vector<Stream>::iterator VirtualHub::FindStream(Client client,
                                                     const Sensor* sensor) {
  return std::find_if(streams_.begin(), streams_.end(), [&](const Stream& s) {
    return s.client == client && s.sensor == sensor;
  });
}

int VirtualHub::Request(Client client,
                        const std::vector<sns_client_request_msg>& requests,
                        size_t* done) {
  const Lock lock(mutex_);
  *done = 0;
  if (!link_up_) return -ENOTCONN;
  // At one time: the sensors that are enabled together start together.
  const Ticks now = clock_->Now();
  int status = 0;
  for (const sns_client_request_msg& request : requests) {
    status = CarryOut(client, request, now);
    if (status != 0) break;
    ++*done;
  }
  alarm_.Ring();
  return status;
}

int VirtualHub::CarryOut(Client client, const sns_client_request_msg& request,
                         Ticks now) {
  Sensor* sensor = Find(request.suid());
  if (sensor == nullptr) return -ENODEV;
  if (request.has_config()) {
    return Enable(client, sensor, request.config(), now);
  }
  const auto stream = FindStream(client, sensor);
  if (stream != streams_.end()) streams_.erase(stream);
  Reconfigure(sensor, now);
  return 0;
}

int VirtualHub::Enable(Client client, Sensor* sensor,
                       const sns_std_sensor_config& request, Ticks now) {
  const float rate = request.sample_rate();
  const bool streaming = sensor->stream_type == SNS_STREAM_TYPE_STREAMING;
  const bool can_run =
      std::isfinite(rate) && rate > 0 && !sensor->rates.empty();
  if (streaming && !can_run) {
    const auto name = attribute_or<std::string>(sensor->model.attributes,
                                                SNS_ATTR_DISPLAY_NAME,
                                                sensor->model.datatype);
    vesk::log(vesk::kError, "%s: rate: %s", name.c_str(),
              std::strerror(EINVAL));
    return -EINVAL;
  }

  auto stream = FindStream(client, sensor);
  if (stream == streams_.end()) {
    stream = streams_.insert(stream, {.client = client, .sensor = sensor});
    if (streaming && sensor->rate > 0) stream->config = sensor->rate;
  } else {
    stream->Collect(now);
  }
  stream->rate = streaming ? rate : 1;
  stream->passive = request.passive();
  stream->Join(now);
  Reconfigure(sensor, now);
  return 0;
}

void VirtualHub::Forget(Client client) {
  const Lock lock(mutex_);
  const Ticks now = clock_->Now();
  std::vector<Sensor*> sensors;
  for (const Stream& stream : streams_) {
    if (stream.client == client) sensors.push_back(stream.sensor);
  }
  std::erase_if(streams_,
                [&](const Stream& stream) { return stream.client == client; });
  for (Sensor* sensor : sensors) Reconfigure(sensor, now);
  alarm_.Ring();
}

// Runs the sensor at the rate that its active requests now call for.
void VirtualHub::Reconfigure(Sensor* sensor, Ticks now) {
  const float resident = sensor->model.resident_rate;
  float wanted = is_rate(resident) ? resident : 0;
  for (const Stream& stream : streams_) {
    if (stream.sensor == sensor && !stream.passive) {
      wanted = std::max(wanted, stream.rate);
    }
  }
  const bool streaming = sensor->stream_type == SNS_STREAM_TYPE_STREAMING;
  float rate = wanted;
  if (streaming && wanted > 0 && !sensor->rates.empty()) {
    const auto at_least =
        std::lower_bound(sensor->rates.begin(), sensor->rates.end(), wanted);
    rate = at_least != sensor->rates.end() ? *at_least : sensor->rates.back();
  }
  if (rate == sensor->rate) return;

  for (Stream& stream : streams_) {
    if (stream.sensor == sensor) stream.Collect(now);
  }
  sensor->rate = rate;
  sensor->started = now;
  for (Stream& stream : streams_) {
    if (stream.sensor != sensor) continue;
    stream.Join(now);
    if (streaming) stream.config = rate;
  }
}

Ticks VirtualHub::NextDue() const {
  Ticks next = kNever;
  for (const Stream& stream : streams_) next = std::min(next, stream.NextDue());
  return next;
}

void VirtualHub::SetLink(bool up) {
  const Lock lock(mutex_);
  if (up == link_up_) return;
  link_up_ = up;
  link_changes_.push_back(up);
  alarm_.Ring();
}

long VirtualHub::sleep_count() {
  const Lock lock(mutex_);
  return sleep_count_;
}

void VirtualHub::Wake() {
  const Lock lock(mutex_);
  woken_ = true;
  alarm_.Ring();
}

void VirtualHub::Wait() {
  Lock lock(mutex_);
  for (;;) {
    const Ticks due = link_up_ ? NextDue() : kNever;
    round_ = clock_->Now();
    if (woken_ || !link_changes_.empty() || due <= round_) break;
    ++sleep_count_;
    clock_->SleepUntil(due, &lock, &alarm_);
  }
  woken_ = false;
}

bool VirtualHub::Take(Delivery* delivery) {
  const Lock lock(mutex_);
  if (!link_changes_.empty()) {
    delivery->kind =
        link_changes_.front() ? Delivery::kHubFound : Delivery::kHubLost;
    link_changes_.pop_front();
    return true;
  }
  auto first = streams_.end();
  Ticks earliest = round_ + 1;
  for (auto stream = streams_.begin(); stream != streams_.end(); ++stream) {
    const Ticks due = stream->NextDue();
    if (due >= earliest) continue;
    first = stream;
    earliest = due;
  }
  if (!link_up_ || first == streams_.end()) return false;
  first->Collect(round_);
  delivery->kind = Delivery::kEvents;
  delivery->client = first->client;
  first->TakeMessage(&encoder_, &delivery->message);
  Sensor* sensor = first->sensor;
  if (sensor->stream_type == SNS_STREAM_TYPE_SINGLE_OUTPUT) {
    streams_.erase(first);  // one event, and it is off
    Reconfigure(sensor, clock_->Now());
  }
  return true;
}

}  // namespace platform
