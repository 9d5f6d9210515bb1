#ifndef DRIVER_USAGE_H_
#define DRIVER_USAGE_H_

// The usage text; --help, and an option error on standard error, show it
// followed by an empty line.
inline constexpr char kUsage[] =
    R"(Usage: fennick [list] {[OPTIONS] DATATYPE{.(DATATYPE|INDEX)}}

  Streams samples from the selected sensor(s). Sensors that require package
  disambiguation (e.g., sensor_temperature) may specify a parent datatype
  using a period (e.g., accel.sensor_temperature). If there are multiple
  sensors of a given datatype (e.g., camera_vsync), provide an index after the
  period (e.g., camera_vsync.2).

Commands

  list {[-cos] ...}  With no datatype arguments, this command lists all of the
                     datatypes associated with existing sensors in the system.
                     Otherwise, it displays attributes for each specified
                     datatype.

Options

  --accuracy LEVEL   Only display sensor events at or above the given accuracy
  -a LEVEL           level. The valid range is [0, 3]. Defaults to 0.

  --count SAMPLES    Stop streaming after the given number of samples have
  -n SAMPLES         been collected for any of the subsequent datatypes.

  --diff             Show sample timestamp deltas.
  -d

  --help             Display usage info and exit.
  -h

  --on-change        Select the on-change endpoint of subsequent datatypes, if
  -c                 available. This option is also supported by the 'list'
                     command.

  --one-shot         Select the one-shot endpoint of subsequent datatypes, if
  -o                 available. This option is also supported by the 'list'
                     command.

  --passive          Request the next datatype as a passive client. This flag
  -p                 is not cumulative.

  --rate RATE_HZ     Request samples for subsequent datatypes at the given
  -r RATE_HZ         rate in Hertz.

  --streaming        Select the streaming endpoint of subsequent datatypes, if
  -s                 available. If -c, -o, or -s are not specified, streaming
                     endpoints will be selected by default. This option is
                     also supported by the 'list' command.

  --time SECONDS     Stop streaming after the given number of seconds. If this
  -t SECONDS         option is specified multiple times, only the last one
                     will take effect.

  --verbose LEVEL    Set the output verbosity. Default is 2. If this option is
  -v LEVEL           specified multiple times, only the last one will take
                     effect.

  --version          Display version info and exit.
)";

#endif  // DRIVER_USAGE_H_
