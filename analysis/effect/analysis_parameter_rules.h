#pragma once

#include <cstdint>

#include "effect/parameter_reader.h"
#include "tracking/selector_params.h"
#include "tracking/tracker_params.h"

// How parameters become the records of an analysis: where one says 0 = auto, its value is found
// from the frame's size and from Detailed Analysis.
namespace kelp::analysis::effect {

// Half side of a window: 7 at 480 lines or less, 15 at 1080 or more, linear between and truncated;
// 5 more when detailed.
std::uint64_t WindowRule(std::uint32_t height, bool detailed);

// width, height: pixels of the source's frames.
marrow::tracking::SelectorParams GetSelectorParams(const kelp::effect::ParameterReader& params,
                                                   std::uint32_t width, std::uint32_t height);
marrow::tracking::TrackerParams GetTrackerParams(const kelp::effect::ParameterReader& params,
                                                 std::uint32_t height);

}  // namespace kelp::analysis::effect
