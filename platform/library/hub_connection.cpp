#include "platform/library/hub_connection.h"

#include <cerrno>
#include <cstdio>
#include <utility>

#include "platform/library/output.h"
#include "platform/library/probe.h"

namespace platform {
namespace {

// Tells of a request as the hub gets it, and returns the status with which it
// is to fail, or 0.
int note_request(const sns_client_request_msg& request) {
  std::string about =
      vesk::SensorUid{request.suid().suid_low(), request.suid().suid_high()}
          .str();
  if (!request.has_config()) return note_call("Disable", about);
  char rate[32];
  std::snprintf(rate, sizeof rate, " %g Hz",
                static_cast<double>(request.config().sample_rate()));
  return note_call(
      "Enable", about + rate + (request.config().passive() ? " passive" : ""));
}

}  // namespace

int HubConnection::Start() {
  const int status = open_hub(&hub_);
  if (status != 0) return status;
  const auto run = [](void* self) -> void* {
    static_cast<HubConnection*>(self)->RunDeliveries();
    return nullptr;
  };
  const int error = pthread_create(&delivery_thread_, nullptr, run, this);
  started_ = error == 0;
  return -error;
}

HubConnection::~HubConnection() {
  note_call("~Connection");
  if (!registrations_.empty()) {
    note_call("misuse: the connection of a registered client is destroyed");
  }
  if (!started_) return;
  {
    const Lock lock(mutex_);
    stopping_ = true;
  }
  hub_->Wake();
  pthread_join(delivery_thread_, nullptr);
}

void HubConnection::Register(IClient* client) {
  const Lock lock(mutex_);
  ++registrations_[client];
}

void HubConnection::Unregister(IClient* client) {
  Lock requests(requests_);
  Lock lock(mutex_);
  const auto registration = registrations_.find(client);
  if (registration == registrations_.end()) {
    lock.unlock();  // the observer may call the library
    requests.unlock();
    note_call("misuse: UnregisterClient of an unregistered client");
    return;
  }
  if (--registration->second > 0) return;
  registrations_.erase(registration);
  lock.unlock();  // a hub may wait for the delivery thread
  hub_->Forget(client);
  requests.unlock();
  lock.lock();
  const unsigned running = deliveries_;
  if (running % 2 == 0) return;
  // Inside a delivery, waiting for its end would take forever.
  if (pthread_equal(pthread_self(), delivery_thread_)) return;
  returned_.wait(lock, [&] { return deliveries_ != running; });
}

bool HubConnection::IsRegistered(IClient* client) {
  const Lock lock(mutex_);
  return registrations_.count(client) != 0;
}

int HubConnection::Send(IClient* client,
                        const std::vector<std::string>& requests,
                        std::vector<sns_client_resp_msg_v01>* responses) {
  const int fault = note_call("SendRequests");
  if (responses != nullptr) responses->clear();
  if (!IsRegistered(client)) {
    note_call("misuse: SendRequests of an unregistered client");
    return -EPERM;
  }
  int status = 0;
  std::vector<sns_client_request_msg> decoded;
  for (const std::string& request : requests) {
    sns_client_request_msg message;
    const bool is_good =
        message.ParseFromString(request) &&
        message.request_case() != sns_client_request_msg::REQUEST_NOT_SET;
    status = is_good ? note_request(message) : -EBADMSG;
    if (status != 0) break;
    decoded.push_back(std::move(message));
  }
  if (fault != 0) return fault;  // what was asked for has been noted
  // Again, as it might have been unregistered meanwhile.
  const Lock no_unregistration(requests_);
  if (!IsRegistered(client)) return -EPERM;
  size_t done = 0;
  const int hub_status = hub_->Request(client, decoded, &done);
  if (hub_status != 0) status = hub_status;
  if (responses != nullptr) {
    responses->resize(done);
    if (status != 0) responses->emplace_back().set_status(status);
  }
  return status;
}

void HubConnection::RunDeliveries() {
  pthread_setname_np(pthread_self(), "vesk-delivery");
  Lock lock(mutex_);
  while (!stopping_) {
    lock.unlock();
    hub_->Wait();
    lock.lock();
    ++deliveries_;
    // The lines of sensors that sample at the same time go out with one write.
    begin_delivery();
    while (hub_->Take(&delivery_)) Deliver(&lock);
    lock.unlock();  // the reader may be slow
    end_delivery();
    lock.lock();
    ++deliveries_;
    returned_.notify_all();
  }
}

// Calls each client that it concerns with the lock released, if it is still
// registered.
void HubConnection::Deliver(Lock* lock) {
  using Delivery = Hub::Delivery;
  receivers_.clear();
  for (const auto& [client, count] : registrations_) {
    const bool is_news = delivery_.kind != Delivery::kEvents;
    if (is_news || delivery_.client == client) receivers_.push_back(client);
  }
  for (IClient* client : receivers_) {
    if (registrations_.count(client) == 0) continue;
    lock->unlock();
    switch (delivery_.kind) {
      case Delivery::kEvents:
        client->OnEvent(delivery_.message);
        break;
      case Delivery::kHubLost:
        client->OnDisconnect();
        break;
      case Delivery::kHubFound:
        client->OnReconnect();
        break;
    }
    lock->lock();
  }
}

}  // namespace platform
