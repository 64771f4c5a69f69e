#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>

namespace calmframe::fuzz {

// A fuzzer's input, taken from its front; what is behind its end is zeros.
class Input {
 public:
  Input(const std::uint8_t* data, std::size_t size)
      : at_(reinterpret_cast<const char*>(data)), left_(size) {}

  bool is_over() const { return left_ == 0; }

  template <class Value>
  Value Take() {
    Value value{};
    const std::size_t size = std::min(sizeof value, left_);
    std::memcpy(static_cast<void*>(&value), at_, size);
    at_ += size;
    left_ -= size;
    return value;
  }
  // Up to a zero, which goes too.
  std::string TakeText() {
    const auto* end = static_cast<const char*>(std::memchr(at_, 0, left_));
    std::string text(at_, end ? static_cast<std::size_t>(end - at_) : left_);
    const std::size_t taken = text.size() + (end ? 1 : 0);
    at_ += taken;
    left_ -= taken;
    return text;
  }
  std::string TakeBytes(std::size_t size) {
    std::string bytes(at_, std::min(size, left_));
    at_ += bytes.size();
    left_ -= bytes.size();
    return bytes;
  }
  std::string TakeRest() { return TakeBytes(left_); }

 private:
  const char* at_;
  std::size_t left_;
};

}  // namespace calmframe::fuzz
