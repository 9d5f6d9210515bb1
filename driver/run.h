#ifndef DRIVER_RUN_H_
#define DRIVER_RUN_H_

/// The whole run of the program on the main thread, from opening the log file
/// to the teardown: reads the command line, lists or streams. Returns the exit
/// status: 0, a negated errno code or a status of the client library. Once per
/// process: it changes standard descriptors and signal handling for good, a
/// signal that it has noted stays noted, and getopt remembers where it was.
int run(int argc, char** argv);

#endif  // DRIVER_RUN_H_
