#include "stabilization/warp/model_scores.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <map>
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
                                  double methodLevel, const progress_functor& progress) {
  const auto frames = static_cast<std::size_t>(frameCount_);
  overrideFlags_.assign(frames, false);
  overrideParams_.assign(4 * frames, 0.0);
  std::vector<bool> covered(frames, false);
  for (const factorization_window& window : windows) {
    const std::size_t end = std::min<std::size_t>(window.end, frames);
    for (std::size_t f = window.first; f < end; ++f) covered[f] = true;
  }
  // Motions that frames' targets must agree with. Where records overlap it is each of theirs.
  std::multimap<std::size_t, matrix3> stored;
  for (const transition_record& record : transitionWindows) {
    const std::size_t end = std::min<std::size_t>(record.end, frames);
    for (std::size_t f = record.first; f < end; ++f) {
      const std::size_t from = 4 * (f - record.first);
      for (std::size_t k = 0; k < 4 && from + k < record.motion.size(); ++k) {
        overrideParams_[4 * f + k] = record.motion[from + k];
      }
      if (!covered[f]) overrideFlags_[f] = true;
      if (overrideFlags_[f]) stored.emplace(f, storedSimilarity(f));
    }
  }
  progress();

  std::vector<double> weights(frames, 0.0), medians(frames);
  std::vector<double> errors(frames, -std::numeric_limits<double>::infinity());  // exempt
  homography_fitter homography;
  robust_walk walk(*tracks_, kOutlierRampFrames, 0,
                   [&](std::size_t f, const std::vector<Displacement>& list) {
                     for (const Displacement& d : list) weights[f] += d.weight;
                     const auto [first, last] = stored.equal_range(f);
                     for (auto at = first; at != last; ++at) {
                       checkConsistency(f, list, at->second);
                     }
                   });
  for (std::size_t f = 0; f < frames; ++f) {
    progress();
    const auto [list, median] = walk.next();
    medians[f] = median;
    if (list.size() <= kMostEntriesExemptFromSanity) continue;
    errors[f] = entry_distance(fitSimilarity(list), homography.fit(list));
  }

  modelScore_.assign(frames, -1.0);
  for (std::size_t f = 0; f < frames; ++f) {
    modelScore_[f] = weights[f] >= kLeastWeightSum ? std::min(methodLevel, kMostComplexScore) : 0.0;
    if (overrideFlags_[f] && methodLevel >= kSimilarityScore) modelScore_[f] = kSimilarityScore;
    tessel::debug::Log("frame %d weight %f score %f\n", static_cast<int>(f), weights[f],
                       modelScore_[f]);
    if (!(modelScore_[f] >= 1.0)) modelScore_[f] = 1.0;
  }
  ramp_scores(modelScore_, kModelRampFrames);
  for (std::size_t f = 0; f < frames; ++f) {
    if (modelScore_[f] <= kSimilarityScore) continue;
    if (medians[f] / frameWidth_ > kLargestDeviation) {
      tessel::debug::Log("Limiting frame %d to similarity, too high median deviation\n",
                         static_cast<int>(f));
    } else if (!(errors[f] < homographyLimit_)) {
      tessel::debug::Log("Limiting frame %d to similarity because of error %f\n",
                         static_cast<int>(f), errors[f]);
    } else {
      continue;
    }
    modelScore_[f] = kSimilarityScore;
  }
  ramp_scores(modelScore_, kModelRampFrames);
}

void CPWarper::checkConsistency(std::size_t frame, const std::vector<Displacement>& list,
                                const matrix3& stored) {
  for (const Displacement& d : list) {
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

}  // namespace marrow::stabilization
