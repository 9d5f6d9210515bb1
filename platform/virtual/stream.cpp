#include "platform/virtual/stream.h"

#include <cmath>

namespace platform {

// A streaming sensor's samples are numbered from its start, on an exact grid;
// the others' from the enabling, the first of which, 0, is the current value.
Ticks Stream::DueAt(int64_t number) const {
  if (!(sensor->rate > 0)) return kNever;
  if (sensor->stream_type == SNS_STREAM_TYPE_STREAMING) {
    const double ticks =
        static_cast<double>(number) * kTicksPerSecond / sensor->rate;
    constexpr double kFarthest = 0x1p53;  // eleven years
    if (!(ticks < kFarthest)) return kNever;
    return sensor->started + std::llround(ticks);
  }
  const Ticks period = to_ticks(sensor->model.change_period);
  if (sensor->stream_type == SNS_STREAM_TYPE_SINGLE_OUTPUT) {
    return number == 0 ? joined + period : kNever;
  }
  return number == 0 ? joined : (joined / period + number) * period;
}

void Stream::Join(Ticks now) {
  joined = now;
  next = 0;
  due = DueAt(0);
  if (sensor->stream_type != SNS_STREAM_TYPE_STREAMING) return;
  const double periods = static_cast<double>(now - sensor->started) *
                         sensor->rate / kTicksPerSecond;
  next = static_cast<int64_t>(periods);
  // What is due at this very tick is not after it, however it is rounded.
  while ((due = DueAt(next)) <= now) ++next;
}

Ticks Stream::NextDue() const {
  if (config.has_value()) return sensor->started;
  return fifo.empty() ? due : fifo.front().due;
}

void Stream::Collect(Ticks now) {
  for (; due <= now; due = DueAt(++next)) {
    if (due <= collected_to) continue;
    collected_to = due;
    if (fifo.size() == sensor->fifo_size) fifo.erase(fifo.begin());
    fifo.push_back({due, sensor->started});
  }
}

void Stream::TakeMessage(SampleEncoder* encoder,
                         sns_client_event_msg* message) {
  const VirtualSensor& model = sensor->model;
  message->clear_events();
  message->mutable_suid()->set_suid_low(model.uid.low);
  message->mutable_suid()->set_suid_high(model.uid.high);
  const auto add = [message](int msg_id, Ticks time) {
    sns_client_event* event = message->add_events();
    event->set_msg_id(msg_id);
    event->set_timestamp(static_cast<uint64_t>(time));
    return event->mutable_payload();
  };
  const auto report_rate = [&] {
    if (!config.has_value()) return;
    sns_std_sensor_physical_config_event event;
    event.set_sample_rate(*config);
    event.SerializeToString(add(vesk::kPhysicalConfigEvent, sensor->started));
    config.reset();
  };
  for (const Sample& sample : fifo) {
    if (sample.due > sensor->started) report_rate();
    encoder->Encode(model, sample.due, sample.started,
                    add(model.msg_id, sample.due));
  }
  report_rate();
  fifo.clear();
}

}  // namespace platform
