#include "platform/iio/iio_hub.h"

#include <utils/SystemClock.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <set>
#include <utility>

#include "hub/vesk.h"
#include "platform/iio/attribute.h"

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
  int status = guardian_.Start();
  if (status != 0) {
    vesk::log(vesk::kError, "Unable to start a guardian: %s",
              std::strerror(-status));
    return status;
  }
  status = context_.Open();
  if (status != 0) return status;
  const PipeGuard guard;
  sensors_ = find_sensors(context_.get());
  if (sensors_.empty()) {
    vesk::log(vesk::kWarning, "There are no IIO devices with sensors");
  }
  MakeUnits();
  return 0;
}

void IioHub::MakeUnits() {
  const auto add = [this](const Unit::Sensors& sensors, bool has_device) {
    const int number = static_cast<int>(units_.size());
    units_.emplace_back(&context_, &guardian_, this, number, sensors,
                        has_device);
  };
  std::set<const iio_device*> captured;
  for (const IioSensor& sensor : sensors_) {
    if (!sensor.buffered || !captured.insert(sensor.device).second) continue;
    Unit::Sensors together;
    for (const IioSensor& other : sensors_) {
      const bool is_with = other.buffered && other.device == sensor.device;
      if (is_with) together.push_back(&other);
    }
    add(together, true);
  }
  for (const IioSensor& sensor : sensors_) {
    if (!sensor.buffered) add({&sensor}, captured.count(sensor.device) == 0);
  }
}

IioHub::~IioHub() {
  const PipeGuard guard;
  units_.clear();
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
  for (const IioSensor& sensor : sensors_) {
    if (sensor.uid.low == uid.low && sensor.uid.high == uid.high) {
      return &sensor;
    }
  }
  return nullptr;
}

Unit* IioHub::UnitOf(const IioSensor* sensor) {
  for (Unit& unit : units_) {
    const auto& its = unit.sensors();
    if (std::find(its.begin(), its.end(), sensor) != its.end()) return &unit;
  }
  return nullptr;
}

int IioHub::LoadAttributes(const vesk::SensorUid& uid,
                           sns_std_attr_event* attrs) {
  const Lock control(control_);
  const PipeGuard guard;
  const IioSensor* sensor = Find(uid);
  if (sensor == nullptr) return -ENODEV;
  // Once, as what cannot be read is told once.
  const auto [entry, is_new] = attributes_.try_emplace(sensor);
  if (is_new) entry->second = read_attributes(*sensor);
  *attrs = entry->second;
  return 0;
}

int IioHub::Request(Client client,
                    const std::vector<sns_client_request_msg>& requests,
                    size_t* done) {
  const Lock control(control_);
  const PipeGuard guard;
  int status = 0;
  for (*done = 0; *done < requests.size(); ++*done) {
    status = Check(requests[*done]);
    if (status != 0) break;
  }
  Lock lock(mutex_);
  const Streams before = streams_;
  lock.unlock();
  for (;;) {
    Streams streams = before;
    for (size_t i = 0; i < *done; ++i) Apply(client, requests[i], &streams);
    const Unit* failed = nullptr;
    const int failure = Run(streams, &failed);
    if (failure == 0) return status;
    status = failure;
    // The first request that has to do with it is the one that failed.
    const auto concerns = [&](const sns_client_request_msg& request) {
      return UnitOf(Find(uid_of(request.suid()))) == failed;
    };
    const auto end = requests.begin() + static_cast<ptrdiff_t>(*done);
    const auto first = std::find_if(requests.begin(), end, concerns);
    if (first == end) {  // what ran before does not run any more
      lock.lock();
      Lose();
      return status;
    }
    *done = static_cast<size_t>(first - requests.begin());
  }
}

int IioHub::Check(const sns_client_request_msg& request) const {
  const IioSensor* sensor = Find(uid_of(request.suid()));
  if (sensor == nullptr) return -ENODEV;
  if (!request.has_config()) return 0;
  if (request.config().passive()) {
    return report(sensor->device, "passive request", -ENOTSUP);
  }
  const float rate = request.config().sample_rate();
  const bool is_good = std::isfinite(rate) && rate > 0;
  return is_good ? 0 : report(sensor->device, "rate", -EINVAL);
}

void IioHub::Apply(Client client, const sns_client_request_msg& request,
                   Streams* streams) {
  const IioSensor* sensor = Find(uid_of(request.suid()));
  auto stream =
      std::find_if(streams->begin(), streams->end(), [&](const Stream& other) {
        return other.client == client && other.sensor == sensor;
      });
  if (!request.has_config()) {
    if (stream != streams->end()) streams->erase(stream);
    return;
  }
  const float rate = request.config().sample_rate();
  if (stream == streams->end()) {
    streams->push_back({client, sensor, UnitOf(sensor), rate});
  } else {
    stream->rate = rate;
  }
}

void IioHub::Forget(Client client) {
  const Lock control(control_);
  const PipeGuard guard;
  Lock lock(mutex_);
  Streams streams = streams_;
  lock.unlock();
  std::erase_if(streams, [&](const Stream& s) { return s.client == client; });
  const Unit* failed = nullptr;
  if (Run(streams, &failed) == 0) return;
  lock.lock();
  Lose();
}

// Runs what the streams call for, up to the first unit that fails.
int IioHub::Run(const Streams& streams, const Unit** failed) {
  Lock lock(mutex_);
  SetStreams(streams);
  lock.unlock();
  for (Unit& unit : units_) {
    Unit::Sensors sensors;
    float rate = 0;
    for (const Stream& stream : streams) {
      if (stream.unit != &unit) continue;
      rate = std::max(rate, stream.rate);
      if (std::find(sensors.begin(), sensors.end(), stream.sensor) ==
          sensors.end()) {
        sensors.push_back(stream.sensor);
      }
    }
    const int status = unit.Run(sensors, rate);
    if (status == 0) continue;
    *failed = &unit;
    return status;
  }
  lock.lock();
  changed_.notify_one();  // somebody may have to hear of a rate
  return 0;
}

// What a client has been told meanwhile, it has been told.
void IioHub::SetStreams(const Streams& streams) {
  Streams next = streams;
  for (Stream& stream : next) {
    for (const Stream& present : streams_) {
      if (present.client != stream.client || present.sensor != stream.sensor) {
        continue;
      }
      stream.told = present.told;
      stream.is_due = present.is_due;
    }
  }
  streams_ = std::move(next);
}

void IioHub::OnBlock() {
  const Lock lock(mutex_);
  changed_.notify_one();
}

// A daemon that is lost is so with all of its devices.
void IioHub::OnLoss() {
  if (context_.IsRemote()) {
    for (Unit& unit : units_) unit.SetLost();
  }
  const Lock lock(mutex_);
  Lose();
}

void IioHub::Lose() {
  if (link_ == kFound) link_ = kLost;
  changed_.notify_one();
}

void IioHub::Wake() {
  const Lock lock(mutex_);
  woken_ = true;
  changed_.notify_one();
}

void IioHub::Wait() {
  Lock lock(mutex_);
  changed_.wait(lock, [this] {
    const bool has_round = BeginRound();
    return has_round || woken_ || link_ == kLost;
  });
  woken_ = false;
}

// False if there is nothing to tell of any stream.
bool IioHub::BeginRound() {
  bool found = false;
  for (Unit& unit : units_) found = unit.BeginTaking() || found;
  for (Stream& stream : streams_) {
    stream.is_due = true;
    found = HasNews(stream) || found;
  }
  return found;
}

bool IioHub::HasNews(const Stream& stream) {
  const float running = stream.unit->RunningRate();
  return running != 0 && running != stream.told;
}

bool IioHub::Take(Delivery* delivery) {
  const Lock lock(mutex_);
  for (Stream& stream : streams_) {
    if (!stream.is_due) continue;
    stream.is_due = false;
    Fill(&stream, &delivery->message);
    if (delivery->message.events().empty()) continue;
    delivery->kind = Delivery::kEvents;
    delivery->client = stream.client;
    return true;
  }
  for (Unit& unit : units_) unit.Release();
  if (link_ != kLost) return false;
  link_ = kLossTold;
  delivery->kind = Delivery::kHubLost;
  return true;
}

void IioHub::Fill(Stream* stream, sns_client_event_msg* message) {
  message->clear_events();  // which keeps their memory
  message->mutable_suid()->set_suid_low(stream->sensor->uid.low);
  message->mutable_suid()->set_suid_high(stream->sensor->uid.high);
  if (HasNews(*stream)) {
    stream->told = stream->unit->RunningRate();
    sns_std_sensor_physical_config_event config;
    config.set_sample_rate(stream->told);
    sns_client_event* event = message->add_events();
    event->set_msg_id(vesk::kPhysicalConfigEvent);
    event->set_timestamp(static_cast<uint64_t>(android::elapsedRealtimeNano()));
    config.SerializeToString(event->mutable_payload());
  }
  stream->unit->AddSamples(stream->sensor, message);
}

}  // namespace platform
