#pragma once

#include <cstdint>
#include <functional>

#include "platform/hx/hx.h"

// A plug-in whose entry does what a test tells it.
namespace probe {

struct Call {
  std::uint32_t command;
  HX_InData* in;
  HX_OutData* out;
  HX_ParamDef** params;
  HX_World* output;
  void* extra;
  const HX_Callbacks& cb() const { return *in->cb; }
};

// Where it is null the entry succeeds and does nothing. Set while nobody calls it.
__attribute__((visibility("default"))) std::function<HX_Err(const Call&)>& Behaviour();

}  // namespace probe
