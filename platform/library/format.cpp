#include "platform/library/format.h"

#include <charconv>
#include <cmath>
#include <cstddef>
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

char* put_double(char* out, char* end, double value, int precision) {
  if (!std::isfinite(value)) return nullptr;
  return put_number(out, end, value, std::chars_format::fixed, precision);
}

// Prints one conversion, whose '%' has been read. Null also if it is not
// simple.
char* put_conversion(char* out, char* end, const char** format, va_list* args) {
  const char conversion = *(*format)++;
  // Most of them.
  if (conversion == 'f') return put_double(out, end, va_arg(*args, double), 6);
  switch (conversion) {
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
    case 'l': {
      const char type = *(*format)++;
      if (type == 'd') return put_number(out, end, va_arg(*args, long));
      if (type != 'f') return nullptr;
      return put_double(out, end, va_arg(*args, double), 6);
    }
    case '.': {
      const int precision = **format - '0';
      if (precision < 0 || precision > 9 || *++*format != 'f') return nullptr;
      ++*format;
      return put_double(out, end, va_arg(*args, double), precision);
    }
    default:
      return nullptr;
  }
}

}  // namespace

char* format_simple(char* out, char* end, const char* format, va_list* args) {
  for (;;) {
    const char letter = *format++;
    if (letter == '%') {
      out = put_conversion(out, end, &format, args);
      if (out == nullptr) return nullptr;
    } else if (letter == '\0') {
      return out;
    } else {
      if (out == end) return nullptr;
      *out++ = letter;
    }
  }
}

}  // namespace platform
