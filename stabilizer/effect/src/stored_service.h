#pragma once

#include <memory>

#include "effect/host_context.h"
#include "stabilizer/effect/src/instance_handle.h"
#include "stabilizer/effect/src/stabilizer_state.h"

// What projects keep of an instance. Host codes are thrown.
namespace kelp::effect {

// A flattened handle, which is the caller's, with what is kept of the state; with nothing in it for
// a null one. Compressed as the debug options and the host want it.
HX_Handle FlattenedHandle(const HostContext& context, const StabilizerState* state);

// The state that the host-in's handle, flattened and of that kind, holds; null for Nothing. Where
// it can't be taken the user is told why and the state is an empty one.
std::unique_ptr<StabilizerState> StateOfFlattened(const HostContext& context,
                                                  FlattenedInstance kind);

// What the host has to be told of a state that comes from a project, where it was not told, or
// could not be, when that was saved. A null state has no frames. counter: the project's
// AnalysisStatusCounter.
analysis::FrameStatus UntoldStatus(const StabilizerState* state, double counter);
// The same of a state at rest, for a host that was told of work and waits for its end; else None.
analysis::FrameStatus UntoldEnd(const StabilizerState* state, double counter);

}  // namespace kelp::effect
