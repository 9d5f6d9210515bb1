#ifndef PLATFORM_LIBRARY_FORMAT_H_
#define PLATFORM_LIBRARY_FORMAT_H_

#include <cstdarg>

namespace platform {

/// Prints into [out, end) what vsnprintf would print, without a final zero,
/// for the conversions of streamed output: %s %c %u %d %ld and %f or %lf, %f
/// also with a precision of one digit. Returns the end of the text; or null,
/// with what is in [out, end) undefined, when it does not fit or the format has
/// anything else. Takes what it prints from `*args`.
char* format_simple(char* out, char* end, const char* format, va_list* args);

}  // namespace platform

#endif  // PLATFORM_LIBRARY_FORMAT_H_
