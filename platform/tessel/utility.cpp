#include "platform/tessel/utility.h"

#include <zlib.h>

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cmath>
#include <vector>

namespace tessel::utility {
namespace {

constexpr char32_t kReplacement = 0xfffd;

bool IsContinuation(char c) {
  return (static_cast<unsigned char>(c) & 0xc0) == 0x80;
}

void AppendUTF16(char32_t c, std::u16string* text) {
  if (c < 0x10000) {
    *text += static_cast<char16_t>(c);
  } else {
    *text += static_cast<char16_t>(0xd800 + ((c - 0x10000) >> 10));
    *text += static_cast<char16_t>(0xdc00 + (c & 0x3ff));
  }
}

void AppendUTF8(char32_t c, std::string* text) {
  const auto tail = [&](int shift) { *text += static_cast<char>(0x80 | ((c >> shift) & 0x3f)); };
  if (c < 0x80) {
    *text += static_cast<char>(c);
  } else if (c < 0x800) {
    *text += static_cast<char>(0xc0 | (c >> 6));
    tail(0);
  } else if (c < 0x10000) {
    *text += static_cast<char>(0xe0 | (c >> 12));
    tail(6);
    tail(0);
  } else {
    *text += static_cast<char>(0xf0 | (c >> 18));
    tail(12);
    tail(6);
    tail(0);
  }
}

// The character at `*i`, which moves behind it; an invalid sequence gives a replacement for its
// first byte and those continuations that could have belonged to it.
char32_t NextUTF8(const std::string& text, std::size_t* i) {
  const auto lead = static_cast<unsigned char>(text[(*i)++]);
  if (lead < 0x80) return lead;
  const int tails = lead >= 0xc2 && lead < 0xe0   ? 1
                    : lead >= 0xe0 && lead < 0xf0 ? 2
                    : lead >= 0xf0 && lead < 0xf5 ? 3
                                                  : 0;
  if (tails == 0) return kReplacement;
  char32_t c = lead & (0x3fU >> tails);
  for (int t = 0; t < tails; ++t) {
    if (*i == text.size() || !IsContinuation(text[*i])) return kReplacement;
    c = c << 6 | (static_cast<unsigned char>(text[(*i)++]) & 0x3fU);
  }
  const bool overlong = (tails == 2 && c < 0x800) || (tails == 3 && c < 0x10000);
  const bool surrogate = c >= 0xd800 && c < 0xe000;
  return overlong || surrogate || c > 0x10ffff ? kReplacement : c;
}

}  // namespace

std::u16string ToUTF16(const std::string& text) {
  std::u16string result;
  result.reserve(text.size());
  for (std::size_t i = 0; i < text.size();) AppendUTF16(NextUTF8(text, &i), &result);
  return result;
}

std::string ToUTF8(const std::u16string& text) {
  std::string result;
  result.reserve(text.size());
  for (std::size_t i = 0; i < text.size(); ++i) {
    char32_t c = text[i];
    if (c >= 0xd800 && c < 0xe000) {
      const bool pair = c < 0xdc00 && i + 1 < text.size() && (text[i + 1] & 0xfc00) == 0xdc00;
      c = pair ? 0x10000 + ((c - 0xd800) << 10) + (text[++i] - 0xdc00U) : kReplacement;
    }
    AppendUTF8(c, &result);
  }
  return result;
}

std::string CutToBytes(const std::string& text, std::size_t max_bytes) {
  if (text.size() <= max_bytes) return text;
  std::size_t end = max_bytes;
  while (end > 0 && IsContinuation(text[end])) --end;
  return text.substr(0, end);
}

std::string NumberToString(double value, int decimals) {
  // The largest double has 309 digits before the point.
  std::vector<char> buffer(static_cast<std::size_t>(320 + std::max(decimals, 0)));
  const auto end = std::to_chars(buffer.data(), buffer.data() + buffer.size(), value,
                                 std::chars_format::fixed, std::max(decimals, 0));
  return std::string(buffer.data(), end.ptr);
}

std::string NumberToString(std::int64_t value) {
  return std::to_string(value);
}

std::string ReplacePlaceholders(const std::string& text, std::initializer_list<std::string> values,
                                char mark, char first_digit) {
  std::string result;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == mark && i + 1 < text.size() && text[i + 1] >= first_digit &&
        text[i + 1] <= '9') {
      const auto place = static_cast<std::size_t>(text[i + 1] - first_digit);
      if (place < values.size()) {
        result += values.begin()[place];
        ++i;
        continue;
      }
    }
    result += text[i];
  }
  return result;
}

std::uint32_t CRC32(const void* data, std::size_t size, std::uint32_t before) {
  return static_cast<std::uint32_t>(::crc32_z(before, static_cast<const Bytef*>(data), size));
}

std::uint64_t HighPrecisionTime::Now() {
  const auto since = std::chrono::steady_clock::now().time_since_epoch();
  const auto ticks = std::chrono::duration_cast<std::chrono::nanoseconds>(since).count();
  return static_cast<std::uint64_t>(std::max<std::int64_t>(ticks, 1));
}

std::int64_t HighPrecisionTime::ToNanoseconds(std::int64_t ticks) {
  return ticks;
}

double HighPrecisionTime::Seconds(std::uint64_t from, std::uint64_t to) {
  return static_cast<double>(ToNanoseconds(static_cast<std::int64_t>(to - from))) / 1e9;
}

}  // namespace tessel::utility
