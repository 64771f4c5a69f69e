#pragma once

#include <cstdint>
#include <functional>
#include <span>
#include <vector>

#include "stabilization/displacements.h"

namespace marrow::stabilization {

// The median residual, in pixels, of a list about its similarity. Marks entries farther off than
// three times the unit d = max(median, 0.5) as outliers and multiplies their weight by
// exp(-2 (r - 3)), r the distance in units, or by 0 from r = 4.75. Lists of fewer than 6 are left
// alone, with 0.
double medianDeviation(std::span<Displacement> list);

// Lets every outlier of frames [first, end) fade in and out along its track: k frames away, inside
// that range, the weight is at most k / ramp_frames more than the outlier's, for k up to
// ramp_frames.
void fade_about_outliers(displacement_lists& lists, std::int32_t first, std::int32_t end,
                         std::int32_t ramp_frames);
// The same for the outliers of lists[frame] alone.
void fade_about_outliers_of(std::span<std::vector<Displacement>> lists, std::size_t frame,
                            std::int32_t ramp_frames);

// The lists of a clip behind both steps, one frame after the other. An outlier reaches ramp_frames
// far, so that no more than two such stretches of lists exist at a time.
class robust_walk {
 public:
  // Called with each frame's list before the robust pass, in ascending order.
  using look = std::function<void(std::size_t frame, const std::vector<Displacement>& list)>;

  // From a frame on. A walk over all frames from 0 gives the same lists. `tracks` must outlive it.
  robust_walk(const blended_tracks& tracks, std::int32_t ramp_frames, std::size_t first_frame = 0,
              look before = {});

  struct step {
    std::vector<Displacement> list;
    double median_deviation;
  };
  // Of the next frame; there must be one.
  step next();

 private:
  void read();

  const std::size_t frame_count_;
  const std::size_t ramp_;
  const look before_;
  displacement_stream stream_;
  displacement_lists lists_;  // from frame base_ on, those that were read
  std::vector<double> medians_;
  std::size_t base_;
  std::size_t next_;   // to be given
  std::size_t faded_;  // the first frame whose outliers have not faded yet
};

}  // namespace marrow::stabilization
