#pragma once

#include <framework/mlt.h>

#include <string>
#include <utility>
#include <vector>

namespace calmframe::mlt {

// Names and values as calmframe_set takes them.
using Controls = std::vector<std::pair<std::string, std::string>>;

// What of the filter's properties differs from the default, which stands for "nobody set it": those
// that only a new analysis follows, or the others. Throws std::runtime_error for a value that a
// property can't have, with its name and what it can.
Controls ReadAnalysisControls(mlt_properties properties);
Controls ReadSolveControls(mlt_properties properties);

}  // namespace calmframe::mlt
