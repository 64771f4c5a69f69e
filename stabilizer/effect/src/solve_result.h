#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>

#include "stabilization/crop/cropper.h"
#include "stabilization/warp/cp_warper.h"

namespace kelp::effect {

// What has become of an instance's solve; stored in projects.
enum class SolvePhase : std::int32_t { None = 0, Solved = 2, Failed = 4, AnalysisFailed = 5 };

// What a solve gave, and the hashes of its parameters. Instances, renders and saves share a record
// of it, which therefore never changes; see analysis::Replace.
struct SolveResult {
  // Of a solve that succeeded; one record a row of the track table.
  boost::shared_ptr<const marrow::stabilization::CPWarper> warper;
  boost::shared_ptr<const cropper> crop;  // null if none was asked for
  // SolveHash and CropHash of the parameters; beyond 32 bits where no parameters may fit.
  std::int64_t solve_hash = 0;
  std::int64_t crop_hash = 0;
};

}  // namespace kelp::effect
