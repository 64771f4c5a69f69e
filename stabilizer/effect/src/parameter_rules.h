#pragma once

#include <cstdint>

#include "effect/parameter_reader.h"
#include "effect/source_shape.h"
#include "stabilization/solver_params.h"

// How parameters become the record of a solve.
namespace kelp::effect {

// source: that was analysed; frame_rate: frames a second, also of an interlaced clip.
marrow::stabilization::SolverParamsRecord GetSolverParams(const ParameterReader& params,
                                                          const SourceShape& source,
                                                          double frame_rate);

}  // namespace kelp::effect
