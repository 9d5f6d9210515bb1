#include "platform/library/format.h"

#include <charconv>
#include <cmath>
#include <cstddef>
#include <cstdio>
#include <cstring>

namespace platform {
namespace {

// The functions that follow return the end of the text, or null when it does
// not fit.

char* put_text(char* out, char* end, const char* text, size_t size) {
  if (size > static_cast<size_t>(end - out)) return nullptr;
  std::memcpy(out, text, size);
  return out + size;
}

template <typename... Arguments>
char* put_number(char* out, char* end, Arguments... arguments) {
  const auto [next, error] = std::to_chars(out, end, arguments...);
  return error == std::errc() ? next : nullptr;
}

// Prints the conversions of streamed output: %s %c %u %d %ld %f %lf and %f
// with a precision of one digit. Null for all else, too.
char* put_conversion(char* out, char* end, const char** format, va_list* args) {
  int precision = 6;
  switch (*(*format)++) {
    case 's': {
      const char* const text = va_arg(*args, const char*);
      if (text == nullptr) return nullptr;
      return put_text(out, end, text, std::strlen(text));
    }
    case 'c': {
      const char letter = static_cast<char>(va_arg(*args, int));
      return put_text(out, end, &letter, 1);
    }
    case 'u':
      return put_number(out, end, va_arg(*args, unsigned));
    case 'd':
      return put_number(out, end, va_arg(*args, int));
    case 'l':
      if (**format == 'd') {
        ++*format;
        return put_number(out, end, va_arg(*args, long));
      }
      if (*(*format)++ != 'f') return nullptr;
      break;
    case '.':
      if (**format < '0' || **format > '9') return nullptr;
      precision = *(*format)++ - '0';
      if (*(*format)++ != 'f') return nullptr;
      break;
    case 'f':
      break;
    default:
      return nullptr;
  }
  const double value = va_arg(*args, double);
  if (!std::isfinite(value)) return nullptr;
  return put_number(out, end, value, std::chars_format::fixed, precision);
}

}  // namespace

char* format_text(char* out, char* end, const char* format, va_list args) {
  va_list copy;
  va_copy(copy, args);
  char* at = out;
  for (const char* next = format; at != nullptr && *next != '\0';) {
    const char letter = *next++;
    if (letter == '%') {
      at = put_conversion(at, end, &next, &copy);
    } else if (at != end) {
      *at++ = letter;
    } else {
      at = nullptr;
    }
  }
  va_end(copy);
  if (at != nullptr) return at;

  va_copy(copy, args);
  const int size =
      std::vsnprintf(out, static_cast<size_t>(end - out), format, copy);
  va_end(copy);
  // What cannot be printed at all is left out.
  if (size < 0) return out;
  return size < end - out ? out + size : nullptr;
}

}  // namespace platform
