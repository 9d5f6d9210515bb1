#ifndef PLATFORM_IIO_IIO_HUB_H_
#define PLATFORM_IIO_IIO_HUB_H_

#include <iio.h>
#include <pthread.h>

#include <condition_variable>
#include <deque>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/iio/capture.h"
#include "platform/iio/changes.h"
#include "platform/iio/sensors.h"
#include "platform/library/hub.h"

namespace platform {

/// The sensors that libiio's default context has: those of this machine, or of
/// the one that IIOD_REMOTE names. Hub ticks are nanoseconds since its boot.
/// Every failure is logged once, with its device and attribute.
class IioHub final : public Hub {
 public:
  IioHub() = default;
  ~IioHub() override;

  /// Reaches the devices. To be called once, before the process has another
  /// thread. Returns 0 or a negated errno code.
  int Open();

  int LookUp(const std::string& datatype, sns_suid_event* found) override;
  int LoadAttributes(const vesk::SensorUid& uid,
                     sns_std_attr_event* attrs) override;
  /// -ENOTSUP for a passive request; -ENOTCONN once the hub is lost.
  int Request(Client client,
              const std::vector<sns_client_request_msg>& requests,
              size_t* done) override;
  void Forget(Client client) override;
  void Wait() override;
  void Wake() override;
  bool Take(Delivery* delivery) override;

 private:
  using Lock = std::unique_lock<std::mutex>;
  using Rates = std::map<const IioSensor*, double>;  // Hz

  // What starts and stops as one: the sensors in a device's buffer, or one
  // that is polled. Runs a thread that reads.
  struct Unit {
    IioHub* hub;
    int number;
    std::vector<const IioSensor*> sensors;
    bool has_device;  // no other unit of the device has a buffer
    Rates requested = {};
    std::unique_ptr<Capture> capture = nullptr;
    pthread_t thread = {};
    bool has_thread = false;
    // Guarded by mutex_:
    Rates running = {};
    bool stopping = false;
    bool handed_over = false;  // its last block has not been taken
  };

  // One sensor's samples for one client that enabled it.
  struct Stream {
    Client client;
    const IioSensor* sensor;
    double rate;      // requested, Hz
    double told = 0;  // the running rate that the client knows of
  };
  using Streams = std::vector<Stream>;

  struct Message {
    Client client;
    const IioSensor* sensor;
    sns_client_event_msg message;
  };

  // With control_ held.
  const IioSensor* Find(const vesk::SensorUid& uid) const;
  int Apply(Client client, const sns_client_request_msg& request,
            Streams* streams) const;
  int Settle(const Streams& streams, const Unit** failed);
  int Reconcile(Unit* unit);
  int Start(Unit* unit);
  int StartThread(Unit* unit);
  void Stop(Unit* unit);
  int PrepareBuffer(const Unit& unit, bool* has_timestamps);
  int SetRates(const Unit& unit, Rates* running);
  int SetRate(const Unit& unit, const Attribute& attribute, double request);

  void Run(Unit* unit);

  // With mutex_ held.
  void HandOver(Unit* unit);
  static bool IsNewRate(const Stream& stream, const Rates& running);
  static void TellRate(Stream* stream, const Rates& running,
                       sns_client_event_msg* message);
  sns_client_event_msg* NewMessage(const Stream& stream);
  void Lose();

  std::mutex control_;  // one change at a time; taken before mutex_
  iio_context* context_ = nullptr;
  Changes changes_;
  std::vector<IioSensor> sensors_;  // never changes
  std::deque<Unit> units_;          // those with a buffer first

  std::mutex mutex_;  // guards what follows, briefly; reading threads take it
  Streams streams_;   // changes with both held
  std::deque<Message> ready_;  // at most a block of each unit
  std::deque<Message> round_;  // what was ready when Wait returned
  std::vector<sns_client_event_msg> spare_;
  enum { kFound, kLost, kLossTold } link_ = kFound;
  bool woken_ = false;
  std::condition_variable changed_;  // for Wait
  std::condition_variable taken_;    // for the reading threads
};

}  // namespace platform

#endif  // PLATFORM_IIO_IIO_HUB_H_
