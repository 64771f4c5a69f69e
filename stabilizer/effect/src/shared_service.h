#pragma once

#include "effect/host_context.h"
#include "stabilizer/effect/src/stabilizer_state.h"

// The block that the instances of one effect share; see StabilizerSharedData. The host keeps it.
namespace kelp::effect {

// Gives the state, which has none, its effect's block, and makes that if the state is the first to
// come. Throws the host's code.
void AttachBlock(const HostContext& context, StabilizerState& state);

// Takes the state's block away and deletes it if it was the last user's; whether it was.
bool DetachBlock(const HostContext& context, StabilizerState& state);

}  // namespace kelp::effect
