#pragma once

#include <cstddef>
#include <nlohmann/json.hpp>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>

namespace calmframe::studio {

// What the studio and the worker of a clip say to each other, through a socket: an object, and
// bytes that belong to it, such as a picture. On the wire the sizes of both, 4 bytes each, the
// lowest first, then the object as JSON, then the bytes.
struct Message {
  nlohmann::json head = nlohmann::json::object();
  std::string bytes = {};
};

// Somebody says what is no message; one line.
class BadMessage : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// Text that is no UTF-8, such as a file's name, is mended.
std::string Encode(const Message& message);

// Takes a stream apart, however it comes.
class MessageReader {
 public:
  static constexpr std::size_t kMostHead = std::size_t{16} << 20;
  static constexpr std::size_t kMostBytes = std::size_t{128} << 20;

  void Add(const char* data, std::size_t size) {
    pending_.erase(0, std::exchange(taken_, 0));  // once for many small messages
    pending_.append(data, size);
  }
  // The next message that is whole. Throws BadMessage; then the stream is worth nothing more.
  std::optional<Message> Next();

 private:
  std::string pending_;
  std::size_t taken_ = 0;  // bytes at its front
};

}  // namespace calmframe::studio
