#include "studio/wire/message.h"

#include <cstdint>
#include <string_view>

#include "host/base/json_bounds.h"

namespace calmframe::studio {
namespace {

constexpr std::size_t kPrefix = 8;

void PutSize(std::size_t size, std::string& to) {
  for (int shift = 0; shift < 32; shift += 8) {
    to.push_back(static_cast<char>((size >> shift) & 0xff));
  }
}

std::size_t SizeAt(std::string_view text, std::size_t place) {
  std::size_t size = 0;
  for (int i = 3; i >= 0; --i) {
    size = size << 8 | static_cast<std::uint8_t>(text[place + static_cast<std::size_t>(i)]);
  }
  return size;
}

}  // namespace

std::string Encode(const Message& message) {
  const std::string head =
      message.head.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace);
  std::string text;
  text.reserve(kPrefix + head.size() + message.bytes.size());
  PutSize(head.size(), text);
  PutSize(message.bytes.size(), text);
  text += head;
  text += message.bytes;
  return text;
}

std::optional<Message> MessageReader::Next() {
  const std::string_view left = std::string_view(pending_).substr(taken_);
  if (left.size() < kPrefix) return {};
  const std::size_t head = SizeAt(left, 0), bytes = SizeAt(left, 4);
  if (head > kMostHead || bytes > kMostBytes) throw BadMessage("a message is too large");
  if (left.size() < kPrefix + head + bytes) return {};
  const std::string_view object = left.substr(kPrefix, head);
  if (ExceedsBounds(object))
    throw BadMessage("a message is nested too deep, or has too many parts");
  Message message;
  message.head =
      nlohmann::json::parse(object.begin(), object.end(), nullptr, /*allow_exceptions=*/false);
  if (!message.head.is_object()) throw BadMessage("a message is no object");
  message.bytes = left.substr(kPrefix + head, bytes);
  taken_ += kPrefix + head + bytes;
  return message;
}

}  // namespace calmframe::studio
