#pragma once

#include <cstddef>
#include <cstdint>
#include <limits>
#include <memory>
#include <vector>

#include "platform/memory/line_aligned.h"
#include "tracking/gaussian_smoothing.h"
#include "tracking/gradient_sums.h"
#include "tracking/score_maxima.h"
#include "tracking/selector_params.h"
#include "tracking/track_store.h"

namespace marrow::tracking {

// Finds the points of a frame that can be tracked well: local maxima of the smaller eigenvalue of
// the gradient matrix (Shi and Tomasi, "Good features to track", 1994), best first, at least
// `spacing` apart, none on structures that are too elongated. One selector serves a whole run;
// nothing but buffers carries over from frame to frame, and all are sized by Configure. For each
// frame: write luma() and mask(), call ComputeCandidates, then one of the selections.
class FeatureSelector {
 public:
  struct Candidate {
    std::uint32_t pixel;  // y * width + x
    float score;
  };
  struct Feature {  // in whole pixels
    float x, y, score;
  };

  explicit FeatureSelector(const SelectorParams& params);

  void Configure(std::size_t width, std::size_t height);

  std::size_t width() const { return width_; }
  std::size_t height() const { return height_; }

  // Where the frame goes, width * height each.
  std::uint8_t* luma() { return luma_.data(); }
  std::uint8_t* mask() { return mask_.data(); }  // 0 where no feature may be selected

  // Fills `candidates`, by falling score (equal scores by position).
  void ComputeCandidates();

  // Fill `selected`, best first, with at most params.max_count features. SelectAvoiding keeps away
  // from the cells with a status of 0 or more; it may stop at `limit` features when no more are
  // used.
  void SelectFirst();
  void SelectAvoiding(const tracking_feature<float>* live_features, std::size_t count,
                      std::size_t limit = std::numeric_limits<std::size_t>::max());

  std::vector<Candidate> candidates;
  std::vector<Feature> selected;

 private:
  void CoverDiscAroundFeature(float x, float y);
  void CoverDiscAroundCandidate(std::int64_t column, std::int64_t row);
  void CoverSpan(std::int64_t row, std::int64_t first, std::int64_t last);
  void Select(std::size_t limit);

  SelectorParams params_;
  std::size_t width_ = 0;
  std::size_t height_ = 0;
  std::size_t spacing_ = 0;
  std::vector<std::uint32_t> half_chords_;  // of the disc about a candidate, by distance in rows
  PixelRegion smoothing_region_{};
  PixelRegion scoring_region_{};
  std::vector<std::uint8_t> luma_;
  std::vector<std::uint8_t> mask_;
  std::size_t covered_stride_ = 0;
  std::vector<std::uint64_t> covered_;  // a bit for each pixel; rows are whole words
  std::unique_ptr<SeparableSmoother> smoother_;
  std::unique_ptr<GradientSums> gradient_sums_;
  memory::LineAlignedVector<float> score_rows_;  // the last three rows of scores, folded
  std::vector<score_maximum> maxima_;
};

}  // namespace marrow::tracking
