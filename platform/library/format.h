#ifndef PLATFORM_LIBRARY_FORMAT_H_
#define PLATFORM_LIBRARY_FORMAT_H_

#include <cstdarg>

namespace platform {

/// Prints into [out, end) what vsnprintf would print, without a final zero,
/// for the conversions of streamed output: %s %c %u %d %ld and %f or %lf with
/// or without a precision, and %%. Returns the end of the text; or null, with
/// the text undefined, when it does not fit or the format has anything else.
char* format_simple(char* out, char* end, const char* format, va_list args);

}  // namespace platform

#endif  // PLATFORM_LIBRARY_FORMAT_H_
