#include "driver/run.h"

#include <fcntl.h>
#include <getopt.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <memory>

#include "driver/options.h"
#include "hub/vesk.h"
#include "lister/sensor_lister.h"
#include "streamer/sensor_streamer.h"

namespace {

constexpr char kLogFile[] = "/data/app-ephemeral/fennick.log";

// Makes the standard descriptors safe to use. One that is closed would be given
// to the next file that is opened, and the log file would get the listing; it
// is taken by one that fails just as a closed one does, because it is open for
// the other direction. And when nobody reads any more, the process ends, also
// if its parent ignores or blocks that signal.
void prepare_standard_descriptors() {
  for (const int fd : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    if (fcntl(fd, F_GETFD) != -1) continue;
    open("/dev/null", fd == STDIN_FILENO ? O_WRONLY : O_RDONLY);
  }
  signal(SIGPIPE, SIG_DFL);
  sigset_t broken_pipe;
  sigemptyset(&broken_pipe);
  sigaddset(&broken_pipe, SIGPIPE);
  pthread_sigmask(SIG_UNBLOCK, &broken_pipe, nullptr);
}

// Connects with SIGINT and SIGHUP blocked, so that the library's threads
// inherit that and both signals reach the main thread alone.
int connect(std::unique_ptr<vesk::Connection>* connection) {
  const sigset_t signals = stop_signals();
  sigset_t previous;
  pthread_sigmask(SIG_BLOCK, &signals, &previous);
  const int status = vesk::Connection::Create(connection);
  pthread_sigmask(SIG_SETMASK, &previous, nullptr);
  return status;
}

// Whether all that went to standard output got there.
bool flush_output() {
  if (std::fflush(stdout) == 0 && std::ferror(stdout) == 0) return true;
  vesk::log(vesk::kError, "Unable to write to standard output");
  return false;
}

int list(vesk::Connection* connection, const Arguments& arguments) {
  int status = SensorLister(connection).List(arguments.count, arguments.vector);
  if (status == SensorLister::kShowVersion) {
    show_version();
    status = 0;
  } else if (status == SensorLister::kShowUsage) {
    show_usage();
    status = 0;
  }
  return flush_output() || status != 0 ? status : -EIO;
}

}  // namespace

int run(int argc, char** argv) {
  prepare_standard_descriptors();
  if (!vesk::openLogFile(kLogFile)) {
    vesk::log(vesk::kWarning, "Failed to open log file");
  }
  opterr = 0;
  Arguments arguments = {argc, argv};
  int status = apply_verbosity(arguments);
  if (status != 0) return status;

  std::unique_ptr<vesk::Connection> connection;
  status = connect(&connection);
  if (status != 0) {
    vesk::closeLogFile();
    return status;
  }
  // Goes before the connection that it is a client of.
  const auto streamer = std::make_unique<SensorStreamer>(connection.get());
  switch (configure(streamer.get(), &arguments, &status)) {
    case Command::kExit:
      flush_output();
      return status;
    case Command::kList:
      status = list(connection.get(), arguments);
      break;
    case Command::kStream:
      status = streamer->Stream();
      break;
  }
  vesk::closeLogFile();
  return status;
}
