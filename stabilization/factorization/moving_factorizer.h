#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "stabilization/progress.h"
#include "stabilization/solve_records.h"

namespace marrow::stabilization {

// Low-rank factorization of a clip's tracks by a moving window (Golub and Van Loan, Matrix
// Computations, 4th ed., 2.4). The first window, of `duration` frames, is factorized exactly: the
// matrix of its complete tracks, frames by 2 x tracks, is U s V', of which the first `rank` columns
// of U become the basis. The window then moves by `step` frames at a time: tracks that have become
// complete get coefficients from the basis that is there, and the basis is extended over the unseen
// frames from the coefficients of all complete tracks, both by least squares. Nothing is factorized
// again. At the end every trajectory that meets at least `rank` frames gets its coefficients from
// the whole basis.
//
// Buffers are sized once for the clip and serve any number of windows. Needs 0 < step < duration;
// otherwise the window does not move.
class moving_factorizer {
 public:
  // Mean squares of what the fits left over, square pixels.
  struct move_residuals {
    std::uint64_t first;  // frame at which the window then stood
    double new_tracks;    // in the first window: what lies beyond the rank
    double new_frames;
  };

  // False, and error set, where LAPACK refuses a size.
  bool Setup(std::size_t feature_count, std::size_t frame_count, std::size_t rank,
             std::size_t duration, std::size_t step);

  // Factorizes from frame `first` over at most `limit` frames and returns the end frame, exclusive;
  // fills first, end, rank, basis, coefficients and flags of `window`. Returns `first` where fewer
  // than rank / 2 tracks are complete, and 0 with error set where LAPACK reports a failure.
  // center_x and center_y are taken from all positions beforehand.
  std::uint64_t Factorize(const stabilizer_global& global, std::uint64_t first, std::uint64_t limit,
                          double center_x, double center_y, factorization_window& window,
                          const progress_functor& progress);

  bool error() const { return error_; }
  // Of the last Factorize, one record for each position of the window.
  const std::vector<move_residuals>& residuals() const { return residuals_; }

 private:
  std::uint64_t Decompose(std::uint64_t first, std::uint64_t limit,
                          const progress_functor& progress);
  bool FactorizeFirstWindow(std::size_t first, std::size_t end);
  bool SolveNewTracks(std::size_t first, std::size_t end, std::size_t common, double& residual);
  bool SolveNewFrames(std::size_t first, std::size_t end, double& residual);
  bool FitAllTrajectories(factorization_window& window, const progress_functor& progress);
  void CollectStarted(std::size_t after, std::size_t first, std::size_t end);
  void FillMeasurements(std::size_t first, std::size_t end);
  bool LeastSquares(std::size_t rows, std::size_t right_hand_sides, double* a, double* b,
                    std::size_t b_stride);
  double* basis_row(std::size_t i) { return &basis_[i * frame_count_]; }

  std::size_t feature_count_ = 0;
  std::size_t frame_count_ = 0;
  std::size_t rank_ = 0;
  std::size_t duration_ = 0;
  std::size_t step_ = 0;
  bool error_ = false;

  // Of the factorization under way.
  const stabilizer_global* global_ = nullptr;
  double center_x_ = 0.0;
  double center_y_ = 0.0;
  std::size_t next_trajectory_ = 0;  // the first that has not started yet

  std::vector<std::int32_t> current_tracks_;  // complete over the window, ascending
  std::vector<std::int32_t> previous_tracks_;
  std::vector<std::int32_t> common_previous_;  // places in previous_tracks_ of those that go on
  std::vector<double> measurements_;           // a row of x and a row of y for each current track
  std::vector<double> overlap_rhs_;
  std::vector<double> coefficient_scratch_;  // row-major, 2 rows of rank numbers for each track
  std::vector<double> stacked_coefficients_;
  std::vector<double> u_matrix_;  // of the first window; then copies of the basis
  std::vector<double> vt_matrix_;
  std::vector<double> fit_matrix_;
  std::vector<double> singular_values_;
  std::vector<double> basis_;  // rank rows of frame_count numbers
  std::vector<double> workspace_;
  std::vector<move_residuals> residuals_;
};

}  // namespace marrow::stabilization
