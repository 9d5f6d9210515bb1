#include <fcntl.h>
#include <signal.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <utility>

#include "platform/iio/iio_hub.h"

// How the sensors of a device are run.

namespace platform {

// A request that changes nothing of what runs interrupts nobody.
int IioHub::Reconcile(Unit* unit) {
  Rates requested;
  Lock lock(mutex_);
  for (const Stream& stream : streams_) {
    const auto& its = unit->sensors;
    if (std::find(its.begin(), its.end(), stream.sensor) == its.end()) continue;
    double& rate = requested[stream.sensor];
    rate = std::max(rate, stream.rate);
  }
  const bool lost = link_ != kFound;
  lock.unlock();
  int status = 0;
  if (requested != unit->requested) {
    Stop(unit);
    unit->requested = requested;
    if (!requested.empty()) status = lost ? -ENOTCONN : Start(unit);
    if (status != 0) Stop(unit);
  }
  lock.lock();
  for (Stream& stream : streams_) {
    if (IsNewRate(stream, unit->running)) {
      TellRate(&stream, unit->running, NewMessage(stream));
    }
  }
  changed_.notify_one();
  return status;
}

int IioHub::Start(Unit* unit) {
  const IioSensor& first = *unit->sensors[0];
  bool has_timestamps = false;
  int status = first.buffered ? PrepareBuffer(*unit, &has_timestamps) : 0;
  Rates running;
  if (status == 0) status = SetRates(*unit, &running);
  if (status != 0) return status;
  double fastest = 0;
  Capture::Sensors sensors;
  for (const auto& [sensor, rate] : running) {
    sensors.push_back(sensor);
    fastest = std::max(fastest, rate);
  }
  // A device of this machine may be silent for as long as it likes; a daemon
  // that is has been lost. It itself waits for half of this.
  const bool is_local =
      std::strcmp(iio_context_get_name(context_), "local") == 0;
  const double period = fastest > 0 ? std::min(1 / fastest, 1e5) : 0;
  const unsigned timeout_ms = 10000 + static_cast<unsigned>(period * 4000);
  (void)iio_context_set_timeout(context_, is_local ? 0 : timeout_ms);
  status = first.buffered
               ? open_buffer(sensors, fastest, has_timestamps, &unit->capture)
               : open_poll(first, fastest, &unit->capture);
  if (status != 0) return status;
  const Lock lock(mutex_);
  unit->running = running;
  return StartThread(unit);
}

int IioHub::StartThread(Unit* unit) {
  const auto run = [](void* self) -> void* {
    Unit* const its = static_cast<Unit*>(self);
    its->hub->Run(its);
    return nullptr;
  };
  sigset_t signals;
  sigset_t previous;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGHUP);
  pthread_sigmask(SIG_BLOCK, &signals, &previous);
  const int error = pthread_create(&unit->thread, nullptr, run, unit);
  pthread_sigmask(SIG_SETMASK, &previous, nullptr);
  unit->has_thread = error == 0;
  return error == 0 ? 0 : report(unit->sensors[0]->device, "thread", -error);
}

// The reading thread. The next block is read while the one before is taken;
// what a slow reader does not take is lost in the kernel.
void IioHub::Run(Unit* unit) {
  pthread_setname_np(pthread_self(), "vesk-iio");
  const Quiet quiet;
  for (;;) {
    const int status = unit->capture->Read();
    Lock lock(mutex_);
    taken_.wait(lock, [&] { return unit->stopping || !unit->handed_over; });
    if (unit->stopping) return;
    if (status != 0) {
      Lose();
      return;
    }
    HandOver(unit);
    lock.unlock();  // or the delivery thread would wake up to wait for it
    changed_.notify_one();
  }
}

// Also what has only half been started.
void IioHub::Stop(Unit* unit) {
  Lock lock(mutex_);
  unit->stopping = true;
  taken_.notify_all();
  const bool lost = link_ != kFound;
  lock.unlock();
  if (unit->has_thread) {
    unit->capture->Cancel();
    pthread_join(unit->thread, nullptr);
    unit->has_thread = false;
  }
  unit->capture.reset();
  unit->requested.clear();
  changes_.Restore(unit->number, context_, lost);
  lock.lock();
  unit->running.clear();
  unit->stopping = false;
  unit->handed_over = false;
}

int IioHub::PrepareBuffer(const Unit& unit, bool* has_timestamps) {
  iio_device* device = unit.sensors[0]->device;
  const auto of_buffer = [device](const char* name) {
    return Attribute{Attribute::kBuffer, device, nullptr, name};
  };
  // libiio would end another process's capture without a word. A daemon does
  // not tell, and shares the capture among its clients.
  std::string enabled;
  const Attribute enable = of_buffer("enable");
  if (enable.Read(&enabled) == 0 && enabled != "0") {
    return enable.Report(-EBUSY);
  }
  for (const char* name : {"enable", "length", "watermark"}) {
    changes_.Keep(unit.number, of_buffer(name));
  }
  for (unsigned i = 0; i < iio_device_get_channels_count(device); ++i) {
    const char* id = iio_channel_get_id(iio_device_get_channel(device, i));
    changes_.Keep(unit.number, {Attribute::kDevice, device, nullptr,
                                std::string("scan_elements/in_") + id + "_en"});
  }
  const auto trigger = find_trigger(device);
  if (!trigger.has_value()) return report(device, "trigger", -ENODEV);
  int status = 0;
  if (*trigger != nullptr) {
    status = changes_.Set(
        unit.number,
        {Attribute::kTrigger, device, nullptr, "trigger/current_trigger"},
        iio_device_get_id(*trigger));
  }
  Attribute clock;
  *has_timestamps =
      find_attribute(device, nullptr, "current_timestamp_clock", &clock);
  if (status != 0 || !*has_timestamps) return status;
  return changes_.Set(unit.number, clock, "boottime");
}

int IioHub::SetRates(const Unit& unit, Rates* running) {
  // The highest request at an attribute counts.
  std::map<std::string, std::pair<Attribute, double>> settings;
  std::map<const IioSensor*, Attribute> sources;
  for (const auto& [sensor, request] : unit.requested) {
    (*running)[sensor] = sensor->buffered ? 0 : std::min(request, kFastestPoll);
    for (const Attribute& attribute : rate_attributes(*sensor)) {
      // One of the whole device is left to its buffer.
      if (attribute.kind != Attribute::kChannel && !unit.has_device) continue;
      const std::string key =
          iio_device_get_id(attribute.device) + attribute.FileName();
      auto& setting =
          settings.emplace(key, std::pair(attribute, 0.0)).first->second;
      setting.second = std::max(setting.second, request);
      sources.emplace(sensor, attribute);
    }
  }
  for (const auto& [key, setting] : settings) {
    const int status = SetRate(unit, setting.first, setting.second);
    if (status != 0) return status;
  }
  for (auto& [sensor, rate] : *running) {
    const auto source = sources.find(sensor);
    if (!sensor->buffered || source == sources.end()) continue;
    const int status = source->second.ReadNumber(&rate);
    if (status != 0) return status;
  }
  return 0;
}

int IioHub::SetRate(const Unit& unit, const Attribute& attribute,
                    double request) {
  double rate = 0;
  bool is_listed = false;
  double present = 0;
  int status = choose_rate(attribute, request, &rate, &is_listed);
  if (status == 0) status = attribute.ReadNumber(&present);
  if (status != 0 || rate == present) return status;
  if (is_listed) return changes_.Set(unit.number, attribute, to_text(rate));
  // Whether it can be changed is not known before it is tried.
  if (changes_.Keep(unit.number, attribute))
    (void)attribute.Write(to_text(rate));
  return 0;
}

}  // namespace platform
