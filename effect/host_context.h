#pragma once

#include <cstdint>

#include "platform/hx/hx_effect.h"

namespace kelp::effect {

// What the host hands over with one command; all of it is borrowed for that one call. Fields that a
// command has no use for may be null.
struct HostContext {
  std::uint32_t command;
  HX_InData* in;
  HX_OutData* out;
  HX_ParamDef** params;
  HX_World* output;
  void* extra;
};

// For code that is handed the host's records alone, below any command.
inline HostContext RecordsOnly(HX_InData* host_in, HX_OutData* host_out) {
  return {0, host_in, host_out, nullptr, nullptr, nullptr};
}

// A host's code is thrown as it came, as a 32-bit integer; the entry hands it back to the host.
inline void ThrowIfFailed(HX_Err code) {
  if (code != HX_ERR_NONE) throw std::int32_t{code};
}

}  // namespace kelp::effect
