#pragma once

#include "analysis/src/job_input.h"
#include "platform/hx/hx_effect.h"

namespace kelp::analysis {

// The span, steps and fields of the effect's layer as they are now; of a layer that begins before
// its media what lies behind the media's first frame. A layer that the host does not let analyse
// throws HX_ERR_LAYER_REFUSED, with the host's reason as return message; other failures throw the
// host's code. Any thread.
JobInput ReadJobInput(HX_InData* host_in, HX_OutData* host_out);

}  // namespace kelp::analysis
