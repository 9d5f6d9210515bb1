#ifndef LISTER_SENSOR_LISTER_H_
#define LISTER_SENSOR_LISTER_H_

#include <string>

#include "hub/vesk.h"

/// The list command: prints the hub's sensors to standard output through the
/// C library. Everything runs on the thread that owns the connection and
/// blocks while the hub answers. A listing that fails half-way keeps what it
/// has printed.
class SensorLister {
 public:
  /// What List returns besides a status.
  static constexpr int kShowUsage = 1;
  static constexpr int kShowVersion = 2;

  /// `connection` is not owned.
  explicit SensorLister(vesk::Connection* connection)
      : connection_(connection) {}

  /// Carries out the command line from the word `list` (argv[0]) on. opterr is
  /// 0 before the call; optind is reset here. Returns kShowUsage or
  /// kShowVersion when the caller is to show that, -EINVAL after an invalid
  /// option, else 0 or the first nonzero status of the listings.
  int List(int argc, char** argv) const;

  /// Prints the attributes of every sensor that `spec` names, only those with
  /// the endpoint `*type` if that is not null. Returns 0, the status of the
  /// matching, or that of the last attribute list that could not be loaded.
  int ListMatch(const std::string& spec,
                sns_std_sensor_stream_type* type) const;

  /// Prints the overview of the physical sensors: under each name, ascending,
  /// the datatypes with their indices. Sensors whose attributes cannot be read
  /// are left out. Returns 0 or the status of the lookup.
  int ListAll() const;

  /// Prints one sensor's UID and, a line each, the attributes that it has.
  static void PrintAttributes(const vesk::SensorUid& uid,
                              const sns_std_attr_event& attrs);

 private:
  vesk::Connection* connection_;
};

#endif  // LISTER_SENSOR_LISTER_H_
