#include <cerrno>
#include <memory>
#include <utility>

#include "hub/vesk.h"
#include "platform/library/hub_connection.h"
#include "platform/library/probe.h"

// The client library's own classes, over whichever hub is linked.

namespace platform {

Probe& probe() {
  static Probe instance;
  return instance;
}

int note_call(const char* function, const std::string& about) {
  Probe& set_up = probe();
  if (set_up.observer == nullptr && set_up.faults.empty()) return 0;
  const std::string call =
      about.empty() ? function : std::string(function) + ' ' + about;
  if (set_up.observer != nullptr) set_up.observer(call);
  int status = 0;
  for (Fault& fault : set_up.faults) {
    if (fault.call != function && fault.call != call) continue;
    ++fault.seen;
    const bool fails = fault.nth == 0 || fault.nth == fault.seen;
    if (fails && status == 0) status = fault.status;
  }
  return status;
}

Hub* hub_of(vesk::Connection* connection) {
  return HubConnection::From(connection)->hub();
}

namespace {

sns_client_request_msg request_for(const vesk::SensorUid& suid) {
  sns_client_request_msg request;
  request.mutable_suid()->set_suid_low(suid.low);
  request.mutable_suid()->set_suid_high(suid.high);
  return request;
}

}  // namespace
}  // namespace platform

namespace vesk {

using platform::HubConnection;
using platform::note_call;

int Connection::Create(std::unique_ptr<Connection>* connection) {
  const int status = note_call("Create");
  auto created = std::make_unique<HubConnection>();
  const int started = created->Start();
  // Also when it fails: a caller has to cope with either.
  *connection = std::move(created);
  return status != 0 ? status : started;
}

void Connection::RegisterClient(IClient* client) {
  note_call("RegisterClient");
  HubConnection::From(this)->Register(client);
}

void Connection::UnregisterClient(IClient* client) {
  note_call("UnregisterClient");
  HubConnection::From(this)->Unregister(client);
}

Client::Client(Connection* connection) : connection_(connection), status_(0) {}

void Client::OnReconnect() {
  const std::lock_guard<std::mutex> lock(mutex_);
  status_ = 0;
}

void Client::OnDisconnect() {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    status_ = -ENOTCONN;
  }
  cv_.notify_all();
}

std::string Client::MakeConfigRequest(const SensorUid& suid, float rate,
                                      bool passive) {
  sns_client_request_msg request = platform::request_for(suid);
  request.mutable_config()->set_sample_rate(rate);
  request.mutable_config()->set_passive(passive);
  return request.SerializeAsString();
}

std::string Client::MakeDisableRequest(const SensorUid& suid) {
  sns_client_request_msg request = platform::request_for(suid);
  request.mutable_disable();
  return request.SerializeAsString();
}

int Client::SendRequests(const std::vector<std::string>& requests,
                         std::vector<sns_client_resp_msg_v01>* responses) {
  return HubConnection::From(connection_)->Send(this, requests, responses);
}

// The hub answers the utilities at once, without a delivery.
void AttrUtil::OnEvent(const sns_client_event_msg& /*msg*/) {}
void SuidUtil::OnEvent(const sns_client_event_msg& /*msg*/) {}

int AttrUtil::LoadAttributes(const SensorUid& suid, sns_std_attr_event* attrs) {
  int status = note_call("LoadAttributes", suid.str());
  attr_event_.Clear();
  if (status == 0) {
    status = platform::hub_of(connection_)->LoadAttributes(suid, &attr_event_);
  }
  if (status == 0) attrs->Swap(&attr_event_);
  return status;
}

int SuidUtil::Lookup(const std::string& datatype,
                     std::vector<SensorUid>* suids) {
  int status = note_call("Lookup", datatype);
  suid_event_.Clear();
  if (status == 0) {
    status = platform::hub_of(connection_)->LookUp(datatype, &suid_event_);
  }
  if (status != 0) return status;
  suids->clear();
  for (const sns_std_suid& suid : suid_event_.suids()) {
    suids->push_back({suid.suid_low(), suid.suid_high()});
  }
  return 0;
}

}  // namespace vesk
