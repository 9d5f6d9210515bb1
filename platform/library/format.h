#ifndef PLATFORM_LIBRARY_FORMAT_H_
#define PLATFORM_LIBRARY_FORMAT_H_

#include <cstdarg>

namespace platform {

/// Prints into [out, end) what vsnprintf would print, without a final zero.
/// Returns the end of the text; or null, with what is in [out, end) undefined,
/// when there is no room for it and one character more. Leaves `args` as it
/// is.
char* format_text(char* out, char* end, const char* format, va_list args);

}  // namespace platform

#endif  // PLATFORM_LIBRARY_FORMAT_H_
