#pragma once

#include "platform/tessel/filesupport.h"
#include "stabilizer/effect/src/state_format/format.h"
#include "stabilizer/effect/src/state_format/saved_state.h"

namespace kelp::effect {

// Writes the payload of the present version, which is for the caller to deflate. The same state
// gives the same bytes. Results of a
// solve are left out where the phase tells of some but there are none. Throws what the stream
// throws, and tessel::serialization::Error for a parameter that is not finite.
void WriteState(tessel::filesupport::OutputByteStream& out, const SavedState& state,
                state_format::PayloadForm form = state_format::PayloadForm::raw);

}  // namespace kelp::effect
