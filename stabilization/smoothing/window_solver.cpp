#include "stabilization/smoothing/window_solver.h"

#include <algorithm>

#include "platform/dss/dss.h"
#include "platform/tessel/debug.h"

namespace marrow::stabilization {

namespace {

constexpr double kOverlapWeight = 100.0;
constexpr double kStillnessLambda = 2000.0;
constexpr double kRegularizer = 0.01;
constexpr std::size_t kReach = 2;  // blocks off the diagonal

struct dss_holder {
  DssHandle handle = nullptr;
  dss_holder() = default;
  dss_holder(const dss_holder&) = delete;
  ~dss_holder() {
    if (handle) dss_delete(handle, MKL_DSS_DEFAULTS);
  }
};

double Dot(const double* a, const double* b, std::size_t count) {
  double sum = 0;
  for (std::size_t i = 0; i < count; ++i) sum += a[i] * b[i];
  return sum;
}

}  // namespace

window_solver::window_solver(stabilizer_global& global, const SolverParamsRecord& parameters,
                             const std::vector<double>& lambdas, const progress_functor& progress)
    : global_(global), parameters_(parameters), lambdas_(lambdas), progress_(progress) {}

void window_solver::load(const factorization_window& previous,
                         const factorization_window& current) {
  previous_window_ = &previous;
  current_window_ = &current;
  rank_ = current.rank;
  length_ = current.end - current.first;
  packed_ = rank_ * (rank_ + 1) / 2;
  loaded_ = load_window(global_, current, parameters_, progress_);
}

bool window_solver::solve_window() {
  Begin();
  const factorization_window& window = *current_window_;
  const std::size_t overlap = window.overlap_end - window.first;
  for (const active_track& track : loaded_.tracks) {
    FillOuterProduct(track);
    progress_();
    const std::size_t feature = Feature(track);
    for (std::size_t f = track.first; f < track.end; ++f) {
      const double fade = track.fade[f - track.first];
      const double w = fade * fade * frame_norm_[f];
      const track_sample& target = global_.input_at(window.first + f, feature);
      AddData(track, f, w, target.x, target.y);
      if (f < overlap && HasOverlapSample(track, f)) {
        const double falling = 1.0 - static_cast<double>(f) / static_cast<double>(overlap);
        const track_sample& solved = OverlapSample(track, f);
        AddData(track, f, w * kOverlapWeight * falling, solved.x, solved.y);
      }
      if (f > track.first && f + 1 < track.end) {
        const double l = lambdas_[window.first + f] * fade;
        AddOuterProduct(smooth_blocks_, f, l * l * frame_norm_[f]);
      }
    }
    progress_();
  }
  BuildStructure();
  for (std::size_t f = 0; f < length_; ++f) {
    AddBlock(f, 0, &data_blocks_[f * packed_], 1.0);
    if (f == 0 || f + 1 == length_) continue;
    const double* smooth = &smooth_blocks_[f * packed_];
    AddBlock(f - 1, 0, smooth, 1.0);
    AddBlock(f - 1, 1, smooth, -2.0);
    AddBlock(f - 1, 2, smooth, 1.0);
    AddBlock(f, 0, smooth, 4.0);
    AddBlock(f, 1, smooth, -2.0);
    AddBlock(f + 1, 0, smooth, 1.0);
  }
  return Solve();
}

bool window_solver::solve_window_no_motion() {
  Begin();
  const std::size_t overlap = current_window_->overlap_end - current_window_->first;
  const auto is_anchored = [&](const active_track& track) {
    return overlap > 0 && track.first == 0 && HasOverlapSample(track, 0);
  };
  // With nothing solved before it that it could hold on to, the window stands as its middle does.
  const bool stands_alone = std::none_of(loaded_.tracks.begin(), loaded_.tracks.end(), is_anchored);
  for (const active_track& track : loaded_.tracks) {
    FillOuterProduct(track);
    progress_();
    const bool anchored = is_anchored(track);
    point2 target = {0, 0};
    if (anchored) {
      target = {OverlapSample(track, 0).x, OverlapSample(track, 0).y};
    } else if (stands_alone) {
      target = MiddlePosition(track);
    }
    for (std::size_t f = track.first; f < track.end; ++f) {
      const double fade = track.fade[f - track.first];
      const double w = fade * fade * frame_norm_[f];
      if (stands_alone || anchored) AddData(track, f, w, target.x, target.y);
      if (anchored && f < overlap) {
        AddData(track, f, w * kOverlapWeight, target.x, target.y);
      }
      if (f + 1 < track.end) {
        const double l = kStillnessLambda * fade;
        AddOuterProduct(smooth_blocks_, f, l * l * frame_norm_[f]);
      }
    }
    progress_();
  }
  BuildStructure();
  for (std::size_t f = 0; f < length_; ++f) {
    AddBlock(f, 0, &data_blocks_[f * packed_], 1.0);
    if (f + 1 == length_) continue;
    const double* smooth = &smooth_blocks_[f * packed_];
    AddBlock(f, 0, smooth, 1.0);
    AddBlock(f, 1, smooth, -1.0);
    AddBlock(f + 1, 0, smooth, 1.0);
  }
  return Solve();
}

void window_solver::Begin() {
  frame_norm_.assign(length_, 0.0);
  track_count_.assign(length_, 0);
  for (const active_track& track : loaded_.tracks) {
    for (std::size_t f = track.first; f < track.end; ++f) {
      const double fade = track.fade[f - track.first];
      frame_norm_[f] += fade * fade;
      ++track_count_[f];
    }
  }
  for (double& norm : frame_norm_) {
    if (norm != 0.0) norm = 1.0 / norm;
  }
  outer_product_.resize(packed_);
  data_blocks_.assign(length_ * packed_, 0.0);
  smooth_blocks_.assign(length_ * packed_, 0.0);
  right_hand_side_.assign(length_ * rank_, 0.0);
}

std::size_t window_solver::Feature(const active_track& track) const {
  return static_cast<std::size_t>(global_.trajectories[track.trajectory].feature);
}

const track_sample& window_solver::OverlapSample(const active_track& track,
                                                 std::size_t frame) const {
  return current_window_->overlap_rows[frame * global_.feature_count + Feature(track)];
}

// Of a frame on which the track lives.
bool window_solver::HasOverlapSample(const active_track& track, std::size_t frame) const {
  if (overlap_from_transition) return OverlapSample(track, frame).status >= 0;
  return previous_window_->takes_part(track.trajectory);
}

// Where the track is on the window's middle frame, or would be if it lived there.
point2 window_solver::MiddlePosition(const active_track& track) const {
  const std::size_t middle = length_ / 2;
  if (track.first <= middle && middle < track.end) {
    const track_sample& sample = global_.input_at(current_window_->first + middle, Feature(track));
    return {sample.x, sample.y};
  }
  point2 position = {parameters_.center_x, parameters_.center_y};
  for (std::size_t i = 0; i < rank_; ++i) {
    const double signal = current_window_->basis[i * length_ + middle];
    position.x += track.coefficients[i] * signal;
    position.y += track.coefficients[rank_ + i] * signal;
  }
  return position;
}

void window_solver::FillOuterProduct(const active_track& track) {
  const double* cx = track.coefficients;
  const double* cy = cx + rank_;
  double* out = outer_product_.data();
  for (std::size_t i = 0; i < rank_; ++i) {
    for (std::size_t j = i; j < rank_; ++j) *out++ = cx[i] * cx[j] + cy[i] * cy[j];
  }
}

void window_solver::AddOuterProduct(std::vector<double>& blocks, std::size_t frame, double weight) {
  double* block = &blocks[frame * packed_];
  const double* product = outer_product_.data();
  for (std::size_t k = 0; k < packed_; ++k) block[k] += weight * product[k];
}

// One observation (x, y) of the track whose outer product was filled last.
void window_solver::AddData(const active_track& track, std::size_t frame, double weight, double x,
                            double y) {
  AddOuterProduct(data_blocks_, frame, weight);
  const double tx = weight * (x - parameters_.center_x);
  const double ty = weight * (y - parameters_.center_y);
  double* b = &right_hand_side_[frame * rank_];
  for (std::size_t i = 0; i < rank_; ++i) {
    b[i] += track.coefficients[i] * tx + track.coefficients[rank_ + i] * ty;
  }
}

// Every block within reach is full, so a row's columns are consecutive and its start tells the
// place of each entry: row i of block row f holds column j of block f + k at start - i + k rank +
// j.
void window_solver::BuildStructure() {
  const std::size_t rows = length_ * rank_;
  row_starts_.resize(rows + 1);
  columns_.clear();
  for (std::size_t row = 0; row < rows; ++row) {
    row_starts_[row] = static_cast<std::int32_t>(columns_.size()) + 1;
    const std::size_t end = std::min(rows, (row / rank_ + kReach + 1) * rank_);
    for (std::size_t c = row; c < end; ++c) columns_.push_back(static_cast<std::int32_t>(c) + 1);
  }
  row_starts_[rows] = static_cast<std::int32_t>(columns_.size()) + 1;
  values_.assign(columns_.size(), 0.0);
}

// Adds factor times the symmetric block, given by its upper triangle, to the matrix's block
// (frame, frame + offset); on the diagonal the upper triangle alone.
void window_solver::AddBlock(std::size_t frame, std::size_t offset, const double* block,
                             double factor) {
  for (std::size_t i = 0; i < rank_; ++i) {
    double* row = values_.data() + row_starts_[frame * rank_ + i] - 1 + offset * rank_ - i;
    for (std::size_t j = i; j < rank_; ++j) row[j] += factor * *block++;
    if (offset == 0) continue;
    for (std::size_t j = i + 1; j < rank_; ++j) {
      values_[static_cast<std::size_t>(row_starts_[frame * rank_ + j]) - 1 + offset * rank_ - j +
              i] +=
          factor * block[static_cast<std::ptrdiff_t>(j) - static_cast<std::ptrdiff_t>(rank_)];
    }
  }
}

bool window_solver::Solve() {
  for (std::size_t f = 0; f < length_; ++f) {
    if (track_count_[f] < rank_) {
      tessel::debug::Log("Not enough points (%d) on frame %d, need regularizer\n",
                         static_cast<int>(track_count_[f]),
                         static_cast<int>(current_window_->first + f));
      for (std::size_t i = 0; i < rank_; ++i) {
        values_[static_cast<std::size_t>(row_starts_[f * rank_ + i]) - 1] += kRegularizer;
      }
    }
    progress_();
  }
  if (!SolveSparse()) return false;
  solved_basis_.resize(rank_ * length_);
  for (std::size_t f = 0; f < length_; ++f) {
    for (std::size_t i = 0; i < rank_; ++i) {
      solved_basis_[i * length_ + f] = solution_[f * rank_ + i];
    }
  }
  progress_();
  WriteOutput();
  return true;
}

bool window_solver::SolveSparse() {
  const auto rows = static_cast<DssInt>(length_ * rank_);
  dss_holder dss;
  solution_.resize(right_hand_side_.size());
  if (dss_create(dss.handle, MKL_DSS_DEFAULTS) != MKL_DSS_SUCCESS) return false;
  if (dss_define_structure(dss.handle, MKL_DSS_SYMMETRIC, row_starts_.data(), rows, rows,
                           columns_.data(),
                           static_cast<DssInt>(columns_.size())) != MKL_DSS_SUCCESS) {
    return false;
  }
  if (dss_reorder(dss.handle, MKL_DSS_DEFAULTS, nullptr) != MKL_DSS_SUCCESS) return false;
  progress_();
  if (dss_factor_real(dss.handle, MKL_DSS_POSITIVE_DEFINITE, values_.data()) != MKL_DSS_SUCCESS) {
    return false;
  }
  progress_();
  return dss_solve_real(dss.handle, MKL_DSS_DEFAULTS, right_hand_side_.data(), 1,
                        solution_.data()) == MKL_DSS_SUCCESS;
}

void window_solver::WriteOutput() {
  for (const active_track& track : loaded_.tracks) {
    const std::size_t feature = Feature(track);
    for (std::size_t f = track.first; f < track.end; ++f) {
      const double* u = &solution_[f * rank_];
      track_sample& out = global_.output_at(current_window_->first + f, feature);
      out.x = static_cast<float>(Dot(track.coefficients, u, rank_) + parameters_.center_x);
      out.y = static_cast<float>(Dot(track.coefficients + rank_, u, rank_) + parameters_.center_y);
      out.status = f == track.first ? 1 : 0;
    }
    progress_();
  }
}

}  // namespace marrow::stabilization
