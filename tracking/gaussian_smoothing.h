#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "platform/memory/line_aligned.h"
#include "tracking/folded_rows.h"

namespace marrow::tracking {

// A half-open rectangle of pixels; empty where an end is not above its start.
struct PixelRegion {
  std::size_t x0, y0, x1, y1;
  bool empty() const { return x1 <= x0 || y1 <= y0; }
};

// The Gaussian of standard deviation sigma (pixels), integrated over each pixel by the error
// function and normalised to sum 1: 2 r + 1 taps, r = trunc(3.5 sigma + 0.5).
std::vector<float> IntegratedGaussian(double sigma);

// Convolves images of bytes with a symmetric kernel along x, then along y, and gives the rows out
// folded, one by one while they are in the cache. Every pixel runs the same 32-bit operations in
// the same order on every instruction set, so a constant image stays exactly constant; with the
// kernel {1} rows are the image's own values.
class SeparableSmoother {
 public:
  // Neighbours that a pass makes together, at most: so many share what they read.
  static constexpr std::size_t kMostAtOnce = 8;

  // An odd number of taps, symmetric about the middle one; lines of at most max_width pixels.
  // kept_rows: so many of the last rows stay at hand.
  SeparableSmoother(std::vector<float> kernel, std::size_t max_width, std::size_t kept_rows);

  // Starts on a region of an image with rows `stride` samples apart, not empty. Past the region's
  // edges its edge pixels repeat. The image must stay unchanged until the last row is read.
  void Start(const std::uint8_t* image, std::size_t stride, const PixelRegion& region);

  // How rows are folded; its columns are the region's.
  const RowFolding& folding() const { return folding_; }

  // Row y of the region, with a halo of one position, valid until row y + kept_rows is asked for;
  // no row may be asked for kept_rows or more before the last one.
  const float* Row(std::size_t y);

 private:
  float* RingRow(std::size_t y);
  float* SmoothRow(std::size_t y);
  void PutIntoRing(std::size_t y);
  void MakeRows();

  std::vector<float> taps_;                  // middle tap first
  std::vector<std::uint8_t> padded_;         // one row with its last pixel repeated
  memory::LineAlignedVector<float> folded_;  // the same, with a halo of the taps' radius
  std::size_t ring_stride_;
  memory::LineAlignedVector<float> ring_;  // the rows that are at hand, smoothed along x
  std::vector<const float*> rows_;  // in the ring: those that a few neighbouring rows depend on
  std::size_t smooth_stride_;
  std::size_t smooth_rows_;  // in smooth_, a multiple of kMostAtOnce
  memory::LineAlignedVector<float>
      smooth_;  // the last rows, smoothed both ways, one after the other
  const std::uint8_t* image_ = nullptr;
  std::size_t stride_ = 0;
  PixelRegion region_{};
  RowFolding folding_;
  std::size_t in_ring_ = 0;  // rows that were put into the ring
  std::size_t made_ = 0;     // rows that were put into smooth_
};

}  // namespace marrow::tracking
