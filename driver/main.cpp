#include <fcntl.h>
#include <unistd.h>

#include <initializer_list>

#include "driver/run.h"

namespace {

// A standard descriptor that is closed would be given to the next file that is
// opened, and the log file would get the listing. It is taken by one that
// fails just as a closed one does, because it is open for the other direction.
void occupy_standard_descriptors() {
  for (const int fd : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    if (fcntl(fd, F_GETFD) != -1) continue;
    open("/dev/null", fd == STDIN_FILENO ? O_WRONLY : O_RDONLY);
  }
}

}  // namespace

int main(int argc, char** argv) {
  occupy_standard_descriptors();
  return run(argc, argv);
}
