// The smallest whole client library, to begin one's own from: a hub with one
// streaming sensor, "counter", whose samples are 1, 2, 3 and so on from each
// enabling. docs/client-library.md says what a library has to do.

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <thread>

#include "hub/vesk.h"

namespace {

using Clock = std::chrono::steady_clock;
using HubTime = std::chrono::microseconds;  // its tick, from the enabling on
using Lock = std::unique_lock<std::mutex>;

constexpr vesk::SensorUid kCounter = {.low = 1, .high = 0};

// The library's one lock guards all of this. It is not held while the client
// is called. There is one connection, and one client registered at a time; the
// tool makes no more.
std::mutex mutex;
std::condition_variable changed;
int verbosity = vesk::kInfo;
vesk::Connection::IClient* client = nullptr;
int registrations = 0;
HubTime period(0);  // 0: disabled
Clock::time_point enabled;
int samples = 0;
bool delivering = false;
bool stopping = false;

sns_client_event_msg next_message() {
  sns_client_event_msg message;
  message.mutable_suid()->set_suid_low(kCounter.low);
  message.mutable_suid()->set_suid_high(kCounter.high);
  sns_client_event* event = message.add_events();
  event->set_msg_id(vesk::kSensorEvent);
  event->set_timestamp(static_cast<uint64_t>((samples * period).count()));
  sns_std_sensor_event sample;
  sample.add_data(static_cast<float>(++samples));
  sample.set_status(SNS_SAMPLE_STATUS_HIGH);
  event->set_payload(sample.SerializeAsString());
  return message;
}

void run_deliveries() {
  Lock lock(mutex);
  while (!stopping) {
    const Clock::time_point due = enabled + samples * period;
    if (period == HubTime(0)) {
      changed.wait(lock);
    } else if (Clock::now() < due) {
      changed.wait_until(lock, due);
    } else {
      const sns_client_event_msg message = next_message();
      vesk::Connection::IClient* const receiver = client;
      delivering = true;
      lock.unlock();
      receiver->OnEvent(message);
      lock.lock();
      delivering = false;
      changed.notify_all();
    }
  }
}

struct TinyConnection final : vesk::Connection {
  std::thread thread{run_deliveries};
  ~TinyConnection() override {
    {
      const Lock lock(mutex);
      stopping = true;
    }
    changed.notify_all();
    thread.join();
  }
};

// A request is a period in hub time as text; the empty one disables.
int carry_out(const std::string& request) {
  const double wanted = std::strtod(request.c_str(), nullptr);
  if (!request.empty() && !(wanted >= 1e3 && wanted <= 1e6)) return EINVAL;
  period = HubTime(static_cast<int>(wanted));
  enabled = Clock::now();
  samples = 0;
  changed.notify_all();
  return 0;
}

}  // namespace

namespace vesk {

int Connection::Create(std::unique_ptr<Connection>* connection) {
  stopping = false;  // no thread is running yet
  *connection = std::make_unique<TinyConnection>();
  return 0;
}

void Connection::RegisterClient(IClient* registered) {
  const Lock lock(mutex);
  client = registered;
  ++registrations;
}

void Connection::UnregisterClient(IClient*) {
  Lock lock(mutex);
  if (--registrations > 0) return;
  period = HubTime(0);
  changed.notify_all();
  changed.wait(lock, [] { return !delivering; });
}

Client::Client(Connection* connection) : connection_(connection), status_(0) {}
void Client::OnReconnect() {}  // the counter is never lost
void Client::OnDisconnect() {}

std::string Client::MakeConfigRequest(const SensorUid&, float rate, bool) {
  return std::to_string(1e6 / static_cast<double>(rate));
}

std::string Client::MakeDisableRequest(const SensorUid&) { return ""; }

int Client::SendRequests(const std::vector<std::string>& requests,
                         std::vector<sns_client_resp_msg_v01>* responses) {
  const Lock lock(mutex);
  int result = 0;
  for (const std::string& request : requests) {
    const int status = carry_out(request);
    if (responses != nullptr) responses->emplace_back().set_status(status);
    if (result == 0) result = status;
  }
  return result;
}

// The utilities answer at once, without a delivery.
void SuidUtil::OnEvent(const sns_client_event_msg&) {}
void AttrUtil::OnEvent(const sns_client_event_msg&) {}

int SuidUtil::Lookup(const std::string& datatype,
                     std::vector<SensorUid>* suids) {
  if (!datatype.empty() && datatype != "counter") return ENODEV;
  *suids = {kCounter};
  return 0;
}

// What a list holds is between this and the getters. Here any list that is not
// empty is the counter's.
int AttrUtil::LoadAttributes(const SensorUid&, sns_std_attr_event* attrs) {
  attrs->Clear();
  attrs->add_attributes();
  return 0;
}

#define ATTRIBUTE(getter, Out, ...)                     \
  int AttrUtil::getter(const Attrs& attrs, Out value) { \
    if (attrs.attributes_size() == 0) return ENODATA;   \
    *value = __VA_ARGS__;                               \
    return 0;                                           \
  }
ATTRIBUTE(GetDatatype, std::string*, "counter")
ATTRIBUTE(GetName, std::string*, "tiny")
ATTRIBUTE(GetPhysicalSensor, bool*, true)
ATTRIBUTE(GetRates, std::vector<float>*, {50, 100})
ATTRIBUTE(GetStreamType, sns_std_sensor_stream_type*, SNS_STREAM_TYPE_STREAMING)

#define NO_ATTRIBUTE(getter, Out) \
  int AttrUtil::getter(const Attrs&, Out) { return ENODATA; }
NO_ATTRIBUTE(GetVendor, std::string*)
NO_ATTRIBUTE(GetDisplayName, std::string*)
NO_ATTRIBUTE(GetActiveCurrent, std::vector<long>*)
NO_ATTRIBUTE(GetApi, std::vector<std::string>*)
NO_ATTRIBUTE(GetAvailable, bool*)
NO_ATTRIBUTE(GetDri, bool*)
NO_ATTRIBUTE(GetDynamic, bool*)
NO_ATTRIBUTE(GetEventSize, long*)
NO_ATTRIBUTE(GetFifoSize, long*)
NO_ATTRIBUTE(GetSensorIndex, int*)
NO_ATTRIBUTE(GetAdditionalLowLatencyRates, std::vector<float>*)
NO_ATTRIBUTE(GetOpModes, std::vector<std::string>*)
NO_ATTRIBUTE(GetPassiveRequest, bool*)
NO_ATTRIBUTE(GetPhysicalSensorTests, std::vector<long>*)
NO_ATTRIBUTE(GetPlacement, std::vector<float>*)
NO_ATTRIBUTE(GetRanges, std::vector<Range>*)
NO_ATTRIBUTE(GetResolutions, std::vector<float>*)
NO_ATTRIBUTE(GetRigidBody, sns_std_sensor_rigid_body_type*)
NO_ATTRIBUTE(GetSelectedRange, Range*)
NO_ATTRIBUTE(GetSelectedResolution, float*)
NO_ATTRIBUTE(GetSleepCurrent, long*)
NO_ATTRIBUTE(GetStreamSync, bool*)
NO_ATTRIBUTE(GetVersion, long*)

bool openLogFile(const char*) { return false; }
void closeLogFile() {}

void setLogLevel(log_level level) {
  const Lock lock(mutex);
  verbosity = level;
}

void log(log_level level, const char* format, ...) {
  const Lock lock(mutex);
  if (level > verbosity) return;
  va_list args;
  va_start(args, format);
  std::fprintf(stderr, "tiny %d: ", level);
  std::vfprintf(stderr, format, args);
  std::fputc('\n', stderr);
  va_end(args);
}

void logFunc(const char* function, const char* marker) {
  log(kFunction, "%s %s", marker, function);
}

void say(const char* format, ...) {
  va_list args;
  va_start(args, format);
  std::vprintf(format, args);
  va_end(args);
  if (std::strchr(format, '\n') != nullptr) std::fflush(stdout);
}

double ticksToSeconds(unsigned long ticks) {
  return static_cast<double>(ticks) / 1e6;
}

}  // namespace vesk
