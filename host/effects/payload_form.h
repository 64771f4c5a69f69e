#pragma once

#include <cstdint>

#include "platform/hx/hx_suites.h"

namespace calmframe::host {

// What the bytes of a saved effect are wanted for: a host's answer to a plug-in that asks whether
// to compress them, which its handles tell by a flag. A plug-in may deflate them all the same.
enum class PayloadForm : std::uint8_t {
  deflated = HX_PAYLOAD_DEFLATED,  // for a project
  raw = HX_PAYLOAD_RAW,
  packed = HX_PAYLOAD_PACKED  // for this process: some take a fifth of the memory, and no time
};

}  // namespace calmframe::host
