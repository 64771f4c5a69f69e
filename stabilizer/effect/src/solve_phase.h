#pragma once

#include <cstdint>

namespace kelp::effect {

// What has become of an instance's solve; stored in projects.
enum class SolvePhase : std::int32_t { None = 0, Solved = 2, Failed = 4, AnalysisFailed = 5 };

}  // namespace kelp::effect
