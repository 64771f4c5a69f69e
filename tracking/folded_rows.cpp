#include "tracking/folded_rows.h"

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/folded_rows.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

constexpr std::size_t kSegments = RowFolding::kSegments;
using Floats = hn::CappedTag<float, kSegments>;

// out[16 p + i] = in[i stride + p] for p and i from 0 to 15.
HWY_INLINE void TransposeBytes(const std::uint8_t* in, std::size_t stride, std::uint8_t* out) {
#if HWY_TARGET == HWY_SCALAR
  for (std::size_t p = 0; p < 16; ++p) {
    for (std::size_t i = 0; i < 16; ++i) out[16 * p + i] = in[i * stride + p];
  }
#else
  // Each round doubles the length of the pieces of a column that lie together.
  const hn::Full128<std::uint8_t> d;
  hn::Vec<decltype(d)> rows[16], mixed[16];
  for (std::size_t i = 0; i < 16; ++i) rows[i] = hn::LoadU(d, in + i * stride);
  const auto mix = [d](const auto* from, auto* to) HWY_ATTR {
    for (std::size_t i = 0; i < 8; ++i) {
      to[2 * i] = hn::InterleaveLower(d, from[i], from[i + 8]);
      to[2 * i + 1] = hn::InterleaveUpper(d, from[i], from[i + 8]);
    }
  };
  mix(rows, mixed);
  mix(mixed, rows);
  mix(rows, mixed);
  mix(mixed, rows);
  for (std::size_t p = 0; p < 16; ++p) hn::StoreU(rows[p], d, out + 16 * p);
#endif
}

void FoldRowKernel(const std::uint8_t* row, std::size_t positions, float* folded) {
  const Floats d;
  const hn::RebindToSigned<Floats> di;
  const hn::Rebind<std::uint8_t, Floats> d8;
  const std::size_t N = hn::Lanes(d);
  HWY_ALIGN std::uint8_t bytes[16 * kSegments];
  for (std::size_t p = 0; p < positions; p += 16) {
    TransposeBytes(row + p, positions, bytes);
    float* out = folded + p * kSegments;
    for (std::size_t i = 0; i < 16 * kSegments; i += N) {
      hn::StoreU(hn::ConvertTo(d, hn::PromoteTo(di, hn::LoadU(d8, bytes + i))), d, out + i);
    }
  }
}

// Outwards: each position takes the lanes of the one that lies a segment further in.
void FillHaloKernel(float* folded, std::size_t positions, std::size_t halo, float left,
                    float right) {
  const Floats d;
  const std::size_t N = hn::Lanes(d);
  const std::size_t segment = positions * kSegments;
  float* before = folded;
  float* behind = folded + segment;
  for (std::size_t k = 0; k < halo; ++k, behind += kSegments) {
    before -= kSegments;
    for (std::size_t i = 0; i < kSegments; i += N) {
      hn::StoreU(hn::LoadU(d, before + segment + i - 1), d, before + i);
      hn::StoreU(hn::LoadU(d, behind - segment + i + 1), d, behind + i);
    }
    before[0] = left;
    behind[kSegments - 1] = right;
  }
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {

HWY_EXPORT(FoldRowKernel);
HWY_EXPORT(FillHaloKernel);

void FoldRow(const std::uint8_t* row, std::size_t positions, float* folded) {
  HWY_DYNAMIC_DISPATCH(FoldRowKernel)(row, positions, folded);
}

void FillHalo(float* folded, std::size_t positions, std::size_t halo, float left, float right) {
  HWY_DYNAMIC_DISPATCH(FillHaloKernel)(folded, positions, halo, left, right);
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
