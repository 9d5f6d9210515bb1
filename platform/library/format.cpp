#include "platform/library/format.h"

#include <charconv>
#include <cmath>
#include <cstddef>
#include <cstdint>
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

// Prints %f, which is a whole number of millionths with a point before the last
// six digits: the nearest to the value or, of two that are equally near, the
// even one. Of a float, as nearly all that is streamed, these are computed
// directly. A float has 24 significant bits and a million has 20, so that their
// product has 44 at most. A double holds 53: the multiplication rounds nothing,
// and llrint then rounds the exact product in just the way of %f. Below 1e12
// the result fits 64 bits.
bool put_fixed(Target* target, double value) {
  const double magnitude = std::fabs(value);
  if (!(magnitude < 1e12 && static_cast<float>(magnitude) == magnitude)) {
    // Also what is infinite or not a number, as printf does.
    return target->PutNumber(value, std::chars_format::fixed, 6);
  }
  constexpr uint64_t kMillion = 1'000'000;
  const auto millionths =
      static_cast<uint64_t>(std::llrint(magnitude * double{kMillion}));
  if (std::signbit(value) && !target->Put("-", 1)) return false;
  if (!target->PutNumber(millionths / kMillion)) return false;
  char* const point = target->at;
  if (target->end - point < 7) return false;
  *point = '.';
  auto rest = static_cast<uint32_t>(millionths % kMillion);
  for (int i = 6; i > 0; --i, rest /= 10) {
    point[i] = static_cast<char>('0' + rest % 10);
  }
  target->at = point + 7;
  return true;
}

// Prints one conversion, whose '%' has been read. False also if it is not
// simple.
bool put_conversion(Target* target, const char** format, va_list* args) {
  switch (*(*format)++) {
    case 'f':
      return put_fixed(target, va_arg(*args, double));
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
