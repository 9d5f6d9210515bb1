#include <fcntl.h>
#include <linux/uhid.h>
#include <poll.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <initializer_list>
#include <string>
#include <vector>

// A HID device with sensors, as a laptop has one: the kernel's own drivers make
// IIO devices of it. A sensor that they switch on sends a sample whenever its
// interval has passed. The first value of some counts their samples, from 1 on.
// SIGUSR1 makes all sensors silent until the next SIGUSR1; when this program
// ends, the device is unplugged.

namespace {

using Clock = std::chrono::steady_clock;

// What a sensor's driver sets: the feature report, as it is on the wire.
struct [[gnu::packed]] Settings {
  uint8_t reporting = 1;  // numbers of the selectors; kOn switches it on
  uint8_t power = 1;
  uint16_t sensitivity = 0;
  uint32_t interval_ms = 100;

  static constexpr uint8_t kOn = 2;  // all events; full power
};

// The numbers are usages of the HID sensor page.
struct Sensor {
  int type;
  int first_field;
  int exponent;    // of ten, of the values' unit
  bool counts;     // the first value is the number of the sample
  bool is_vector;  // all values are one field
  std::vector<int16_t> values;
  Settings settings = {};
  Clock::time_point due = {};

  bool IsOn() const {
    return settings.reporting == Settings::kOn &&
           settings.power == Settings::kOn;
  }
};

std::vector<Sensor> sensors = {
    // Accelerometer, in g; gyroscope, in degrees per second; light, in lux.
    {0x73, 0x453, -2, true, false, {0, -50, 100}},
    {0x76, 0x457, 0, true, false, {0, 90, -180}},
    {0x41, 0x4d1, 0, true, false, {0}},
    // Compass, in milligauss; orientation; temperature, in degrees Celsius.
    {0x83, 0x485, 0, true, false, {0, 200, -400}},
    {0x8a, 0x483, -2, false, true, {0, 0, 0, 100}},
    {0x33, 0x434, -2, false, false, {2150}},
};

bool silent = false;

void append(std::string* bytes, std::initializer_list<int> values) {
  for (const int value : values) bytes->push_back(static_cast<char>(value));
}

void append_usage(std::string* bytes, int usage) {
  append(bytes, {0x0a, usage & 0xff, usage >> 8});
}

// A feature that is one of six selectors.
void append_selection(std::string* bytes, int usage, int first_selector) {
  append_usage(bytes, usage);
  append(bytes, {0xa1, 0x02, 0x15, 1, 0x25, 6, 0x75, 8, 0x95, 1});
  for (int i = 0; i < 6; ++i) append_usage(bytes, first_selector + i);
  append(bytes, {0xb1, 0x00, 0xc0});
}

std::string report_descriptor() {
  std::string bytes;
  append(&bytes, {0x05, 0x20, 0x09, 0x01, 0xa1, 0x01});  // sensors, together
  for (size_t i = 0; i < sensors.size(); ++i) {
    const Sensor& sensor = sensors[i];
    append(&bytes, {0x85, static_cast<int>(i) + 1});  // the report's number
    append_usage(&bytes, sensor.type);
    append(&bytes, {0xa1, 0x00});
    append_selection(&bytes, 0x316, 0x840);  // reporting state
    append_selection(&bytes, 0x319, 0x850);  // power state
    append_usage(&bytes, 0x30f);             // sensitivity, from 0 on
    append(&bytes, {0x15, 0, 0x26, 0xff, 0x7f, 0x75, 16, 0xb1, 0x02});
    append_usage(&bytes, 0x30e);  // report interval, in ms
    append(&bytes, {0x27, 0xff, 0xff, 0xff, 0x7f, 0x75, 32, 0xb1, 0x02});
    // The values: 16 bits each, with a sign.
    append(&bytes, {0x16, 0x00, 0x80, 0x26, 0xff, 0x7f, 0x75, 16});
    append(&bytes, {0x55, sensor.exponent & 0xf});
    const int count = static_cast<int>(sensor.values.size());
    append(&bytes, {0x95, sensor.is_vector ? count : 1});
    for (int field = 0; field < (sensor.is_vector ? 1 : count); ++field) {
      append_usage(&bytes, sensor.first_field + field);
      append(&bytes, {0x81, 0x02});
    }
    append(&bytes, {0x55, 0, 0x95, 1, 0xc0});
  }
  append(&bytes, {0xc0});
  return bytes;
}

// Copies a report, with its number in front, to `data`; returns its size.
uint16_t fill_report(size_t number, const void* report, size_t size,
                     uint8_t* data) {
  data[0] = static_cast<uint8_t>(number);
  std::memcpy(data + 1, report, size);
  return static_cast<uint16_t>(size + 1);
}

uint16_t fill_values(const Sensor& sensor, uint8_t* data) {
  return fill_report(static_cast<size_t>(&sensor - sensors.data()) + 1,
                     sensor.values.data(),
                     sensor.values.size() * sizeof sensor.values[0], data);
}

void send(int device, const uhid_event& event) {
  if (write(device, &event, sizeof event) == -1) std::perror("/dev/uhid");
}

void create(int device) {
  const std::string descriptor = report_descriptor();
  uhid_event event = {};
  event.type = UHID_CREATE2;
  std::memcpy(event.u.create2.name, "Sensors", sizeof "Sensors");
  event.u.create2.rd_size = static_cast<uint16_t>(descriptor.size());
  event.u.create2.bus = 3;  // USB
  event.u.create2.vendor = 0x1d50;
  event.u.create2.product = 0x5e45;
  descriptor.copy(reinterpret_cast<char*>(event.u.create2.rd_data),
                  descriptor.size());
  send(device, event);
}

void answer_get(int device, const uhid_get_report_req& request) {
  uhid_event event = {};
  event.type = UHID_GET_REPORT_REPLY;
  uhid_get_report_reply_req& reply = event.u.get_report_reply;
  reply.id = request.id;
  const size_t number = request.rnum;
  if (number < 1 || number > sensors.size()) {
    reply.err = EIO;
  } else if (request.rtype == UHID_FEATURE_REPORT) {
    const Settings& settings = sensors[number - 1].settings;
    reply.size = fill_report(number, &settings, sizeof settings, reply.data);
  } else {
    reply.size = fill_values(sensors[number - 1], reply.data);
  }
  send(device, event);
}

void answer_set(int device, const uhid_set_report_req& request) {
  uhid_event event = {};
  event.type = UHID_SET_REPORT_REPLY;
  event.u.set_report_reply.id = request.id;
  const size_t number = request.rnum;
  if (number < 1 || number > sensors.size() ||
      request.size != sizeof(Settings) + 1) {
    event.u.set_report_reply.err = EIO;
  } else {
    Sensor& sensor = sensors[number - 1];
    const bool was_on = sensor.IsOn();
    std::memcpy(&sensor.settings, request.data + 1, sizeof sensor.settings);
    if (sensor.IsOn() && !was_on) {
      if (sensor.counts) sensor.values[0] = 0;
      sensor.due = Clock::now();
    }
  }
  send(device, event);
}

void answer(int device) {
  uhid_event event = {};
  if (read(device, &event, sizeof event) <= 0) return;
  if (event.type == UHID_GET_REPORT) answer_get(device, event.u.get_report);
  if (event.type == UHID_SET_REPORT) answer_set(device, event.u.set_report);
}

// Sends what is due and returns the time until more is, in ms; -1: never.
int send_samples(int device) {
  using std::chrono::milliseconds;
  Clock::time_point next = Clock::time_point::max();
  for (Sensor& sensor : sensors) {
    if (!sensor.IsOn()) continue;
    const milliseconds interval(std::max(sensor.settings.interval_ms, 1U));
    if (sensor.due <= Clock::now()) {
      sensor.due += interval;
      if (!silent) {
        if (sensor.counts) ++sensor.values[0];
        uhid_event event = {};
        event.type = UHID_INPUT2;
        event.u.input2.size = fill_values(sensor, event.u.input2.data);
        send(device, event);
      }
    }
    next = std::min(next, sensor.due);
  }
  if (next == Clock::time_point::max()) return -1;
  const auto left = std::chrono::ceil<milliseconds>(next - Clock::now());
  return std::max(static_cast<int>(left.count()), 0);
}

}  // namespace

int main() {
  const int device = open("/dev/uhid", O_RDWR | O_CLOEXEC);
  if (device == -1) {
    std::perror("/dev/uhid");
    return 1;
  }
  struct sigaction action = {};
  action.sa_handler = [](int) { silent = !silent; };
  sigaction(SIGUSR1, &action, nullptr);
  create(device);
  for (;;) {
    pollfd readable = {device, POLLIN, 0};
    if (poll(&readable, 1, send_samples(device)) > 0) answer(device);
  }
}
