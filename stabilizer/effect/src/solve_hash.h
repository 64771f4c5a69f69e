#pragma once

#include <cstdint>

#include "stabilization/solver_params.h"

// What a stored solve was made from, in 32 bits each: CRC-32 of fields as they lie in memory,
// without padding. Comparable between builds with the same record alone.
namespace kelp::effect {

// Of all that the warps depend on.
std::uint32_t SolveHash(const marrow::stabilization::SolverParamsRecord& params);
// Of all that the crop window depends on besides.
std::uint32_t CropHash(const marrow::stabilization::SolverParamsRecord& params);

}  // namespace kelp::effect
