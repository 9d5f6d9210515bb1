#include "platform/hub_connection.h"

#include <cerrno>
#include <utility>

#include "platform/output.h"
#include "platform/stand_in.h"

namespace platform {

HubConnection::HubConnection(HubModel model, HubClock* clock)
    : clock_(clock != nullptr ? clock : &real_clock_), hub_(std::move(model)) {}

int HubConnection::Start() {
  const auto run = [](void* self) -> void* {
    static_cast<HubConnection*>(self)->RunDeliveries();
    return nullptr;
  };
  const int error = pthread_create(&delivery_thread_, nullptr, run, this);
  if (error != 0) return -error;
  started_ = true;
  return 0;
}

HubConnection::~HubConnection() {
  if (!started_) return;
  {
    const Lock lock(mutex_);
    stopping_ = true;
  }
  wake_.notify_all();
  pthread_join(delivery_thread_, nullptr);
}

void HubConnection::Register(IClient* client) {
  const Lock lock(mutex_);
  ++registrations_[client];
}

void HubConnection::Unregister(IClient* client) {
  Lock lock(mutex_);
  const auto registration = registrations_.find(client);
  if (registration == registrations_.end()) {
    lock.unlock();  // the observer may call the library
    note_call("misuse: UnregisterClient of an unregistered client");
    return;
  }
  if (--registration->second > 0) return;
  registrations_.erase(registration);
  hub_.Forget(client, clock_->Now());
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
  int status = 0;
  {
    const Lock lock(mutex_);
    if (!link_up_) return -ENOTCONN;
    if (registrations_.count(client) == 0) return -EPERM;
    // At one time: the sensors that are enabled together start together.
    const Ticks now = clock_->Now();
    for (const std::string& request : requests) {
      status = hub_.Request(client, request, now);
      if (responses != nullptr) responses->emplace_back().set_status(status);
      if (status != 0) break;
    }
  }
  wake_.notify_all();
  return status;
}

int HubConnection::LookUp(const std::string& datatype, std::string* encoded) {
  const Lock lock(mutex_);
  if (!link_up_) return -ENOTCONN;
  *encoded = hub_.LookUp(datatype);
  return 0;
}

int HubConnection::LoadAttributes(const vesk::SensorUid& uid,
                                  std::string* encoded) {
  const Lock lock(mutex_);
  if (!link_up_) return -ENOTCONN;
  return hub_.LoadAttributes(uid, encoded);
}

void HubConnection::SetLink(bool up) {
  {
    const Lock lock(mutex_);
    link_up_ = up;
  }
  wake_.notify_all();
}

long HubConnection::sleep_count() {
  const Lock lock(mutex_);
  return sleep_count_;
}

void HubConnection::RunDeliveries() {
  pthread_setname_np(pthread_self(), "vesk-delivery");
  Lock lock(mutex_);
  while (!stopping_) {
    const Ticks due = link_up_ ? hub_.NextDue() : kNever;
    const bool link_changed = link_up_ != link_reported_up_;
    if (!link_changed && due > clock_->Now()) {
      ++sleep_count_;
      clock_->SleepUntil(due, &lock, &wake_);
      continue;
    }
    ++deliveries_;
    if (link_changed) {
      ReportLink(&lock);
    } else {
      DeliverDue(&lock);
    }
    ++deliveries_;
    returned_.notify_all();
  }
}

// Delivers what is due by now, and no more, however long the clients take. The
// lines of sensors that sample at the same time go out with one write.
void HubConnection::DeliverDue(Lock* lock) {
  const Ticks now = clock_->Now();
  begin_delivery();
  while (link_up_ && hub_.TakeDue(now, clock_->Now(), &delivery_)) {
    Deliver(lock);
  }
  lock->unlock();  // the reader may be slow
  end_delivery();
  lock->lock();
}

// Calls a client with the lock released, if it is still registered.
template <typename Call>
void HubConnection::CallClient(IClient* client, Lock* lock, Call call) {
  if (registrations_.count(client) == 0) return;
  lock->unlock();
  call(client);
  lock->lock();
}

void HubConnection::Deliver(Lock* lock) {
  if (!message_.ParseFromString(delivery_.message)) return;
  for (const auto& [client, count] : registrations_) {
    if (client != delivery_.client) continue;
    CallClient(client, lock, [this](IClient* c) { c->OnEvent(message_); });
    return;
  }
}

void HubConnection::ReportLink(Lock* lock) {
  const bool up = link_up_;
  link_reported_up_ = up;
  std::vector<IClient*> clients;
  for (const auto& [client, count] : registrations_) clients.push_back(client);
  for (IClient* client : clients) {
    CallClient(client, lock,
               [up](IClient* c) { up ? c->OnReconnect() : c->OnDisconnect(); });
  }
}

}  // namespace platform
