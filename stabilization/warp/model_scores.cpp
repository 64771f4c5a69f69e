#include "stabilization/warp/model_scores.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <stdexcept>

#include "platform/tessel/debug.h"
#include "stabilization/models/motion_fits.h"
#include "stabilization/models/robust_pass.h"
#include "stabilization/warp/cp_warper.h"

namespace marrow::stabilization {
namespace {

constexpr double kSimilarityScore = 2.0;
constexpr double kMostComplexScore = 4.0;
constexpr double kLeastWeightSum = 0.0001;
constexpr double kLargestDeviation = 0.15;             // of the frame's width
constexpr double kConsistency = 0.009999999776482582;  // pixels
constexpr std::size_t kMostEntriesExemptFromSanity = 5;

}  // namespace

void ramp_scores(std::span<double> scores, std::int32_t ramp_frames) {
  const auto count = static_cast<std::int32_t>(scores.size());
  const std::int32_t reach = 3 * ramp_frames;
  for (std::int32_t i = 0; i < count; ++i) {
    const std::int32_t last = std::min(i + reach, count - 1);
    for (std::int32_t j = std::max(i - reach, 0); j <= last; ++j) {
      if (j == i) continue;
      const double most = static_cast<double>(std::abs(i - j)) / ramp_frames + scores[j];
      if (most < scores[i]) scores[i] = most;
    }
  }
}

void CPWarper::computeModelScores(const std::vector<factorization_window>& windows,
                                  const std::vector<transition_record>& transitionWindows,
                                  double methodLevel) {
  const auto frames = static_cast<std::size_t>(frameCount_);
  modelScore_.assign(frames, -1.0);
  overrideFlags_.assign(frames, false);
  overrideParams_.assign(4 * frames, 0.0);
  std::vector<bool> covered(frames, false);
  for (const factorization_window& window : windows) {
    const std::size_t end = std::min<std::size_t>(window.end, frames);
    for (std::size_t f = window.first; f < end; ++f) covered[f] = true;
  }

  std::vector<double> weights(frames, 0.0);
  for (std::size_t f = 0; f < frames; ++f) {
    for (const Displacement& d : (*frameDisplacements_)[f]) weights[f] += d.weight;
    modelScore_[f] = weights[f] >= kLeastWeightSum ? std::min(methodLevel, kMostComplexScore) : 0.0;
  }

  for (const transition_record& record : transitionWindows) {
    const std::size_t end = std::min<std::size_t>(record.end, frames);
    for (std::size_t f = record.first; f < end; ++f) {
      const std::size_t from = 4 * (f - record.first);
      for (std::size_t k = 0; k < 4 && from + k < record.motion.size(); ++k) {
        overrideParams_[4 * f + k] = record.motion[from + k];
      }
      if (covered[f]) continue;
      if (methodLevel >= kSimilarityScore) modelScore_[f] = kSimilarityScore;
      overrideFlags_[f] = true;
    }
    for (std::size_t f = record.first; f < end; ++f) {
      if (overrideFlags_[f]) checkConsistency(f);
    }
  }

  for (std::size_t f = 0; f < frames; ++f) {
    tessel::debug::Log("frame %d weight %f score %f\n", static_cast<int>(f), weights[f],
                       modelScore_[f]);
    if (!(modelScore_[f] >= 1.0)) modelScore_[f] = 1.0;
  }
  ramp_scores(modelScore_, kModelRampFrames);
}

void CPWarper::checkConsistency(std::size_t frame) const {
  const matrix3 stored = storedSimilarity(frame);
  for (const Displacement& d : (*frameDisplacements_)[frame]) {
    const double dx = d.targetX - (stored[0] * d.sourceX + stored[1] * d.sourceY + stored[2]);
    const double dy = d.targetY - (stored[3] * d.sourceX + stored[4] * d.sourceY + stored[5]);
    if (std::fabs(dx) <= kConsistency && std::fabs(dy) <= kConsistency) continue;
    tessel::debug::Log(
        "\nHomograph is not consistent with displacements on frame %d, differenc is (%f,%f)\n",
        static_cast<int>(frame), dx, dy);
    throw std::runtime_error("Homograph is not consistent with displacements on frame");
  }
}

matrix3 CPWarper::storedSimilarity(std::size_t frame) const {
  const double* p = &overrideParams_[4 * frame];
  return similarity_matrix(p[0], p[1], p[2], p[3]);
}

void CPWarper::limitByDeviation(const progress_functor& progress) {
  for (std::size_t f = 0; f < frameDisplacements_->size(); ++f) {
    progress();
    const double median = medianDeviation((*frameDisplacements_)[f]);
    if (median / frameWidth_ > kLargestDeviation && modelScore_[f] > kSimilarityScore) {
      modelScore_[f] = kSimilarityScore;
      tessel::debug::Log("Limiting frame %d to similarity, too high median deviation\n",
                         static_cast<int>(f));
    }
  }
  fade_about_outliers(*frameDisplacements_, 0, frameCount_, kOutlierRampFrames, progress);
}

void CPWarper::limitByHomographySanity(const progress_functor& progress) {
  homography_fitter homography;
  for (std::size_t f = 0; f < frameDisplacements_->size(); ++f) {
    const std::vector<Displacement>& list = (*frameDisplacements_)[f];
    if (list.size() <= kMostEntriesExemptFromSanity) continue;
    progress();
    const double error = entry_distance(fitSimilarity(list), homography.fit(list));
    if (!(error < homographyLimit_) && modelScore_[f] > kSimilarityScore) {
      modelScore_[f] = kSimilarityScore;
      tessel::debug::Log("Limiting frame %d to similarity because of error %f\n",
                         static_cast<int>(f), error);
    }
  }
  ramp_scores(modelScore_, kModelRampFrames);
}

}  // namespace marrow::stabilization
