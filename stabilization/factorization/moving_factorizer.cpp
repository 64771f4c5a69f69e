#include "stabilization/factorization/moving_factorizer.h"

#include <algorithm>
#include <tuple>

#include "platform/lapack/lapack.h"

namespace marrow::stabilization {

namespace {

int Int(std::size_t n) {
  return static_cast<int>(n);
}

constexpr double kMachinePrecision = -1.0;  // as rcond

double SumOfSquares(const double* values, std::size_t count) {
  double sum = 0;
  for (std::size_t i = 0; i < count; ++i) sum += values[i] * values[i];
  return sum;
}

// Adds what dgelss asks for to `total`; false where it refuses.
bool QueryLeastSquares(std::size_t rows, std::size_t columns, std::size_t right_hand_sides,
                       std::size_t& total) {
  const int m = Int(rows), n = Int(columns), nrhs = Int(right_hand_sides);
  const int ldb = std::max(m, n), query = -1;
  int rank = 0, info = 0;
  double a = 0, b = 0, s = 0, size = 0;
  lapack::dgelss(&m, &n, &nrhs, &a, &m, &b, &ldb, &s, &kMachinePrecision, &rank, &size, &query,
                 &info);
  total += static_cast<std::size_t>(size);
  return info == 0;
}

}  // namespace

bool moving_factorizer::Setup(std::size_t feature_count, std::size_t frame_count, std::size_t rank,
                              std::size_t duration, std::size_t step) {
  feature_count_ = feature_count;
  frame_count_ = frame_count;
  rank_ = rank;
  duration_ = std::min(duration, frame_count);
  step_ = step;
  if (feature_count == 0 || rank == 0 || duration_ == 0) {
    error_ = true;
    return false;
  }
  const std::size_t rows = 2 * feature_count;
  const std::size_t overlap = duration_ > step ? duration_ - step : 1;

  const int m = Int(duration_), n = Int(rows), query = -1;
  int info = 0;
  double a = 0, s = 0, u = 0, vt = 0, size = 0;
  lapack::dgesvd("S", "S", &m, &n, &a, &m, &s, &u, &m, &vt, &m, &size, &query, &info);
  std::size_t total = static_cast<std::size_t>(size);
  error_ = info != 0;
  error_ |= !QueryLeastSquares(overlap, rank, rows, total);
  error_ |= !QueryLeastSquares(rows, rank, std::max<std::size_t>(step, 1), total);
  error_ |= !QueryLeastSquares(frame_count, rank, rows, total);
  if (error_) return false;

  workspace_.resize(total);
  measurements_.resize(rows * duration_);
  overlap_rhs_.resize(std::max(rows * std::max(overlap, rank), std::max(rows, rank) * step));
  coefficient_scratch_.resize(rows * rank);
  stacked_coefficients_.resize(rows * rank);
  u_matrix_.resize(duration_ * duration_);
  vt_matrix_.resize(duration_ * rows);
  fit_matrix_.resize(rank * std::max(frame_count, rows));
  singular_values_.resize(std::max(std::min(rows, duration_), rank));
  basis_.resize(rank * frame_count);
  current_tracks_.reserve(feature_count);
  previous_tracks_.reserve(feature_count);
  common_previous_.reserve(feature_count);
  return true;
}

std::uint64_t moving_factorizer::Factorize(const stabilizer_global& global, std::uint64_t first,
                                           std::uint64_t limit, double center_x, double center_y,
                                           factorization_window& window,
                                           const progress_functor& progress) {
  global_ = &global;
  center_x_ = center_x;
  center_y_ = center_y;
  residuals_.clear();
  const std::uint64_t end = Decompose(first, limit, progress);
  if (error_) return 0;
  window.first = first;
  window.end = end;
  window.rank = rank_;
  const std::size_t length = end - first;
  window.basis.resize(rank_ * length);
  for (std::size_t i = 0; i < rank_; ++i) {
    std::copy_n(basis_row(i) + first, length, window.basis.data() + i * length);
  }
  if (!FitAllTrajectories(window, progress)) return 0;
  return end;
}

// The basis of [first, end); returns end.
std::uint64_t moving_factorizer::Decompose(std::uint64_t first, std::uint64_t limit,
                                           const progress_functor& progress) {
  const std::uint64_t begin = first;
  std::uint64_t end = std::min<std::uint64_t>(frame_count_, first + duration_);
  end = std::min(end, first + limit);
  current_tracks_.clear();
  next_trajectory_ = 0;
  CollectStarted(0, first, end);
  if (2 * current_tracks_.size() < rank_) return first;
  if (!FactorizeFirstWindow(first, end)) return 0;
  if (step_ == 0 || step_ >= duration_) return end;

  while (end != frame_count_) {
    progress();
    const std::uint64_t next_first = std::min<std::uint64_t>(frame_count_, first + step_);
    const std::uint64_t next_end = std::min<std::uint64_t>(frame_count_, end + step_);
    if (next_end - begin > limit) return end;

    // A track that was complete and lasts long enough is complete again, and one that was not can
    // only be so by having started since: the list stays ordered, those that go on in front.
    previous_tracks_.swap(current_tracks_);
    current_tracks_.clear();
    common_previous_.clear();
    for (std::size_t k = 0; k < previous_tracks_.size(); ++k) {
      if (static_cast<std::uint64_t>(global_->trajectories[previous_tracks_[k]].last) < next_end) {
        continue;
      }
      common_previous_.push_back(static_cast<std::int32_t>(k));
      current_tracks_.push_back(previous_tracks_[k]);
    }
    CollectStarted(next_trajectory_, next_first, next_end);
    if (2 * current_tracks_.size() < rank_) return end;

    first = next_first;
    end = next_end;
    move_residuals residual = {first, 0.0, 0.0};
    FillMeasurements(first, end);
    if (!SolveNewTracks(first, end, common_previous_.size(), residual.new_tracks) ||
        !SolveNewFrames(first, end, residual.new_frames)) {
      return 0;
    }
    residuals_.push_back(residual);
  }
  return end;
}

// Appends the trajectories from `after` on that are complete over [first, end).
void moving_factorizer::CollectStarted(std::size_t after, std::size_t first, std::size_t end) {
  const std::vector<Trajectory>& trajectories = global_->trajectories;
  std::size_t t = after;
  for (; t < trajectories.size() && static_cast<std::size_t>(trajectories[t].first) <= first; ++t) {
    if (static_cast<std::size_t>(trajectories[t].last) >= end) {
      current_tracks_.push_back(static_cast<std::int32_t>(t));
    }
  }
  next_trajectory_ = t;
}

void moving_factorizer::FillMeasurements(std::size_t first, std::size_t end) {
  const std::size_t length = end - first;
  for (std::size_t f = 0; f < length; ++f) {
    double* column = &measurements_[f];
    for (const std::int32_t t : current_tracks_) {
      const track_sample& sample =
          global_->input_at(first + f, static_cast<std::size_t>(global_->trajectories[t].feature));
      column[0] = sample.x - center_x_;
      column[length] = sample.y - center_y_;
      column += 2 * length;
    }
  }
}

bool moving_factorizer::FactorizeFirstWindow(std::size_t first, std::size_t end) {
  const std::size_t length = end - first;
  const std::size_t columns = 2 * current_tracks_.size();
  FillMeasurements(first, end);
  const int m = Int(length), n = Int(columns), lwork = Int(workspace_.size());
  int info = 0;
  lapack::dgesvd("S", "S", &m, &n, measurements_.data(), &m, singular_values_.data(),
                 u_matrix_.data(), &m, vt_matrix_.data(), &m, workspace_.data(), &lwork, &info);
  if (info != 0) {
    error_ = true;
    return false;
  }
  // A window shorter than the rank has fewer signals; the missing ones are zero.
  const std::size_t values = std::min(columns, length);
  const std::size_t kept = std::min(rank_, values);
  std::fill_n(coefficient_scratch_.begin(), columns * rank_, 0.0);
  for (std::size_t j = 0; j < columns; ++j) {
    for (std::size_t i = 0; i < kept; ++i) {
      coefficient_scratch_[j * rank_ + i] = singular_values_[i] * vt_matrix_[j * length + i];
    }
  }
  for (std::size_t i = 0; i < rank_; ++i) {
    double* row = basis_row(i) + first;
    if (i < kept) {
      std::copy_n(&u_matrix_[i * length], length, row);
    } else {
      std::fill_n(row, length, 0.0);
    }
  }
  const double beyond = SumOfSquares(singular_values_.data() + kept, values - kept);
  residuals_.push_back({first, beyond / static_cast<double>(length * current_tracks_.size()), 0.0});
  return true;
}

// Minimum-norm least squares with `rank` unknowns; a: rows x rank, both column-major.
bool moving_factorizer::LeastSquares(std::size_t rows, std::size_t right_hand_sides, double* a,
                                     double* b, std::size_t b_stride) {
  const int m = Int(rows), n = Int(rank_), nrhs = Int(right_hand_sides), ldb = Int(b_stride);
  const int lwork = Int(workspace_.size());
  int found_rank = 0, info = 0;
  lapack::dgelss(&m, &n, &nrhs, a, &m, b, &ldb, singular_values_.data(), &kMachinePrecision,
                 &found_rank, workspace_.data(), &lwork, &info);
  error_ |= info != 0;
  return info == 0;
}

// Coefficients of the tracks that have become complete, from the frames whose basis is known;
// coefficient_scratch_ is left in the order of current_tracks_.
bool moving_factorizer::SolveNewTracks(std::size_t first, std::size_t end, std::size_t common,
                                       double& residual) {
  const std::size_t width = end - first;
  const std::size_t overlap = duration_ - step_;
  const std::size_t stride = std::max(overlap, rank_);
  const std::size_t added = current_tracks_.size() - common;

  for (std::size_t k = 0; k < common; ++k) {
    std::copy_n(&coefficient_scratch_[2 * rank_ * static_cast<std::size_t>(common_previous_[k])],
                2 * rank_, &stacked_coefficients_[2 * rank_ * k]);
  }
  if (added > 0) {
    for (std::size_t i = 0; i < rank_; ++i) {
      std::copy_n(basis_row(i) + first, overlap, &fit_matrix_[i * overlap]);
    }
    for (std::size_t j = 0; j < 2 * added; ++j) {
      std::copy_n(&measurements_[(2 * common + j) * width], overlap, &overlap_rhs_[j * stride]);
    }
    if (!LeastSquares(overlap, 2 * added, fit_matrix_.data(), overlap_rhs_.data(), stride)) {
      return false;
    }
    for (std::size_t j = 0; j < 2 * added; ++j) {
      const double* solution = &overlap_rhs_[j * stride];
      std::copy_n(solution, rank_, &stacked_coefficients_[(2 * common + j) * rank_]);
      if (overlap > rank_) residual += SumOfSquares(solution + rank_, overlap - rank_);
    }
    residual /= static_cast<double>(overlap * added);
  }
  coefficient_scratch_.swap(stacked_coefficients_);
  return true;
}

// The basis over the frames that no position of the window has held yet.
bool moving_factorizer::SolveNewFrames(std::size_t first, std::size_t end, double& residual) {
  const std::size_t width = end - first;
  const std::size_t overlap = duration_ - step_;
  const std::size_t added = width - overlap;
  const std::size_t rows = 2 * current_tracks_.size();
  const std::size_t stride = std::max(rows, rank_);
  if (added == 0) return true;
  for (std::size_t j = 0; j < rows; ++j) {
    for (std::size_t i = 0; i < rank_; ++i) {
      fit_matrix_[i * rows + j] = coefficient_scratch_[j * rank_ + i];
    }
    for (std::size_t f = 0; f < added; ++f) {
      overlap_rhs_[f * stride + j] = measurements_[j * width + overlap + f];
    }
  }
  if (!LeastSquares(rows, added, fit_matrix_.data(), overlap_rhs_.data(), stride)) return false;
  for (std::size_t f = 0; f < added; ++f) {
    const double* solution = &overlap_rhs_[f * stride];
    for (std::size_t i = 0; i < rank_; ++i) basis_row(i)[first + overlap + f] = solution[i];
    residual += SumOfSquares(solution + rank_, rows - rank_);
  }
  residual /= static_cast<double>(added * current_tracks_.size());
  return true;
}

bool moving_factorizer::FitAllTrajectories(factorization_window& window,
                                           const progress_functor& progress) {
  const std::vector<Trajectory>& trajectories = global_->trajectories;
  const auto first = static_cast<std::int32_t>(window.first);
  const auto end = static_cast<std::int32_t>(window.end);
  const auto begin = std::find_if(trajectories.begin(), trajectories.end(),
                                  [&](const Trajectory& t) { return t.last > first; });
  const auto stop = std::partition_point(begin, trajectories.end(),
                                         [&](const Trajectory& t) { return t.first < end; });
  window.trajectories_begin = static_cast<std::uint64_t>(begin - trajectories.begin());
  window.trajectory_flags.assign(static_cast<std::size_t>(stop - begin), 0);

  // Tracks that share their span in the window share its decomposition: one call for them all.
  struct span {
    std::int32_t first;
    std::int32_t end;
    std::size_t place;
  };
  std::vector<span> spans;
  std::int32_t places = 0;
  for (auto t = begin; t != stop; ++t) {
    const span s = {std::max(t->first, first), std::min(t->last, end),
                    static_cast<std::size_t>(places)};
    if (s.end - s.first < static_cast<std::int32_t>(rank_)) continue;
    window.trajectory_flags[static_cast<std::size_t>(t - begin)] = ++places;
    spans.push_back(s);
  }
  window.coefficients.assign(2 * rank_ * spans.size(), 0.0);
  std::vector<std::int32_t> features(spans.size());
  for (auto t = begin; t != stop; ++t) {
    const std::int32_t flag = window.trajectory_flags[static_cast<std::size_t>(t - begin)];
    if (flag) features[static_cast<std::size_t>(flag - 1)] = t->feature;
  }
  std::sort(spans.begin(), spans.end(), [](const span& a, const span& b) {
    return std::tie(a.first, a.end, a.place) < std::tie(b.first, b.end, b.place);
  });

  const std::size_t length = window.end - window.first;
  std::vector<double> right;
  for (std::size_t g = 0; g < spans.size();) {
    std::size_t group_end = g + 1;
    while (group_end < spans.size() && spans[group_end].first == spans[g].first &&
           spans[group_end].end == spans[g].end) {
      ++group_end;
    }
    const auto rows = static_cast<std::size_t>(spans[g].end - spans[g].first);
    const auto start = static_cast<std::size_t>(spans[g].first);
    for (std::size_t i = 0; i < rank_; ++i) {
      std::copy_n(&window.basis[i * length + start - window.first], rows, &fit_matrix_[i * rows]);
    }
    right.resize(2 * rows * (group_end - g));
    for (std::size_t f = 0; f < rows; ++f) {
      for (std::size_t k = g; k < group_end; ++k) {
        const track_sample& sample =
            global_->input_at(start + f, static_cast<std::size_t>(features[spans[k].place]));
        right[2 * (k - g) * rows + f] = sample.x - center_x_;
        right[(2 * (k - g) + 1) * rows + f] = sample.y - center_y_;
      }
    }
    if (!LeastSquares(rows, 2 * (group_end - g), fit_matrix_.data(), right.data(), rows)) {
      return false;
    }
    for (std::size_t k = g; k < group_end; ++k) {
      double* coefficients = &window.coefficients[2 * rank_ * spans[k].place];
      std::copy_n(&right[2 * (k - g) * rows], rank_, coefficients);
      std::copy_n(&right[(2 * (k - g) + 1) * rows], rank_, coefficients + rank_);
    }
    g = group_end;
    progress();
  }
  return true;
}

}  // namespace marrow::stabilization
