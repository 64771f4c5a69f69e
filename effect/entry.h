#pragma once

#include <cstdint>
#include <type_traits>

#include "effect/generic_effect.h"

namespace kelp::effect {

// Runs the effect's command and turns what it throws into the host's code: a thrown 32-bit integer
// is that code; out of memory becomes 4, anything else 1, both after their report. A report that
// fails changes nothing of that.
HX_Err RunCommand(GenericEffect& effect) noexcept;

// The body of the plug-in's one entry for a concrete effect. Re-entrant, allocates nothing, holds
// no lock.
template <typename Effect>
HX_Err EffectMain(std::uint32_t command, HX_InData* in, HX_OutData* out, HX_ParamDef* params[],
                  HX_World* output, void* extra) noexcept {
  static_assert(std::is_base_of_v<GenericEffect, Effect>);
  static_assert(sizeof(Effect) == sizeof(GenericEffect), "an effect is a view over its context");
  static_assert(std::is_nothrow_constructible_v<Effect, const HostContext&>);
  Effect effect(HostContext{command, in, out, params, output, extra});
  return RunCommand(effect);
}

}  // namespace kelp::effect
