#pragma once

#include <cstddef>

#include "platform/hx/hx_pixel.h"

// Bilinear samples of a source along straight runs of output pixels.
namespace marrow::render {

// Source position of pixel k of a run, k = 0 .. count - 1: x + k * dx / (1 + g * k), and the same
// for y. It is the exact form of a projective map along a row.
template <class Pixel>
struct source_run {
  double x;
  double y;
  double dx;
  double dy;
  double g;
  int count;   // 1 .. max_run
  Pixel* out;  // any alignment
};

struct source_plane {
  const unsigned char* data;  // any alignment
  std::ptrdiff_t row_bytes;   // of 32 bits
  int width;                  // 2 .. 2^22, as there are always two neighbours to read
  int height;
  double max_x;  // positions are clamped to 0.0001 .. max_x
  double max_y;
};

// The longest run: positions are computed in f32 relative to the run's start, so that their error
// stays below 2e-5 pixels wherever in the source the run lies.
inline constexpr int max_run = 64;

// Writes the samples of each run in turn; quickest where each begins at the pixel past the one
// before. Colours are weighted by alpha; where no neighbour has any
// the sample is all zero. Positions that are not finite sample the top left.
void SampleRuns(const source_plane& source, const source_run<HX_Pixel8>* runs, std::size_t n);
void SampleRuns(const source_plane& source, const source_run<HX_Pixel16>* runs, std::size_t n);
void SampleRuns(const source_plane& source, const source_run<HX_PixelFloat>* runs, std::size_t n);

}  // namespace marrow::render
