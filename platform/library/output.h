#ifndef PLATFORM_LIBRARY_OUTPUT_H_
#define PLATFORM_LIBRARY_OUTPUT_H_

namespace platform {

// Around a delivery, of all that is due at a time, on the thread that makes it:
// what this thread prints in between is gathered, so that it costs one write.
// What others print, and anyone outside, is written a line at a time, as soon
// as that is complete.
void begin_delivery();
void end_delivery();

}  // namespace platform

#endif  // PLATFORM_LIBRARY_OUTPUT_H_
