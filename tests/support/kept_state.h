#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>

#include "analysis/src/analysis_result.h"
#include "stabilization/crop/cropper.h"
#include "stabilization/warp/cp_warper.h"
#include "tracking/track_store.h"

// What an instance or a project keeps, as tests read it and put other things in its place: the one
// place that knows how StabilizerState and SavedState hold it.
namespace kelp::effect {

// With its first_frame.
template <class Kept>
marrow::tracking::AllFeatures TableOf(const Kept& kept) {
  return kept.result->all_features;
}
template <class Kept>
void KeepTable(Kept& kept, const marrow::tracking::AllFeatures& table) {
  analysis::Replace(kept.result, [&](auto& result) { result.all_features = table; });
}
template <class Kept>
void KeepWarps(Kept& kept, const boost::shared_ptr<const marrow::stabilization::CPWarper>& warper) {
  analysis::Replace(kept.solve_result, [&](auto& solve) { solve.warper = warper; });
}
template <class Kept>
void KeepCrop(Kept& kept, const boost::shared_ptr<const cropper>& crop) {
  analysis::Replace(kept.solve_result, [&](auto& solve) { solve.crop = crop; });
}

}  // namespace kelp::effect
