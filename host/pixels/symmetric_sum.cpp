#include "host/pixels/symmetric_sum.h"

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "host/pixels/symmetric_sum.cpp"
#include <hwy/foreach_target.h>  // IWYU pragma: keep
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace calmframe::host {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// Four vectors at a time, so that a kernel's weight is spread once for all of them and the sums
// don't wait for each other.
void Sum(const float* const* taps, const float* kernel, std::size_t reach, std::size_t size,
         float* sums) {
  const hn::CappedTag<float, 16> d;
  const std::size_t lanes = hn::Lanes(d);
  const float* const* const middle = taps + reach;
  for (std::size_t i = 0; i < size; i += 4 * lanes) {
    const float* p = middle[0] + i;
    const auto first = hn::Set(d, kernel[0]);
    auto sum0 = hn::Mul(first, hn::LoadU(d, p));
    auto sum1 = hn::Mul(first, hn::LoadU(d, p + lanes));
    auto sum2 = hn::Mul(first, hn::LoadU(d, p + 2 * lanes));
    auto sum3 = hn::Mul(first, hn::LoadU(d, p + 3 * lanes));
    for (std::size_t k = 1; k <= reach; ++k) {
      const auto weight = hn::Set(d, kernel[k]);
      const float* const a = *(middle - k) + i;
      const float* const b = *(middle + k) + i;
      const auto pair = [&](std::size_t at) {
        return hn::Add(hn::LoadU(d, a + at), hn::LoadU(d, b + at));
      };
      sum0 = hn::MulAdd(weight, pair(0), sum0);
      sum1 = hn::MulAdd(weight, pair(lanes), sum1);
      sum2 = hn::MulAdd(weight, pair(2 * lanes), sum2);
      sum3 = hn::MulAdd(weight, pair(3 * lanes), sum3);
    }
    hn::StoreU(sum0, d, sums + i);
    hn::StoreU(sum1, d, sums + i + lanes);
    hn::StoreU(sum2, d, sums + i + 2 * lanes);
    hn::StoreU(sum3, d, sums + i + 3 * lanes);
  }
}

}  // namespace HWY_NAMESPACE
}  // namespace calmframe::host
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace calmframe::host {
HWY_EXPORT(Sum);

std::size_t PaddedForSum(std::size_t size) {
  constexpr std::size_t kMostAtOnce = 4 * 16;
  return (size + kMostAtOnce - 1) / kMostAtOnce * kMostAtOnce;
}

void SymmetricSum(const float* const* taps, const std::vector<float>& kernel, std::size_t size,
                  float* sums) {
  HWY_DYNAMIC_DISPATCH(Sum)(taps, kernel.data(), kernel.size() - 1, size, sums);
}
}  // namespace calmframe::host
#endif
