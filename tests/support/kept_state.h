#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>

#include "stabilization/crop/cropper.h"
#include "stabilization/warp/cp_warper.h"
#include "tracking/track_store.h"

// What an instance or a project keeps, as tests read it and put other things in its place: the one
// place that knows how StabilizerState and SavedState hold it.
namespace kelp::effect {

// With its first_frame.
template <class Kept>
marrow::tracking::AllFeatures TableOf(const Kept& kept) {
  marrow::tracking::AllFeatures table = kept.all_features;
  if constexpr (requires { kept.first_frame; }) table.first_frame = kept.first_frame;
  return table;
}
template <class Kept>
void KeepTable(Kept& kept, const marrow::tracking::AllFeatures& table) {
  kept.all_features = table;
  if constexpr (requires { kept.first_frame; }) kept.first_frame = table.first_frame;
}
template <class Kept>
void KeepFieldType(Kept& kept, std::int32_t field_type) {
  kept.job_input.FieldType = field_type;
}
template <class Kept>
void KeepWarps(Kept& kept, const boost::shared_ptr<const marrow::stabilization::CPWarper>& warper) {
  kept.warper = warper;
}
template <class Kept>
void KeepCrop(Kept& kept, const boost::shared_ptr<const cropper>& crop) {
  kept.crop = crop;
}

}  // namespace kelp::effect
