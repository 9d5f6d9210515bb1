#include <cerrno>
#include <memory>
#include <utility>

#include "hub/vesk.h"
#include "platform/hub_connection.h"
#include "platform/stand_in.h"

// The client library's own classes, over the virtual hub.

namespace platform {

StandIn& stand_in() {
  static StandIn instance;
  return instance;
}

int note_call(const char* function, const std::string& about) {
  StandIn& setup = stand_in();
  if (setup.observer == nullptr && setup.faults.empty()) return 0;
  const std::string call =
      about.empty() ? function : std::string(function) + ' ' + about;
  if (setup.observer != nullptr) setup.observer(call);
  for (Fault& fault : setup.faults) {
    if (fault.call != function && fault.call != call) continue;
    ++fault.seen;
    if (fault.nth == 0 || fault.nth == fault.seen) return fault.status;
  }
  return 0;
}

void set_link(vesk::Connection* connection, bool up) {
  HubConnection::From(connection)->SetLink(up);
}

long sleep_count(vesk::Connection* connection) {
  return HubConnection::From(connection)->sleep_count();
}

namespace {

sns_client_request_msg request_for(const vesk::SensorUid& suid) {
  sns_client_request_msg request;
  request.mutable_suid()->set_suid_low(suid.low);
  request.mutable_suid()->set_suid_high(suid.high);
  return request;
}

// A message of one event with this payload, as the utilities receive answers.
sns_client_event_msg answer_with(std::string payload) {
  sns_client_event_msg message;
  message.add_events()->set_payload(std::move(payload));
  return message;
}

template <typename Answer>
void parse_answer(const sns_client_event_msg& message, Answer* answer) {
  answer->Clear();
  for (const sns_client_event& event : message.events()) {
    if (!answer->ParseFromString(event.payload())) answer->Clear();
  }
}

}  // namespace
}  // namespace platform

namespace vesk {

using platform::HubConnection;
using platform::note_call;

Connection::IClient::~IClient() = default;

Connection::~Connection() { note_call("~Connection"); }

int Connection::Create(std::unique_ptr<Connection>* connection) {
  const int status = note_call("Create");
  const platform::StandIn& setup = platform::stand_in();
  auto created = std::make_unique<HubConnection>(
      setup.model ? *setup.model : platform::default_hub(), setup.clock);
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

Client::~Client() {
  note_call("~Client");
  if (HubConnection::From(connection_)->IsRegistered(this)) {
    note_call("misuse: a registered client is destroyed");
  }
}

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
  if (responses != nullptr) responses->clear();
  const int status = note_call("SendRequests");
  if (status != 0) return status;
  return HubConnection::From(connection_)->Send(this, requests, responses);
}

void AttrUtil::OnEvent(const sns_client_event_msg& msg) {
  platform::parse_answer(msg, &attr_event_);
}

int AttrUtil::LoadAttributes(const SensorUid& suid, sns_std_attr_event* attrs) {
  int status = note_call("LoadAttributes", suid.str());
  std::string encoded;
  if (status == 0) {
    status = HubConnection::From(connection_)->LoadAttributes(suid, &encoded);
  }
  if (status != 0) return status;
  // The hub answers at once, so the answer needs no delivery thread.
  OnEvent(platform::answer_with(std::move(encoded)));
  attrs->Swap(&attr_event_);
  return 0;
}

void SuidUtil::OnEvent(const sns_client_event_msg& msg) {
  platform::parse_answer(msg, &suid_event_);
}

int SuidUtil::Lookup(const std::string& datatype,
                     std::vector<SensorUid>* suids) {
  int status = note_call("Lookup", datatype);
  std::string encoded;
  if (status == 0) {
    status = HubConnection::From(connection_)->LookUp(datatype, &encoded);
  }
  if (status != 0) return status;
  OnEvent(platform::answer_with(std::move(encoded)));
  suids->clear();
  for (const sns_std_suid& suid : suid_event_.suids()) {
    suids->push_back({suid.suid_low(), suid.suid_high()});
  }
  return 0;
}

}  // namespace vesk
