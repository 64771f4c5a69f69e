#pragma once

#include <cstddef>
#include <vector>

namespace marrow::tracking {

// A half-open rectangle of pixels; empty where an end is not above its start.
struct PixelRegion {
  std::size_t x0, y0, x1, y1;
  bool empty() const { return x1 <= x0 || y1 <= y0; }
};

// The Gaussian of standard deviation sigma (pixels), integrated over each pixel by the error
// function and normalised to sum 1: 2 r + 1 taps, r = trunc(3.5 sigma + 0.5).
std::vector<float> IntegratedGaussian(double sigma);

// Convolves images with a symmetric kernel along x, then along y. Every pixel runs the same 32-bit
// operations in the same order on every instruction set, so a constant image stays exactly
// constant.
class SeparableSmoother {
 public:
  // Rows that the pass along y makes together: so many share what they read.
  static constexpr std::size_t kRowsAtOnce = 4;

  // An odd number of taps, symmetric about the middle one; lines of at most max_width pixels.
  SeparableSmoother(std::vector<float> kernel, std::size_t max_width);

  // Smooths a region of an image in place, rows `stride` samples apart. Past the region's edges its
  // edge pixels repeat.
  void Smooth(float* image, std::size_t stride, const PixelRegion& region);

 private:
  std::vector<float> taps_;         // middle tap first
  std::size_t ring_stride_;         // width rounded up to whole vectors
  std::vector<float> padded_;       // one row with its edges repeated
  std::vector<float> ring_;         // the rows that are at hand, smoothed along x
  std::vector<const float*> rows_;  // in the ring: those that a few neighbouring rows depend on
};

}  // namespace marrow::tracking
