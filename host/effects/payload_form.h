#pragma once

#include <cstdint>

namespace calmframe::host {

// What the bytes of a saved effect are wanted for: a host's answer to a plug-in that asks whether
// to compress them, which its handles tell by a flag. A plug-in may deflate them all the same.
enum class PayloadForm : std::uint8_t {
  deflated = 0,  // for a project
  raw = 1,
  packed = 2  // for this process alone: some take a fifth of the memory, and no time
};

}  // namespace calmframe::host
