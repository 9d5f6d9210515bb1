#include "driver/options.h"

#include <getopt.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "driver/usage.h"
#include "hub/vesk.h"
#include "streamer/sensor_streamer.h"

namespace {

constexpr char kOptionLetters[] = "+:a:cdhn:opr:st:v:";
constexpr int kVersionOption = 256;
constexpr option kOptions[] = {
    {"accuracy", required_argument, nullptr, 'a'},
    {"count", required_argument, nullptr, 'n'},
    {"diff", no_argument, nullptr, 'd'},
    {"help", no_argument, nullptr, 'h'},
    {"on-change", no_argument, nullptr, 'c'},
    {"one-shot", no_argument, nullptr, 'o'},
    {"passive", no_argument, nullptr, 'p'},
    {"rate", required_argument, nullptr, 'r'},
    {"streaming", no_argument, nullptr, 's'},
    {"time", required_argument, nullptr, 't'},
    {"verbose", required_argument, nullptr, 'v'},
    {"version", no_argument, nullptr, kVersionOption},
    {nullptr, 0, nullptr, 0},
};

constexpr int kMinVerbosity = 1;
constexpr int kMaxVerbosity = 4;
constexpr int kMinAccuracy = 0;
constexpr int kMaxAccuracy = 3;

int next_option(const Arguments& arguments) {
  return getopt_long(arguments.count, arguments.vector, kOptionLetters,
                     kOptions, nullptr);
}

// Reads a whole number in C's notations, of which the low 32 bits count.
bool parse_unsigned(const char* text, unsigned* value) {
  char* end = nullptr;
  errno = 0;
  *value = static_cast<unsigned>(std::strtoul(text, &end, 0));
  return errno == 0 && *end == '\0';
}

bool parse_level(const char* text, int lowest, int highest, unsigned* level) {
  return parse_unsigned(text, level) &&
         *level >= static_cast<unsigned>(lowest) &&
         *level <= static_cast<unsigned>(highest);
}

bool parse_float(const char* text, float* value) {
  char* end = nullptr;
  errno = 0;
  *value = std::strtof(text, &end);
  return errno == 0 && *end == '\0';
}

// The setters of the options that take a value: false, with a message, if the
// value is not a good one.

bool set_minimum_accuracy(SensorStreamer* streamer, const char* text) {
  unsigned level = 0;
  if (!parse_level(text, kMinAccuracy, kMaxAccuracy, &level)) {
    vesk::log(vesk::kError, "Accuracy LEVEL must be in the range [%d, %d]",
              kMinAccuracy, kMaxAccuracy);
    return false;
  }
  streamer->SetMinimumAccuracy(
      static_cast<sns_std_sensor_sample_status>(level));
  return true;
}

bool set_sample_limit(SensorStreamer* streamer, const char* text) {
  unsigned samples = 0;
  if (!parse_unsigned(text, &samples)) {
    vesk::log(vesk::kError, "SAMPLES must be an unsigned integer");
    return false;
  }
  streamer->SetSampleLimit(samples);
  return true;
}

bool set_sample_rate(SensorStreamer* streamer, const char* text) {
  float rate = 0;
  if (!parse_float(text, &rate) || rate < 0) {
    vesk::log(vesk::kError, "RATE must be non-negative");
    return false;
  }
  streamer->SetSampleRate(rate);
  return true;
}

bool set_time_limit(SensorStreamer* streamer, const char* text) {
  unsigned seconds = 0;
  if (!parse_unsigned(text, &seconds) || seconds == 0) {
    vesk::log(vesk::kError, "SECONDS must be a positive integer");
    return false;
  }
  streamer->SetTimeLimit(seconds);
  return true;
}

// Reports an option that getopt_long did not take. `element` is the argument
// that holds it.
int reject(int result, const char* element) {
  vesk::log(vesk::kError,
            result == ':' ? "Missing argument for option '%s'"
                          : "Invalid option '%s'",
            element);
  std::fwrite(kUsage, 1, std::strlen(kUsage), stderr);
  std::fwrite("\n", 1, 1, stderr);
  return -EINVAL;
}

// Reads the options before the next datatype. Returns false if the run ends
// with `*status`.
bool apply_options(const Arguments& arguments, SensorStreamer* streamer,
                   int* status) {
  optind = 1;
  bool good_value = true;
  while (good_value) {
    const int at = optind;  // still the same within a cluster
    const int result = next_option(arguments);
    switch (result) {
      case -1:
        return true;
      case 'a':
        good_value = set_minimum_accuracy(streamer, optarg);
        break;
      case 'n':
        good_value = set_sample_limit(streamer, optarg);
        break;
      case 'r':
        good_value = set_sample_rate(streamer, optarg);
        break;
      case 't':
        good_value = set_time_limit(streamer, optarg);
        break;
      case 'c':
      case 'o':
      case 's':
        streamer->SetStreamType(static_cast<char>(result));
        break;
      case 'd':
        streamer->SetShowTimestampDiffs();
        break;
      case 'p':
        streamer->SetPassive();
        break;
      case 'v':  // applied before the hub was connected
        break;
      case 'h':
        show_usage();
        *status = 0;
        return false;
      case kVersionOption:
        show_version();
        *status = 0;
        return false;
      default:
        *status = reject(result, arguments.vector[at]);
        return false;
    }
  }
  *status = -EINVAL;
  return false;
}

}  // namespace

int apply_verbosity(const Arguments& arguments) {
  for (int result = 0; (result = next_option(arguments)) != -1;) {
    if (result != 'v') continue;
    unsigned level = 0;
    if (!parse_level(optarg, kMinVerbosity, kMaxVerbosity, &level)) {
      vesk::log(vesk::kError, "LEVEL must be between %d and %d, inclusive",
                kMinVerbosity, kMaxVerbosity);
      return -EINVAL;
    }
    vesk::setLogLevel(static_cast<vesk::log_level>(level));
  }
  return 0;
}

Command configure(SensorStreamer* streamer, Arguments* arguments, int* status) {
  for (;;) {
    if (!apply_options(*arguments, streamer, status)) return Command::kExit;
    if (optind >= arguments->count) return Command::kStream;
    arguments->count -= optind;
    arguments->vector += optind;
    const char* datatype = arguments->vector[0];
    if (std::strcmp(datatype, "list") == 0) return Command::kList;
    streamer->AddSensor(datatype);
    if (arguments->count <= 1) return Command::kStream;
  }
}

void show_usage() { std::puts(kUsage); }

void show_version() { std::puts("fennick version 2.0"); }
