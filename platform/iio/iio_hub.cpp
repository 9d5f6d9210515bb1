#include "platform/iio/iio_hub.h"

#include <utils/SystemClock.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <utility>

#include "hub/vesk.h"

namespace platform {
namespace {

vesk::SensorUid uid_of(const sns_std_suid& suid) {
  return {suid.suid_low(), suid.suid_high()};
}

}  // namespace

int open_hub(std::unique_ptr<Hub>* hub) {
  auto opened = std::make_unique<IioHub>();
  const int status = opened->Open();
  *hub = std::move(opened);
  return status;
}

// The middle of the nanosecond, so that seconds * 1e9 truncates to just this
// one again, rounded twice, for weeks.
double ticks_to_seconds(uint64_t ticks) {
  return (static_cast<double>(ticks) + 0.5) / 1e9;
}

int IioHub::Open() {
  int status = changes_.Open();
  const Quiet quiet;
  if (status == 0) {
    errno = 0;
    context_ = iio_create_default_context();
    if (context_ == nullptr) status = errno != 0 ? -errno : -ENODEV;
  }
  if (status != 0) {
    const char* remote = std::getenv("IIOD_REMOTE");
    vesk::log(vesk::kError, "Unable to reach the IIO devices%s%s: %s",
              remote != nullptr ? " of " : "", remote != nullptr ? remote : "",
              std::strerror(-status));
    return status;
  }
  sensors_ = find_sensors(context_);
  if (sensors_.empty()) {
    vesk::log(vesk::kWarning, "There are no IIO devices with sensors");
  }
  const auto add = [this](const IioSensor& sensor, bool has_device) {
    units_.push_back({.hub = this,
                      .number = static_cast<int>(units_.size()),
                      .sensors = {&sensor},
                      .has_device = has_device});
  };
  std::map<const iio_device*, Unit*> buffers;
  for (const IioSensor& sensor : sensors_) {
    if (!sensor.buffered) continue;
    Unit*& unit = buffers[sensor.device];
    if (unit != nullptr) {
      unit->sensors.push_back(&sensor);
    } else {
      add(sensor, true);
      unit = &units_.back();
    }
  }
  for (const IioSensor& sensor : sensors_) {
    if (!sensor.buffered) add(sensor, buffers.count(sensor.device) == 0);
  }
  return 0;
}

IioHub::~IioHub() {
  const Quiet quiet;
  for (Unit& unit : units_) Stop(&unit);
  if (context_ != nullptr) iio_context_destroy(context_);
}

int IioHub::LookUp(const std::string& datatype, sns_suid_event* found) {
  for (const IioSensor& sensor : sensors_) {
    if (!datatype.empty() && datatype != sensor.datatype) continue;
    sns_std_suid* suid = found->add_suids();
    suid->set_suid_low(sensor.uid.low);
    suid->set_suid_high(sensor.uid.high);
  }
  return 0;
}

const IioSensor* IioHub::Find(const vesk::SensorUid& uid) const {
  const auto found =
      std::find_if(sensors_.begin(), sensors_.end(), [&](const auto& sensor) {
        return sensor.uid.low == uid.low && sensor.uid.high == uid.high;
      });
  return found == sensors_.end() ? nullptr : &*found;
}

int IioHub::LoadAttributes(const vesk::SensorUid& uid,
                           sns_std_attr_event* attrs) {
  const Lock control(control_);
  const Quiet quiet;
  const IioSensor* sensor = Find(uid);
  return sensor == nullptr ? -ENODEV : read_attributes(*sensor, attrs);
}

int IioHub::Request(Client client,
                    const std::vector<sns_client_request_msg>& requests,
                    size_t* done) {
  const Lock control(control_);
  const Quiet quiet;
  Lock lock(mutex_);
  const Streams before = streams_;
  lock.unlock();
  Streams streams = before;
  int status = 0;
  for (*done = 0; *done < requests.size(); ++*done) {
    status = Apply(client, requests[*done], &streams);
    if (status != 0) break;
  }
  const Unit* failed = nullptr;
  const int failure = Settle(streams, &failed);
  if (failure == 0) return status;
  // Back to before the first request that has to do with it.
  streams = before;
  for (*done = 0; *done < requests.size(); ++*done) {
    const IioSensor* sensor = Find(uid_of(requests[*done].suid()));
    const auto& its = failed->sensors;
    if (std::find(its.begin(), its.end(), sensor) != its.end()) break;
    Apply(client, requests[*done], &streams);
  }
  if (Settle(streams, &failed) != 0) {
    lock.lock();
    Lose();
  }
  return failure;
}

int IioHub::Apply(Client client, const sns_client_request_msg& request,
                  Streams* streams) const {
  const IioSensor* sensor = Find(uid_of(request.suid()));
  if (sensor == nullptr) return -ENODEV;
  auto stream =
      std::find_if(streams->begin(), streams->end(), [&](const Stream& other) {
        return other.client == client && other.sensor == sensor;
      });
  if (!request.has_config()) {
    if (stream != streams->end()) streams->erase(stream);
    return 0;
  }
  const double rate = request.config().sample_rate();
  if (request.config().passive()) {
    return report(sensor->device, "passive request", -ENOTSUP);
  }
  if (!std::isfinite(rate) || rate <= 0) {
    return report(sensor->device, "rate", -EINVAL);
  }
  if (stream == streams->end()) {
    stream = streams->insert(stream, {client, sensor, rate});
  }
  stream->rate = rate;
  return 0;
}

void IioHub::Forget(Client client) {
  const Lock control(control_);
  const Quiet quiet;
  Lock lock(mutex_);
  Streams streams = streams_;
  lock.unlock();
  std::erase_if(streams, [&](const Stream& s) { return s.client == client; });
  const Unit* failed = nullptr;
  if (Settle(streams, &failed) == 0) return;
  lock.lock();
  Lose();
}

// Runs what the streams call for, up to the first unit that fails.
int IioHub::Settle(const Streams& streams, const Unit** failed) {
  Lock lock(mutex_);
  streams_ = streams;
  const auto is_unwanted = [this](const Message& message) {
    return std::none_of(streams_.begin(), streams_.end(),
                        [&](const Stream& stream) {
                          return stream.client == message.client &&
                                 stream.sensor == message.sensor;
                        });
  };
  std::erase_if(ready_, is_unwanted);
  std::erase_if(round_, is_unwanted);
  lock.unlock();
  for (Unit& unit : units_) {
    const int status = Reconcile(&unit);
    if (status == 0) continue;
    *failed = &unit;
    return status;
  }
  return 0;
}

bool IioHub::IsNewRate(const Stream& stream, const Rates& running) {
  const auto found = running.find(stream.sensor);
  return found != running.end() && found->second != stream.told;
}

void IioHub::TellRate(Stream* stream, const Rates& running,
                      sns_client_event_msg* message) {
  if (!IsNewRate(*stream, running)) return;
  stream->told = running.at(stream->sensor);
  sns_std_sensor_physical_config_event config;
  config.set_sample_rate(static_cast<float>(stream->told));
  sns_client_event* event = message->add_events();
  event->set_msg_id(vesk::kPhysicalConfigEvent);
  event->set_timestamp(static_cast<uint64_t>(android::elapsedRealtimeNano()));
  config.SerializeToString(event->mutable_payload());
}

// Messages are used again, for their memory.
sns_client_event_msg* IioHub::NewMessage(const Stream& stream) {
  Message& added = ready_.emplace_back();
  added.client = stream.client;
  added.sensor = stream.sensor;
  if (!spare_.empty()) {
    added.message.Swap(&spare_.back());
    spare_.pop_back();
  }
  added.message.clear_events();
  added.message.mutable_suid()->set_suid_low(stream.sensor->uid.low);
  added.message.mutable_suid()->set_suid_high(stream.sensor->uid.high);
  return &added.message;
}

void IioHub::Lose() {
  if (link_ == kFound) link_ = kLost;
  changed_.notify_one();
}

void IioHub::HandOver(Unit* unit) {
  for (Stream& stream : streams_) {
    if (unit->running.count(stream.sensor) == 0) continue;
    sns_client_event_msg* message = NewMessage(stream);
    TellRate(&stream, unit->running, message);
    unit->capture->AddSamples(*stream.sensor, message);
  }
  unit->handed_over = true;
}

void IioHub::Wake() {
  const Lock lock(mutex_);
  woken_ = true;
  changed_.notify_one();
}

void IioHub::Wait() {
  Lock lock(mutex_);
  changed_.wait(lock,
                [this] { return woken_ || link_ == kLost || !ready_.empty(); });
  woken_ = false;
  round_.swap(ready_);
  for (Unit& unit : units_) unit.handed_over = false;
  taken_.notify_all();
}

bool IioHub::Take(Delivery* delivery) {
  const Lock lock(mutex_);
  if (!round_.empty()) {
    delivery->kind = Delivery::kEvents;
    delivery->client = round_.front().client;
    delivery->message.Swap(&round_.front().message);
    spare_.emplace_back().Swap(&round_.front().message);
    round_.pop_front();
    return true;
  }
  if (link_ != kLost) return false;
  link_ = kLossTold;
  delivery->kind = Delivery::kHubLost;
  return true;
}

}  // namespace platform
