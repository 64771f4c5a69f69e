#pragma once

#include <string>

#include "analysis/src/analyzer.h"
#include "analysis/src/job_input.h"

// The texts within a stored state.
namespace kelp::effect::state_format {

// Throw tessel::serialization::Error for a number that is not finite.
std::u16string JobInputText(const analysis::JobInput& input);
std::u16string JobText(const analysis::AnalyzerRecord& job);

// Throw tessel::serialization::Error for what is no such text. Times at a legacy scale come back at
// the scale that it stood for.
analysis::JobInput ParseJobInput(const std::u16string& text);
analysis::AnalyzerRecord ParseJob(const std::u16string& text);

}  // namespace kelp::effect::state_format
