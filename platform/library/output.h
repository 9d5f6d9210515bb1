#ifndef PLATFORM_LIBRARY_OUTPUT_H_
#define PLATFORM_LIBRARY_OUTPUT_H_

namespace platform {

// Between the two, what the session prints is gathered, so that a delivery, of
// all that is due at a time, costs one write; outside, a line is written as
// soon as it is complete. One delivery runs at a time.
void begin_delivery();
void end_delivery();

}  // namespace platform

#endif  // PLATFORM_LIBRARY_OUTPUT_H_
