#pragma once

#include <boost/asio/ip/tcp.hpp>
#include <memory>
#include <string>

#include "studio/server/studio.h"

namespace calmframe::studio {

// Who is let in, and how many at once.
struct Doors {
  std::string name;      // of the machine, beside localhost and addresses; may be empty
  std::string cookie;    // its name: one a port, which browsers don't tell apart
  std::string password;  // that a person set; empty: none, and the address has the secret
  int connections = 0;   // that are open
  int streams = 0;       // of events
  int guesses = 0;       // wrong passwords of the last second
  bool closed = false;   // the studio is gone
};

// Serves one connection until it ends, or is too slow. On the context's thread.
void ServeConnection(boost::asio::ip::tcp::socket socket, Studio& studio, Doors& doors);

}  // namespace calmframe::studio
