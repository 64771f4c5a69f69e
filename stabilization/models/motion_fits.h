#pragma once

#include <span>
#include <vector>

#include "stabilization/displacements.h"
#include "stabilization/models/matrix3.h"

// The plane motions of one frame: each fit takes a list of displacements and returns the matrix
// that maps source to target best in the weighted least-squares sense. No fit fails: a degenerate
// list gives a minimum-norm or a non-finite matrix, and the last entry is always 1.
namespace marrow::stabilization {

// The weighted mean displacement; 0 / 0 for an empty list or one without weight.
point2 meanTranslation(std::span<const Displacement> list);
matrix3 fitTranslation(std::span<const Displacement> list);

// Scale, rotation and translation (Umeyama, Least-Squares Estimation of Transformation Parameters
// Between Two Point Patterns, 1991). Never mirrors. Where all sources coincide the variance that
// divides the scale is taken as 1.
matrix3 fitSimilarity(std::span<const Displacement> list);

// The direct linear solution on pixel coordinates as they stand, by singular value decomposition:
// the columns range from 1 to 1e6, so normal equations would lose it. The weight multiplies the
// rows, so it enters the cost squared. With fewer than 4 displacements the solution is the
// minimum-norm one. Keeps its work arrays from fit to fit.
class homography_fitter {
 public:
  matrix3 fit(std::span<const Displacement> list);

 private:
  std::vector<double> rows_;  // 2N x 8, column-major
  std::vector<double> right_;
  std::vector<double> work_;
  std::vector<int> integer_work_;
};

matrix3 fitHomography(std::span<const Displacement> list);

// How far, in pixels, the motion takes the source from the target.
double distance_off(const matrix3& motion, const Displacement& d);

// Sum of the nine absolute differences; NaN where either is not finite.
double entry_distance(const matrix3& a, const matrix3& b);

}  // namespace marrow::stabilization
