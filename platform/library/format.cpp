#include "platform/library/format.h"

#include <charconv>
#include <cmath>
#include <cstddef>
#include <cstring>

namespace platform {
namespace {

// Where printing goes. After text that did not fit, `at` is null and stays so.
struct Target {
  char* at;
  char* end;

  void Put(const char* text, size_t size) {
    if (at == nullptr || size > static_cast<size_t>(end - at)) {
      at = nullptr;
      return;
    }
    std::memcpy(at, text, size);
    at += size;
  }

  template <typename... Arguments>
  void PutNumber(Arguments... arguments) {
    if (at == nullptr) return;
    const auto [next, error] = std::to_chars(at, end, arguments...);
    at = error == std::errc() ? next : nullptr;
  }
};

// Takes a number in decimal, as a precision is written.
int take_digits(const char** format) {
  int value = 0;
  for (; **format >= '0' && **format <= '9' && value < 100; ++*format) {
    value = value * 10 + (**format - '0');
  }
  return value;
}

// Prints one conversion, whose '%' has been read. False if it is not simple.
bool put_conversion(Target* target, const char** format, va_list* args) {
  int precision = -1;
  if (**format == '.') {
    ++*format;
    precision = take_digits(format);
  }
  const bool is_long = **format == 'l';
  if (is_long) ++*format;
  const char conversion = *(*format)++;
  if (precision >= 0 && conversion != 'f') return false;
  switch (conversion) {
    case 'f': {
      const double value = va_arg(*args, double);
      if (!std::isfinite(value)) return false;
      target->PutNumber(value, std::chars_format::fixed,
                        precision >= 0 ? precision : 6);
      return true;
    }
    case 'd':
      if (is_long) {
        target->PutNumber(va_arg(*args, long));
      } else {
        target->PutNumber(va_arg(*args, int));
      }
      return true;
    case 'u':
      if (is_long) return false;
      target->PutNumber(va_arg(*args, unsigned));
      return true;
    case 's': {
      const char* text = va_arg(*args, const char*);
      if (is_long || text == nullptr) return false;
      target->Put(text, std::strlen(text));
      return true;
    }
    case 'c': {
      const char letter = static_cast<char>(va_arg(*args, int));
      target->Put(&letter, 1);
      return !is_long;
    }
    case '%':
      target->Put("%", 1);
      return !is_long;
    default:
      return false;
  }
}

}  // namespace

char* format_simple(char* out, char* end, const char* format, va_list args) {
  Target target = {out, end};
  va_list rest;
  va_copy(rest, args);
  bool simple = true;
  while (simple && *format != '\0') {
    if (*format != '%') {
      const char* const text = format;
      while (*format != '\0' && *format != '%') ++format;
      target.Put(text, static_cast<size_t>(format - text));
    } else {
      ++format;
      simple = put_conversion(&target, &format, &rest);
    }
  }
  va_end(rest);
  return simple ? target.at : nullptr;
}

}  // namespace platform
