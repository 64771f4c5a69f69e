#pragma once

#include <cstdint>

namespace marrow::tracking {

// One cell. x and y are source pixels of this frame, pixel centres at whole numbers, meaningful
// where status >= 0. correlation is the mean normalised cross-correlation of the feature's first
// window with this frame, -1 to 1, written by the affine verification alone.
template <class Real>
struct tracking_feature {
  Real x;
  Real y;
  std::int32_t status;  // see feature_status
  Real correlation;
};

}  // namespace marrow::tracking
