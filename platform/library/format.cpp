#include "platform/library/format.h"

#include <charconv>
#include <cstddef>
#include <cstring>

namespace platform {
namespace {

// Where printing goes. What is put there returns false if it does not fit.
struct Target {
  char* at;
  char* end;

  bool Put(const char* text, size_t size) {
    if (size > static_cast<size_t>(end - at)) return false;
    std::memcpy(at, text, size);
    at += size;
    return true;
  }

  template <typename... Arguments>
  bool PutNumber(Arguments... arguments) {
    const auto [next, error] = std::to_chars(at, end, arguments...);
    at = next;
    return error == std::errc();
  }
};

// Prints one conversion, whose '%' has been read. False also if it is not
// simple.
bool put_conversion(Target* target, const char** format, va_list* args) {
  switch (*(*format)++) {
    case 'f':  // also what is infinite or not a number, as printf does
      return target->PutNumber(va_arg(*args, double), std::chars_format::fixed,
                               6);
    case 'l':
      return *(*format)++ == 'd' && target->PutNumber(va_arg(*args, long));
    case 's': {
      const char* const text = va_arg(*args, const char*);
      return text != nullptr && target->Put(text, std::strlen(text));
    }
    case 'c': {
      const char letter = static_cast<char>(va_arg(*args, int));
      return target->Put(&letter, 1);
    }
    default:
      return false;
  }
}

}  // namespace

bool format_simple(char** out, char* end, const char* format, va_list* args) {
  Target target = {*out, end};
  for (;;) {
    const char letter = *format++;
    if (letter == '%') {
      if (!put_conversion(&target, &format, args)) return false;
    } else if (letter == '\0') {
      *out = target.at;
      return true;
    } else {
      if (target.at == end) return false;
      *target.at++ = letter;
    }
  }
}

}  // namespace platform
