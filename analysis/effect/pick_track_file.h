#pragma once

#include "analysis/src/analysis_state.h"

namespace kelp::analysis {

// Asks the user for a file and dumps the state's track table into it; see WriteTrackFile. Says
// nothing of a failure, but an assertion about a state without tracks. On the host's main thread.
void PickFileAndSaveTracks(const AnalysisState* state);

}  // namespace kelp::analysis
