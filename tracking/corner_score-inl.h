// Per target: included once for each instruction set, hence no ordinary guard.
#if defined(MARROW_TRACKING_CORNER_SCORE_INL_H_) == defined(HWY_TARGET_TOGGLE)
#ifdef MARROW_TRACKING_CORNER_SCORE_INL_H_
#undef MARROW_TRACKING_CORNER_SCORE_INL_H_
#else
#define MARROW_TRACKING_CORNER_SCORE_INL_H_
#endif

#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {

// Twice the smaller eigenvalue of each gradient matrix (Shi and Tomasi, 1994): with a, b, c the
// sums of Ix Ix, Iy Iy, Ix Iy, t = a + b and d = sqrt(t t - 4 (a b - c c)), the score is t - d. It
// is 0 where the structure is too elongated, that is where t + d > score * most_ratio. By rounding,
// the radicand of a round corner can come out below 0, and a NaN would drop the corner and its
// neighbours.
template <class D, class V = hwy::HWY_NAMESPACE::Vec<D>>
HWY_INLINE V CornerScore(D d, V a, V b, V c, V most_ratio) {
  namespace hn = hwy::HWY_NAMESPACE;
  const auto t = hn::Add(a, b);
  const auto determinant = hn::Sub(hn::Mul(a, b), hn::Mul(c, c));
  const auto radicand = hn::Sub(hn::Mul(t, t), hn::Mul(hn::Set(d, 4.0f), determinant));
  const auto root = hn::Sqrt(hn::Max(radicand, hn::Zero(d)));
  const auto score = hn::Sub(t, root);
  const auto elongated = hn::Gt(hn::Add(t, root), hn::Mul(score, most_ratio));
  return hn::IfThenZeroElse(elongated, score);
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#endif
