#ifndef PLATFORM_IIO_IIO_HUB_H_
#define PLATFORM_IIO_IIO_HUB_H_

#include <condition_variable>
#include <deque>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "platform/iio/context.h"
#include "platform/iio/guardian.h"
#include "platform/iio/sensors.h"
#include "platform/iio/unit.h"
#include "platform/library/hub.h"

namespace platform {

/// The sensors that libiio's default context has: those of this machine, or of
/// the one that IIOD_REMOTE names. Hub ticks are nanoseconds since the boot of
/// the machine whose clock is read: its own, if a device is captured through
/// its buffer; this one, if a sensor is polled. Every failure is logged once,
/// with its device and attribute.
class IioHub final : public Hub, public Unit::Owner {
 public:
  IioHub() = default;
  ~IioHub() override;

  /// Reaches the devices. To be called once, before the process has another
  /// thread. Returns 0 or a negated errno code.
  int Open();

  int LookUp(const std::string& datatype, sns_suid_event* found) override;
  int LoadAttributes(const vesk::SensorUid& uid,
                     sns_std_attr_event* attrs) override;
  /// -ENOTSUP for a passive request; -ENOTCONN once the device is lost.
  int Request(Client client,
              const std::vector<sns_client_request_msg>& requests,
              size_t* done) override;
  void Forget(Client client) override;
  void Wait() override;
  void Wake() override;
  bool Take(Delivery* delivery) override;

 private:
  using Lock = std::unique_lock<std::mutex>;

  // One sensor's samples for one client that enabled it.
  struct Stream {
    Client client;
    const IioSensor* sensor;
    Unit* unit;
    float rate;           // requested, Hz
    float told = 0;       // the running rate that the client knows of
    bool is_due = false;  // in this round of deliveries
  };
  using Streams = std::vector<Stream>;

  void OnBlock() override;
  void OnLoss() override;

  // With control_ held.
  void MakeUnits();
  const IioSensor* Find(const vesk::SensorUid& uid) const;
  Unit* UnitOf(const IioSensor* sensor);
  int Check(const sns_client_request_msg& request) const;
  void Apply(Client client, const sns_client_request_msg& request,
             Streams* streams);
  int Run(const Streams& streams, const Unit** failed);

  // With mutex_ held.
  void SetStreams(const Streams& streams);
  bool BeginRound();
  static bool HasNews(const Stream& stream);
  static void Fill(Stream* stream, sns_client_event_msg* message);
  void Lose();

  std::mutex control_;  // one change at a time; taken before mutex_
  Guardian guardian_;
  Context context_;
  std::vector<IioSensor> sensors_;                             // never changes
  std::map<const IioSensor*, sns_std_attr_event> attributes_;  // once loaded
  std::deque<Unit> units_;

  std::mutex mutex_;  // guards what follows, briefly; a unit's comes after it
  Streams streams_;   // the list changes with both held
  enum { kFound, kLost, kLossTold } link_ = kFound;
  bool woken_ = false;
  std::condition_variable changed_;  // for Wait
};

}  // namespace platform

#endif  // PLATFORM_IIO_IIO_HUB_H_
