#ifndef DRIVER_OPTIONS_H_
#define DRIVER_OPTIONS_H_

class SensorStreamer;

/// The part of the command line that is still to be read. Element 0 is the
/// program's name or the datatype that was read last.
struct Arguments {
  int count;
  char** vector;
};

/// What the command line asks for once it is read.
enum class Command {
  kExit,    // nothing more; the status is known
  kList,    // the listing that element 0 and the arguments behind it describe
  kStream,  // the session that the streamer was configured for
};

/// Sets the verbosity to each -v before the first datatype, in order. Returns
/// 0, or -EINVAL for a bad level; all other options are left alone.
int apply_verbosity(const Arguments& arguments);

/// Reads the command line from left to right: calls the streamer's setters for
/// the options and AddSensor for the datatypes, shows the usage or the version
/// when asked to, and reports option errors. Sets `*status` for kExit.
Command configure(SensorStreamer* streamer, Arguments* arguments, int* status);

/// Shows the usage text or the version line on standard output.
void show_usage();
void show_version();

#endif  // DRIVER_OPTIONS_H_
