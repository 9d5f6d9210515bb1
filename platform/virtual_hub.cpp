#include "platform/virtual_hub.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <utility>

namespace platform {
namespace {

constexpr int kPhysicalConfigId = 768;

// The value of an attribute if it is there and of type T, else `fallback`.
template <typename T>
T attribute_or(const Attributes& attributes, sns_std_attr_id id, T fallback) {
  const auto found = attributes.find(id);
  if (found == attributes.end()) return fallback;
  const T* value = std::get_if<T>(&found->second);
  return value != nullptr ? *value : fallback;
}

std::vector<float> rates_of(const VirtualSensor& sensor) {
  std::vector<float> rates =
      attribute_or<std::vector<float>>(sensor.attributes, SNS_ATTR_RATES, {});
  std::erase_if(rates, [](float rate) { return !(rate > 0); });
  if (rates.empty()) rates = {sensor.native_rate};
  std::sort(rates.begin(), rates.end());
  return rates;
}

}  // namespace

VirtualHub::VirtualHub(HubModel model) {
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

std::string VirtualHub::LookUp(const std::string& datatype) const {
  sns_suid_event event;
  event.set_datatype(datatype);
  const auto add = [&event](const Sensor& sensor) {
    sns_std_suid* suid = event.add_suids();
    suid->set_suid_low(sensor.model.uid.low);
    suid->set_suid_high(sensor.model.uid.high);
  };
  const auto found = by_datatype_.find(datatype);
  if (datatype.empty()) {
    for (const Sensor& sensor : sensors_) add(sensor);
  } else if (found != by_datatype_.end()) {
    for (const Sensor* sensor : found->second) add(*sensor);
  }
  return event.SerializeAsString();
}

int VirtualHub::LoadAttributes(const vesk::SensorUid& uid,
                               std::string* encoded) const {
  const auto found = by_uid_.find(uid);
  if (found == by_uid_.end()) return -ENODEV;
  const VirtualSensor& model = found->second->model;
  if (model.load_status == 0) *encoded = encode_attributes(model.attributes);
  return model.load_status;
}

VirtualHub::Sensor* VirtualHub::Find(const sns_std_suid& suid) {
  const auto found = by_uid_.find({suid.suid_low(), suid.suid_high()});
  return found == by_uid_.end() ? nullptr : found->second;
}

std::vector<VirtualHub::Stream>::iterator VirtualHub::FindStream(
    Client client, const Sensor* sensor) {
  return std::find_if(streams_.begin(), streams_.end(), [&](const Stream& s) {
    return s.client == client && s.sensor == sensor;
  });
}

int VirtualHub::Request(Client client, const std::string& encoded, Ticks now) {
  sns_client_request_msg request;
  if (!request.ParseFromString(encoded)) return -EBADMSG;
  Sensor* sensor = Find(request.suid());
  if (sensor == nullptr) return -ENODEV;
  if (request.has_config()) {
    return Enable(client, sensor, request.config(), now);
  }
  if (!request.has_disable()) return -EBADMSG;
  const auto stream = FindStream(client, sensor);
  if (stream != streams_.end()) streams_.erase(stream);
  Reconfigure(sensor, now);
  return 0;
}

int VirtualHub::Enable(Client client, Sensor* sensor,
                       const sns_std_sensor_config& request, Ticks now) {
  const float rate = request.sample_rate();
  const bool streaming = sensor->stream_type == SNS_STREAM_TYPE_STREAMING;
  if (streaming && !(std::isfinite(rate) && rate > 0)) return -EINVAL;

  auto stream = FindStream(client, sensor);
  if (stream == streams_.end()) {
    stream = streams_.insert(stream, {client, sensor, 0, false, 0, 0, {}, {}});
    if (streaming && sensor->rate > 0) stream->config = sensor->rate;
  } else {
    Collect(&*stream, now);
  }
  stream->rate = streaming ? rate : 1;
  stream->passive = request.passive();
  stream->joined = now;
  stream->next = FirstAfter(*sensor, now);
  Reconfigure(sensor, now);
  return 0;
}

void VirtualHub::Forget(Client client, Ticks now) {
  std::vector<Sensor*> sensors;
  for (const Stream& stream : streams_) {
    if (stream.client == client) sensors.push_back(stream.sensor);
  }
  std::erase_if(streams_,
                [&](const Stream& stream) { return stream.client == client; });
  for (Sensor* sensor : sensors) Reconfigure(sensor, now);
}

// Runs the sensor at the rate that its active requests now call for.
void VirtualHub::Reconfigure(Sensor* sensor, Ticks now) {
  float wanted = sensor->model.resident_rate;
  for (const Stream& stream : streams_) {
    if (stream.sensor == sensor && !stream.passive) {
      wanted = std::max(wanted, stream.rate);
    }
  }
  const bool streaming = sensor->stream_type == SNS_STREAM_TYPE_STREAMING;
  float rate = wanted;
  if (streaming && wanted > 0) {
    const auto at_least =
        std::lower_bound(sensor->rates.begin(), sensor->rates.end(), wanted);
    rate = at_least != sensor->rates.end() ? *at_least : sensor->rates.back();
  }
  if (rate == sensor->rate) return;

  for (Stream& stream : streams_) {
    if (stream.sensor == sensor) Collect(&stream, now);
  }
  sensor->rate = rate;
  sensor->started = now;
  for (Stream& stream : streams_) {
    if (stream.sensor != sensor) continue;
    stream.joined = now;
    stream.next = FirstAfter(*sensor, now);
    if (streaming) stream.config = rate;
  }
}

// When a stream's sample is due. A streaming sensor's samples are numbered
// from its start, on an exact grid; the others' from the enabling, the first
// of which, 0, is the current value.
Ticks VirtualHub::DueAt(const Stream& stream, int64_t number) {
  const Sensor& sensor = *stream.sensor;
  if (!(sensor.rate > 0)) return kNever;
  if (sensor.stream_type == SNS_STREAM_TYPE_STREAMING) {
    const double ticks =
        static_cast<double>(number) * kTicksPerSecond / sensor.rate;
    constexpr double kFarthest = 0x1p62;
    if (!(ticks < kFarthest)) return kNever;
    return sensor.started + std::llround(ticks);
  }
  const Ticks period = to_ticks(sensor.model.change_period);
  if (sensor.stream_type == SNS_STREAM_TYPE_SINGLE_OUTPUT) {
    return number == 0 ? stream.joined + period : kNever;
  }
  return number == 0 ? stream.joined
                     : (stream.joined / period + number) * period;
}

// The number of the first sample that a client gets that joins at `time`.
int64_t VirtualHub::FirstAfter(const Sensor& sensor, Ticks time) {
  if (sensor.stream_type != SNS_STREAM_TYPE_STREAMING) return 0;
  const double periods = static_cast<double>(time - sensor.started) *
                         sensor.rate / kTicksPerSecond;
  return static_cast<int64_t>(periods) + 1;
}

Ticks VirtualHub::NextDue(const Stream& stream) {
  if (stream.config.has_value()) return stream.sensor->started;
  return stream.fifo.empty() ? DueAt(stream, stream.next)
                             : stream.fifo.front().due;
}

Ticks VirtualHub::NextDue() const {
  Ticks next = kNever;
  for (const Stream& stream : streams_) next = std::min(next, NextDue(stream));
  return next;
}

void VirtualHub::Collect(Stream* stream, Ticks now) {
  for (;;) {
    const Ticks due = DueAt(*stream, stream->next);
    if (due > now) return;
    stream->fifo.push_back({due, stream->sensor->started});
    if (stream->fifo.size() > stream->sensor->fifo_size) {
      stream->fifo.pop_front();
    }
    ++stream->next;
  }
}

bool VirtualHub::TakeDue(Ticks due_by, Ticks now, Delivery* delivery) {
  auto first = streams_.end();
  Ticks earliest = due_by + 1;
  for (auto stream = streams_.begin(); stream != streams_.end(); ++stream) {
    const Ticks due = NextDue(*stream);
    if (due >= earliest) continue;
    first = stream;
    earliest = due;
  }
  if (first == streams_.end()) return false;
  Collect(&*first, now);
  delivery->client = first->client;
  TakeMessage(&*first, &delivery->message);
  Sensor* sensor = first->sensor;
  if (sensor->stream_type == SNS_STREAM_TYPE_SINGLE_OUTPUT) {
    streams_.erase(first);  // one event, and it is off
    Reconfigure(sensor, now);
  }
  return true;
}

// What has piled up for a stream, encoded, oldest first.
void VirtualHub::TakeMessage(Stream* stream, std::string* encoded) {
  const Sensor& sensor = *stream->sensor;
  message_.clear_events();
  message_.mutable_suid()->set_suid_low(sensor.model.uid.low);
  message_.mutable_suid()->set_suid_high(sensor.model.uid.high);
  const auto add = [this](int msg_id, Ticks time) {
    sns_client_event* event = message_.add_events();
    event->set_msg_id(msg_id);
    event->set_timestamp(static_cast<uint64_t>(time));
    return event->mutable_payload();
  };
  const auto report_rate = [&] {
    if (!stream->config.has_value()) return;
    sns_std_sensor_physical_config_event config;
    config.set_sample_rate(*stream->config);
    config.SerializeToString(add(kPhysicalConfigId, sensor.started));
    stream->config.reset();
  };
  for (const auto& [due, started] : stream->fifo) {
    if (due > sensor.started) report_rate();
    encode_sample(sensor.model, due, started, add(sensor.model.msg_id, due));
  }
  report_rate();
  stream->fifo.clear();
  message_.SerializeToString(encoded);
}

}  // namespace platform
