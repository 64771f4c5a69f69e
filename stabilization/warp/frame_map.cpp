#include "stabilization/warp/frame_map.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <cmath>
#include <limits>
#include <stdexcept>
#include <vector>

#include "platform/tessel/debug.h"
#include "stabilization/models/motion_fits.h"
#include "stabilization/models/robust_pass.h"
#include "stabilization/warp/cp_warper.h"

namespace marrow::stabilization {
namespace {

constexpr std::size_t kLeastShared = 6;
constexpr double kLargestDistance = 50.0;   // of a homography from the similarity, entry by entry
constexpr double kLargestElation = 0.0001;  // mean of the bottom row's two entries

// y first on each of the two columns, then x.
point2 sample_grid(const VarVector& grid, const Displacement& d) {
  const point2 a = grid.vertex(d.cellX, d.cellY), b = grid.vertex(d.cellX + 1, d.cellY);
  const point2 c = grid.vertex(d.cellX, d.cellY + 1), e = grid.vertex(d.cellX + 1, d.cellY + 1);
  const point2 left = {a.x + (c.x - a.x) * d.fracY, a.y + (c.y - a.y) * d.fracY};
  const point2 right = {b.x + (e.x - b.x) * d.fracY, b.y + (e.y - b.y) * d.fracY};
  return {left.x + (right.x - left.x) * d.fracX, left.y + (right.y - left.y) * d.fracX};
}

}  // namespace

bool CPWarper::alignFrameMtoN(std::int32_t M, std::int32_t N,
                              matrix3& output_n_from_source_m) const {
  if (!driven_) {
    throw std::runtime_error(
        "alignFrameMtoN can't be called because CPWarper needs drive() called first");
  }
  if (N < 0 || N >= frameCount_) return false;
  const auto frame = static_cast<std::size_t>(N);
  return alignFrameMtoN(M, N, displacements(frame), *frameWarp(frame), output_n_from_source_m);
}

bool CPWarper::alignFrameMtoN(std::int32_t M, std::int32_t N, const std::vector<Displacement>& all,
                              const VarVector& warp, matrix3& output_n_from_source_m) const {
  if (all.empty()) return false;
  std::vector<Displacement> shared = all;
  for (std::size_t i = 0; i < shared.size();) {
    Displacement& d = shared[i];
    if (M < d.track->first || M >= d.track->last) {
      d = shared.back();
      shared.pop_back();
      continue;
    }
    const track_sample& source = global_->input_at(M, d.track->feature);
    d.sourceX = source.x;
    d.sourceY = source.y;
    const point2 target = sample_grid(warp, d);
    d.targetX = target.x;
    d.targetY = target.y;
    ++i;
  }
  tessel::debug::Log("Displacements frame %d number %d, reduced to %d for frame %d\n", N,
                     static_cast<int>(all.size()), static_cast<int>(shared.size()), M);
  if (shared.size() < kLeastShared) return false;
  if (modelScore_[N] < 2.0) {
    output_n_from_source_m = fitTranslation(shared);
    return true;
  }
  const matrix3 homography = fitHomography(shared);
  const matrix3 similarity = fitSimilarity(shared);
  const double distance = entry_distance(similarity, homography);
  const double elation = (std::fabs(homography[7]) + std::fabs(homography[6])) * 0.5;
  if (elation > kLargestElation && distance < kLargestDistance) {
    tessel::debug::Log("Limiting alignMtoN homography because of high elation\n");
  }
  const bool sane = distance < kLargestDistance && elation <= kLargestElation;
  output_n_from_source_m = sane ? homography : similarity;
  return true;
}

bool CPWarper::warpedGridOfFrame(std::int32_t M, std::int32_t N, std::vector<double>& grid) const {
  matrix3 m;
  if (!(frameMap_ ? frameMap_->lookup(M, N, m) : driven_ && alignFrameMtoN(M, N, m))) return false;
  grid = gridUnder(m).values;
  return true;
}

void CPWarper::makeFrameMap(std::uint32_t radius, const progress_functor& progress) {
  constexpr std::uint32_t kMost = std::numeric_limits<std::int32_t>::max();
  const auto wanted = static_cast<std::int32_t>(std::min(radius, kMost));
  // No pair lies further apart than the clip is long.
  const std::int32_t reach = std::min(wanted, frameCount_);
  MtoNMap::entries_t entries;
  if (reach > 0) {
    robust_walk walk(*tracks_, kOutlierRampFrames);
    for (std::int32_t n = 0; n < frameCount_; ++n) {
      progress();
      const auto frame = static_cast<std::size_t>(n);
      std::vector<Displacement> list = walk.next().list;
      locateInRestGrid(list);
      moveSources(list, bases_[frame], gridUnder(bases_[frame]));
      const boost::shared_ptr<const VarVector> warp = frameWarp(frame);
      const std::int32_t last = std::min(n + reach, frameCount_ - 1);
      for (std::int32_t m = std::max(n - reach, 0); m <= last; ++m) {
        matrix3 motion;
        if (m != n && alignFrameMtoN(m, n, list, *warp, motion)) {
          entries.emplace(std::pair(m, n), motion);
        }
      }
    }
  }
  frameMap_ = boost::make_shared<const MtoNMap>(frameCount_, wanted, std::move(entries));
}

boost::shared_ptr<CPWarper> CPWarper::withFrameMap(std::uint32_t radius,
                                                   const progress_functor& progress) const {
  const boost::shared_ptr<CPWarper> warper(new CPWarper(*this));
  if (driven_) warper->makeFrameMap(radius, progress);
  return warper;
}

MtoNMap::MtoNMap(std::int32_t frameCount, std::int32_t radius, entries_t entries)
    : frameCount_(frameCount), radius_(radius), entries_(std::move(entries)) {}

bool MtoNMap::lookup(std::int32_t M, std::int32_t N, matrix3& output_n_from_source_m) const {
  if (M == N) return false;
  const auto found = entries_.find({M, N});
  if (found == entries_.end()) return false;
  output_n_from_source_m = found->second;
  return true;
}

}  // namespace marrow::stabilization
