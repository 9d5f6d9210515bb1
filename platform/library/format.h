#ifndef PLATFORM_LIBRARY_FORMAT_H_
#define PLATFORM_LIBRARY_FORMAT_H_

#include <cstdarg>

namespace platform {

/// Prints at `*out` what vsnprintf would print, without a final zero, for the
/// conversions of streamed samples: %f, %ld, %s and %c. Moves `*out` to the end
/// of the text and returns true; or returns false and leaves `*out` when the
/// text does not fit before `end` or the format has anything else.
bool format_simple(char** out, char* end, const char* format, va_list* args);

}  // namespace platform

#endif  // PLATFORM_LIBRARY_FORMAT_H_
