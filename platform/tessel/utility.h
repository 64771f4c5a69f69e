#pragma once

#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <string>

// Texts, numbers and the clock. Any thread. Texts are UTF-8 unless they are of char16_t.
namespace tessel::utility {

// What is not valid becomes U+FFFD.
std::u16string ToUTF16(const std::string& text);
std::string ToUTF8(const std::u16string& text);

// The longest beginning of the text that has at most `max_bytes` bytes and cuts no character.
std::string CutToBytes(const std::string& text, std::size_t max_bytes);

// Without locale: "." and no grouping; halves as printf rounds them.
std::string NumberToString(double value, int decimals);
std::string NumberToString(std::int64_t value);
inline std::string NumberToString(int value) {
  return NumberToString(std::int64_t{value});
}

// Puts values[n] for each "@n", n a digit. One that has no value stays; what stands in a value is
// not replaced again.
std::string ReplacePlaceholders(const std::string& text, std::initializer_list<std::string> values,
                                char mark = '@', char first_digit = '0');

// ReplaceInString(text, value0, value1, ...): "@0" to "@9".
template <typename... Values>
std::string ReplaceInString(const std::string& text, const Values&... values) {
  return ReplacePlaceholders(text, {std::string(values)...});
}

// CRC-32 of the bytes behind those that gave `before`: polynomial 0x04C11DB7 reflected, initial
// value and final mask all ones.
std::uint32_t CRC32(const void* data, std::size_t size, std::uint32_t before = 0);

// A clock that never goes back, in ticks since an instant of the process's machine. Never 0.
class HighPrecisionTime {
 public:
  static std::uint64_t Now();
  static std::int64_t ToNanoseconds(std::int64_t ticks);
  // From one instant to another; negative when `to` lies before `from`.
  static double Seconds(std::uint64_t from, std::uint64_t to);
};

}  // namespace tessel::utility
