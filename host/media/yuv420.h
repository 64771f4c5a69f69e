#pragma once

#include <cstddef>
#include <vector>

#include "host/media/colour_model.h"
#include "host/media/ffmpeg.h"
#include "host/media/resampling_taps.h"
#include "platform/hx/hx_pixel.h"

namespace calmframe::media {

// Planes of 4:2:0 in 8 bits, what most clips hold, to pixels of 8 bits and back, in floats, each
// sample rounded once. Up, a row of chroma is widened across, then each row of pixels takes its own
// from four of them; down, rows are joined first. What was read is still in the cache when
// pixels or code words are made of it: no picture of floats is ever in memory.
class Yuv420 {
 public:
  // 64 x 32 pixels and more.
  static bool Takes(AVPixelFormat format, int width, int height);

  // Progressive. Errors: std::bad_alloc.
  Yuv420(int width, int height, const ColourModel& model);

  bool Fits(int width, int height, const ColourModel& model) const {
    return width == plan_.width && height == plan_.height && model == model_;
  }
  // The frame and the pixels are of the size told above, at any alignment.
  void ToPixels(const AVFrame& frame, HX_Pixel8* pixels, std::ptrdiff_t row_bytes);
  // Pixels stand over black.
  void FromPixels(const HX_Pixel8* pixels, std::ptrdiff_t row_bytes, AVFrame& frame);

  // Taps of a row's samples, of which all but those at the ends are alike: sample i begins at
  // i / period * step + first[i % period] and has weights[i % period], 0 where there are less.
  struct Across {
    Across(const ResamplingTaps& all, int every, int steps);
    ResamplingTaps taps;
    int period, step;
    int first[2];
    float weights[2][8];
    std::vector<int> ends;  // samples that are not like the others
  };
  struct Plan {
    int width, height;
    Across up_across, down_across;
    ResamplingTaps up_rows, down_rows;
    float luma_unit, luma_zero, chroma_unit, chroma_zero;     // what code word 1 adds, what 0 means
    float luma_range, luma_black, chroma_range, chroma_grey;  // and back
    float red_v, green_u, green_v, blue_u;                    // what chroma adds to luma
    float y[3], u[3], v[3];                                   // of red, green and blue
  };

 private:
  float* Memory();

  const ColourModel model_;
  const Plan plan_;
  std::vector<float> memory_;
};

}  // namespace calmframe::media
