// Per target: included once for each instruction set, hence no ordinary guard.
#if defined(MARROW_TRACKING_MULTIPLIER_ADD_INL_H_) == defined(HWY_TARGET_TOGGLE)
#ifdef MARROW_TRACKING_MULTIPLIER_ADD_INL_H_
#undef MARROW_TRACKING_MULTIPLIER_ADD_INL_H_
#else
#define MARROW_TRACKING_MULTIPLIER_ADD_INL_H_
#endif

#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {

// a + b, formed by the processor's multipliers where these are units of their own that add too,
// for loops with many more additions than products. A fused 1 a + b rounds once, as a sum does, so
// the bits are the same.
template <class D, class V = hwy::HWY_NAMESPACE::Vec<D>>
HWY_INLINE V AddByMultiplier(D d, V a, V b) {
#if HWY_NATIVE_FMA
  return hwy::HWY_NAMESPACE::MulAdd(a, hwy::HWY_NAMESPACE::Set(d, 1.0f), b);
#else
  (void)d;
  return hwy::HWY_NAMESPACE::Add(a, b);
#endif
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#endif
