#include "studio/worker/channel.h"

#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <vector>

namespace calmframe::studio {

std::optional<Message> Channel::Receive() try {
  std::vector<char> part(64 << 10);
  while (true) {
    if (std::optional<Message> message = reader_.Next()) return message;
    const ssize_t got = read(socket_, part.data(), part.size());
    if (got < 0 && errno == EINTR) continue;
    if (got <= 0) return {};
    reader_.Add(part.data(), static_cast<std::size_t>(got));
  }
} catch (const BadMessage&) {
  return {};
}

void Channel::Send(const Message& message) {
  const std::string text = Encode(message);
  // Of a film that is longer than what is told of each of its frames.
  if (text.size() - message.bytes.size() > MessageReader::kMostHead &&
      message.head.contains("id")) {
    return Send(
        {{{"id", message.head["id"]}, {"error", "there is too much of it to be shown"}}, {}});
  }
  const std::lock_guard lock(sending_);
  for (std::size_t sent = 0; sent < text.size();) {
    const ssize_t got = send(socket_, text.data() + sent, text.size() - sent, MSG_NOSIGNAL);
    if (got < 0 && errno == EINTR) continue;
    if (got <= 0) return;
    sent += static_cast<std::size_t>(got);
  }
}

}  // namespace calmframe::studio
