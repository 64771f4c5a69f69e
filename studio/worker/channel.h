#pragma once

#include <mutex>
#include <optional>

#include "studio/wire/message.h"

namespace calmframe::studio {

// A worker's end of the socket to the studio.
class Channel {
 public:
  explicit Channel(int socket) : socket_(socket) {}

  // Waits. None when the other end is gone, or says what is no message. For one thread.
  std::optional<Message> Receive();
  // Any thread. To nobody where the other end is gone.
  void Send(const Message& message);

 private:
  const int socket_;
  MessageReader reader_;
  std::mutex sending_;
};

}  // namespace calmframe::studio
