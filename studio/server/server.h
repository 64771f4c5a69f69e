#pragma once

#include <functional>
#include <string>
#include <vector>

#include "studio/server/studio.h"

namespace calmframe::studio {

struct ServerSettings {
  StudioSettings studio;
  std::string address = "127.0.0.1";
  int port = 0;                    // 0: one that is free
  std::string name;                // of the machine, by which others may call it; empty: none
  std::vector<std::string> clips;  // to be opened
  // Told once it listens: the address for a browser.
  std::function<void(const std::string& address)> listens;
};

// The address or the port can't be had; one line.
class CannotListen : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// Serves until SIGINT, SIGTERM or SIGHUP. Throws CannotListen, and as Studio does.
void Serve(const ServerSettings& settings);

}  // namespace calmframe::studio
