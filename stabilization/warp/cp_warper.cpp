#include "stabilization/warp/cp_warper.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <cmath>
#include <stdexcept>
#include <utility>

#include "platform/tessel/debug.h"
#include "stabilization/models/inverse_bilinear.h"
#include "stabilization/models/robust_pass.h"
#include "stabilization/models/similarity.h"
#include "stabilization/warp/grid_solver.h"

namespace marrow::stabilization {
namespace {

constexpr double kWholeScore = 1e-5;     // a score this near to a whole number is that number
constexpr double kCountedWeight = 1e-5;  // lighter displacements cannot call for the sparse solve
constexpr double kExactSquare = 1e-8;    // squared pixels

// What bounds start from. The maximum is the smallest normal float, not the lowest.
constexpr frame_bounds kNothing = {3.4028234663852886e38, 3.4028234663852886e38,
                                   1.1754943508222875e-38, 1.1754943508222875e-38};

std::int32_t vertices_along(float lines) {
  return static_cast<std::int32_t>(std::floor(std::clamp(lines + 0.5f, 3.0f, 768.5f)));
}

// trunc(position / cell) as a cell that exists.
std::int32_t cell_of(double position, double cell, std::int32_t vertices) {
  const double index = position / cell;
  if (!(index > 0)) return 0;
  return index >= vertices - 2 ? vertices - 2 : static_cast<std::int32_t>(index);
}

bool suffices(const matrix3& m, const std::vector<Displacement>& list) {
  return std::all_of(list.begin(), list.end(), [&](const Displacement& d) {
    if (d.weight < kCountedWeight) return true;
    const point2 image = transform(m, {d.sourceX, d.sourceY});
    const double dx = image.x - d.targetX, dy = image.y - d.targetY;
    return dx * dx + dy * dy <= kExactSquare;
  });
}

void include(frame_bounds& bounds, point2 p) {
  if (p.x < bounds.min_x) bounds.min_x = p.x;
  if (p.y < bounds.min_y) bounds.min_y = p.y;
  if (p.x > bounds.max_x) bounds.max_x = p.x;
  if (p.y > bounds.max_y) bounds.max_y = p.y;
}

// Of the outer ring of vertices.
frame_bounds outline_bounds(const VarVector& grid) {
  frame_bounds bounds = kNothing;
  for (std::int32_t c = 0; c < grid.cols; ++c) {
    include(bounds, grid.vertex(c, 0));
    include(bounds, grid.vertex(c, grid.rows - 1));
  }
  for (std::int32_t r = 0; r < grid.rows; ++r) {
    include(bounds, grid.vertex(0, r));
    include(bounds, grid.vertex(grid.cols - 1, r));
  }
  return bounds;
}

}  // namespace

warp_grid::warp_grid(std::int32_t frameWidth, std::int32_t frameHeight)
    : rows(vertices_along(std::sqrt(
          2304.0f / (static_cast<float>(frameWidth) / static_cast<float>(frameHeight))))) {
  cols = 2304 / rows;
  cellWidth = static_cast<double>(frameWidth - 1) / (cols - 1);
  cellHeight = static_cast<double>(frameHeight - 1) / (rows - 1);
}

CPWarper::CPWarper(std::int32_t frameCount, std::int32_t frameWidth, std::int32_t frameHeight)
    : frameCount_(frameCount),
      frameWidth_(frameWidth),
      frameHeight_(frameHeight),
      grid_(frameWidth, frameHeight),
      unionBounds_(kNothing) {
  tessel::debug::Log("Setting grid size %d X %d\n", grid_.cols, grid_.rows);
}

void CPWarper::buildDisplacements(boost::shared_ptr<const stabilizer_global> stabilizerGlobal,
                                  const std::vector<factorization_window>& factorizationWindows,
                                  const std::vector<transition_record>& transitionWindows,
                                  const SolverParamsRecord& parameters,
                                  const progress_functor& progress) {
  tessel::debug::Log("factorization windows:\n");
  for (const factorization_window& window : factorizationWindows) {
    tessel::debug::Log("(%d, %d), ", static_cast<int>(window.first), static_cast<int>(window.end));
  }
  tessel::debug::Log("\n");
  dataWeight_ = parameters.data_weight;
  homographyLimit_ = parameters.homography_limit;
  global_ = std::move(stabilizerGlobal);
  solving_ = nullptr;
  tracks_ = boost::make_shared<const blended_tracks>(*global_, factorizationWindows, parameters,
                                                     progress);
  progress();
  computeModelScores(factorizationWindows, transitionWindows, parameters.method_level, progress);
}

void CPWarper::buildDisplacementsForWindows(stabilizer_global& stabilizerGlobal,
                                            const std::vector<factorization_window>& windows,
                                            const SolverParamsRecord& parameters) {
  solving_ = &stabilizerGlobal;
  windowLists_ = member_displacements(stabilizerGlobal, windows, parameters);
  windowLists_.resize(static_cast<std::size_t>(frameCount_));
}

std::vector<Displacement> CPWarper::displacements(std::size_t frame) const {
  if (solving_) return windowLists_[frame];
  if (!tracks_) return {};
  std::vector<Displacement> list = robust_walk(*tracks_, kOutlierRampFrames, frame).next().list;
  if (driven_) {
    locateInRestGrid(list);
    moveSources(list, bases_[frame], gridUnder(bases_[frame]));
  }
  return list;
}

void CPWarper::pruneDisplacements(std::int32_t lastFrame) {
  refresh_targets(windowLists_, *solving_, std::max(lastFrame - kOutlierRampFrames, 0),
                  lastFrame + 1);
}

void CPWarper::reweightRecent(std::int32_t lastFrame) {
  const std::int32_t first = std::max(lastFrame - kOutlierRampFrames, 0);
  for (std::int32_t f = first; f <= lastFrame; ++f) medianDeviation(windowLists_[f]);
  fade_about_outliers(windowLists_, first, lastFrame + 1, kOutlierRampFrames);
}

void CPWarper::projectFrame(std::int32_t frame, bool translationOnly) {
  const std::vector<Displacement>& list = windowLists_[frame];
  if (list.size() < kLeastForProjection) {
    throw std::runtime_error("Not enough features for computing similarity transform");
  }
  const matrix3 motion = translationOnly ? fitTranslation(list) : fitSimilarity(list);
  for (std::size_t i = 0; i < solving_->feature_count; ++i) {
    const track_sample& source = solving_->input_at(frame, i);
    if (source.status < 0) continue;
    const point2 image = transform(motion, {source.x, source.y});
    track_sample& sample = solving_->output_at(frame, i);
    sample.x = static_cast<float>(image.x);
    sample.y = static_cast<float>(image.y);
    sample.status = source.status;
  }
}

matrix3 CPWarper::fitKind(std::size_t frame, const std::vector<Displacement>& list, int kind) {
  switch (kind) {
    case 1: {
      tessel::debug::Log("translation ");
      if (!overrideFlags_[frame]) return fitTranslation(list);
      const double* p = &overrideParams_[4 * frame];
      const point2 shift =
          displacement_of({p[0], p[1], p[2], p[3]}, middle_of(frameWidth_, frameHeight_));
      return {1, 0, shift.x, 0, 1, shift.y, 0, 0, 1};
    }
    case 2:
      tessel::debug::Log("similarity ");
      if (!overrideFlags_[frame]) return fitSimilarity(list);
      tessel::debug::Log("grebe ");
      return storedSimilarity(frame);
    default:
      tessel::debug::Log(kind == 3 ? "homography " : "cp warp ");
      return homography_.fit(list);
  }
}

CPWarper::frame_model CPWarper::chooseModel(std::size_t frame,
                                            const std::vector<Displacement>& list) {
  const double score = modelScore_[frame];
  const double fraction = score - std::floor(score);
  const bool whole = fraction < kWholeScore || fraction > 1 - kWholeScore;
  const int kind = static_cast<int>(std::floor(score + kWholeScore));
  tessel::debug::Log("frame %d: displacements %d, models %d, score %1.2f: ",
                     static_cast<int>(frame), static_cast<int>(list.size()), whole ? 1 : 2, score);
  const double share = whole ? 0 : score - kind;
  const int most_complex = whole ? kind : kind + 1;

  frame_model model;
  model.base = fitKind(frame, list, kind);
  if (most_complex >= 4) {
    // The models 3 and 4 have the same base, so the blend of their bases is that base.
    if (!whole) tessel::debug::Log("cp warp ");
    if (suffices(model.base, list)) {
      tessel::debug::Log("but homography suffices, switching");
    } else {
      model.solved_share = whole ? 1 : share;
    }
  } else if (!whole) {
    const matrix3 upper = fitKind(frame, list, most_complex);
    for (std::size_t i = 0; i < 8; ++i) model.base[i] += (upper[i] - model.base[i]) * share;
    model.base[8] = 1.0;
  }
  tessel::debug::Log("\n");
  return model;
}

void CPWarper::locateInRestGrid(std::vector<Displacement>& list) const {
  for (Displacement& d : list) {
    d.cellX = cell_of(d.sourceX, grid_.cellWidth, grid_.cols);
    d.cellY = cell_of(d.sourceY, grid_.cellHeight, grid_.rows);
  }
}

void CPWarper::moveSources(std::vector<Displacement>& list, const matrix3& base,
                           const VarVector& base_grid) const {
  for (Displacement& d : list) {
    const point2 moved = transform(base, {d.sourceX, d.sourceY});
    d.sourceX = moved.x;
    d.sourceY = moved.y;
    const point2 fraction = inverse_bilinear(
        moved, base_grid.vertex(d.cellX, d.cellY), base_grid.vertex(d.cellX + 1, d.cellY),
        base_grid.vertex(d.cellX, d.cellY + 1), base_grid.vertex(d.cellX + 1, d.cellY + 1));
    d.fracX = fraction.x;
    d.fracY = fraction.y;
  }
}

VarVector CPWarper::gridUnder(const matrix3& m) const {
  VarVector grid(grid_.cols, grid_.rows);
  std::size_t i = 0;
  for (std::int32_t r = 0; r < grid_.rows; ++r) {
    for (std::int32_t c = 0; c < grid_.cols; ++c, i += 2) {
      const point2 p = transform(m, {c * grid_.cellWidth, r * grid_.cellHeight});
      grid.values[i] = p.x;
      grid.values[i + 1] = p.y;
    }
  }
  return grid;
}

void CPWarper::drive(const progress_functor& progress) {
  grid_solver solver(grid_.cols, grid_.rows);
  robust_walk walk(*tracks_, kOutlierRampFrames);
  frameWarps_->reserve(static_cast<std::size_t>(frameCount_));
  bases_.reserve(static_cast<std::size_t>(frameCount_));
  VarVector solved(grid_.cols, grid_.rows);
  for (std::size_t f = 0; f < static_cast<std::size_t>(frameCount_); ++f) {
    std::vector<Displacement> list = walk.next().list;
    const frame_model model = chooseModel(f, list);
    progress();
    VarVector record = gridUnder(model.base);
    locateInRestGrid(list);
    moveSources(list, model.base, record);
    progress();
    if (model.solved_share > 0) {
      // Zero where the solve fails; a blend then still goes towards it.
      std::fill(solved.values.begin(), solved.values.end(), 0.0);
      solver.solve(list, record.values, dataWeight_, solved.values);
      progress();
      if (model.solved_share == 1) {
        record.values = solved.values;
      } else {
        for (std::size_t i = 0; i < record.values.size(); ++i) {
          record.values[i] += (solved.values[i] - record.values[i]) * model.solved_share;
        }
      }
    }
    storeFrameWarp(record);
    bases_.push_back(model.base);
    progress();
  }
  driven_ = true;
}

boost::shared_ptr<const CPWarper> CPWarper::withoutTracks() const {
  const boost::shared_ptr<CPWarper> warper(new CPWarper(*this));
  warper->global_.reset();
  warper->tracks_.reset();
  warper->modelScore_ = {};
  warper->bases_ = {};
  warper->driven_ = false;
  return warper;
}

void CPWarper::storeFrameWarp(const VarVector& record) {
  const quantised_warp quantised = quantise(record);
  append(pack(quantised, record.cols), quantised, record.cols, record.rows);
}

void CPWarper::storeFrameWarp(const quantised_warp& record) {
  append(pack(record, grid_.cols), record, grid_.cols, grid_.rows);
}

void CPWarper::storeFrameWarp(packed_warp record) {
  const quantised_warp quantised = unpack(record, grid_.cols, grid_.rows);
  append(std::move(record), quantised, grid_.cols, grid_.rows);
}

void CPWarper::append(packed_warp packed, const quantised_warp& record, std::int32_t cols,
                      std::int32_t rows) {
  auto expanded = boost::make_shared<const VarVector>(rebuild(record, cols, rows));
  const frame_bounds bounds = outline_bounds(*expanded);
  frameWarps_->push_back({std::move(packed), cols, rows, bounds});
  if (!firstWarp_) firstWarp_ = std::move(expanded);
  unionBounds_.min_x = std::min(unionBounds_.min_x, bounds.min_x);
  unionBounds_.min_y = std::min(unionBounds_.min_y, bounds.min_y);
  unionBounds_.max_x = std::max(unionBounds_.max_x, bounds.max_x);
  unionBounds_.max_y = std::max(unionBounds_.max_y, bounds.max_y);
}

quantised_warp CPWarper::storedWarp(std::size_t frame) const {
  if (frame >= frameWarps_->size()) throw std::out_of_range("invalid vector<T> subscript");
  const stored_frame& stored = (*frameWarps_)[frame];
  return unpack(stored.warp, stored.cols, stored.rows);
}

boost::shared_ptr<const VarVector> CPWarper::frameWarp(std::size_t frame) const {
  if (frame == 0 && firstWarp_) return firstWarp_;
  const quantised_warp record = storedWarp(frame);
  const stored_frame& stored = (*frameWarps_)[frame];
  return boost::make_shared<const VarVector>(rebuild(record, stored.cols, stored.rows));
}

bool CPWarper::boundsEmpty() const {
  frame_bounds common = kNothing;
  for (std::size_t f = 0; f < frameWarps_->size(); ++f) {
    const frame_bounds bounds = frameBounds(f);
    if (f == 0) common = bounds;
    common.min_x = std::max(common.min_x, bounds.min_x);
    common.min_y = std::max(common.min_y, bounds.min_y);
    common.max_x = std::min(common.max_x, bounds.max_x);
    common.max_y = std::min(common.max_y, bounds.max_y);
    if (common.max_x - common.min_x < 1.0 || common.max_y - common.min_y < 1.0) return true;
  }
  return false;
}

}  // namespace marrow::stabilization
