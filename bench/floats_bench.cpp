#include <algorithm>
#include <bit>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <future>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/library/format.h"

// Prints every float that there is, as the value of a sample and with snprintf,
// and counts where the two differ. Takes some forty minutes of processor time.

namespace {

constexpr uint64_t kFloats = uint64_t{1} << 32;
constexpr size_t kRoom = 64;  // the longest text has 47 letters

std::string_view format_into(char* out, const char* format, ...) {
  va_list args;
  va_start(args, format);
  char* end = out;
  platform::format_simple(&end, out + kRoom, format, &args);
  va_end(args);
  return {out, end};
}

// Of the floats whose bits, as a number, are `first`, `first` + `step` and so
// on.
uint64_t count_different(uint64_t first, uint64_t step) {
  uint64_t different = 0;
  for (uint64_t bits = first; bits < kFloats; bits += step) {
    const double value = std::bit_cast<float>(static_cast<uint32_t>(bits));
    char text[kRoom];
    char expected[kRoom];
    const int size = std::snprintf(expected, kRoom, "%f", value);
    different += format_into(text, "%f", value) !=
                 std::string_view(expected, static_cast<size_t>(size));
  }
  return different;
}

}  // namespace

int main() {
  const unsigned step = std::max(1u, std::thread::hardware_concurrency());
  std::vector<std::future<uint64_t>> parts;
  for (unsigned first = 0; first < step; ++first) {
    parts.push_back(
        std::async(std::launch::async, count_different, first, step));
  }
  uint64_t different = 0;
  for (auto& part : parts) different += part.get();
  std::printf("%lu floats, of which %lu differ\n", kFloats, different);
  return different != 0;
}
