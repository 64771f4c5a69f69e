#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "stabilization/factorization/active_track.h"
#include "stabilization/models/matrix3.h"
#include "stabilization/progress.h"
#include "stabilization/solve_records.h"
#include "stabilization/solver_params.h"

namespace marrow::stabilization {

// Solves one factorization window after the other for a steady basis. Unknowns are u[f][i], the
// value of basis signal i on frame f of the window; a track with coefficients (cx, cy) then lies at
// (cx . u[f], cy . u[f]). The sum of squares to be least, over tracks and frames, with fade the
// track's weight, norm[f] = 1 / (sum of fade squared over the tracks on f), p the track's position
// by u and o the tracked one:
//   fade^2 norm |p - o|^2                                      stay near where the track was
//   fade^2 norm 100 (1 - f / L) |p - q|^2    f < L             agree with the solved overlap rows q
//   (lambda fade)^2 norm |p[f-1] - 2 p[f] + p[f+1]|^2          be smooth
// and 0.01 |u[f]|^2 on frames with fewer tracks than the rank. One sparse symmetric system whose
// matrix reaches two blocks of rank x rank off the diagonal. In the No Motion form o and q are
// the track's place on the overlap's first row, with weight 100 throughout, and a track without one
// has no such terms; where none has one, o is its place on the window's middle frame. The
// smoothness is 2000 fade times the first difference.
//
// A matrix that is not positive definite is a failure and stays one: tracks of lower rank than the
// solve's make it so, and the caller then lowers the rank. Nothing is added to the diagonal to save
// it.
class window_solver {
 public:
  // Everything must outlive this object; lambdas has one number for each frame of the clip.
  window_solver(stabilizer_global& global, const SolverParamsRecord& parameters,
                const std::vector<double>& lambdas, const progress_functor& progress);

  // Takes the window to solve next; previous is the same window for the first one. Both must
  // outlive the solve.
  void load(const factorization_window& previous, const factorization_window& current);

  // Solve the loaded window and write its tracks' positions and statuses into global.output. False
  // where the linear solve failed; output is untouched then.
  bool solve_window();
  bool solve_window_no_motion();

  // Of the last window: `rank` rows of the window's length.
  const std::vector<double>& solved_basis() const { return solved_basis_; }

  // The overlap rows came from a transition, not from the previous factorization window.
  bool overlap_from_transition = false;

 private:
  void Begin();
  point2 MiddlePosition(const active_track& track) const;
  void FillOuterProduct(const active_track& track);
  void AddData(const active_track& track, std::size_t frame, double weight, double x, double y);
  void AddOuterProduct(std::vector<double>& blocks, std::size_t frame, double weight);
  bool HasOverlapSample(const active_track& track, std::size_t frame) const;
  const track_sample& OverlapSample(const active_track& track, std::size_t frame) const;
  std::size_t Feature(const active_track& track) const;
  void BuildStructure();
  void AddBlock(std::size_t frame, std::size_t offset, const double* block, double factor);
  bool Solve();
  bool SolveSparse();
  void WriteOutput();

  stabilizer_global& global_;
  const SolverParamsRecord& parameters_;
  const std::vector<double>& lambdas_;
  const progress_functor& progress_;
  const factorization_window* previous_window_ = nullptr;
  const factorization_window* current_window_ = nullptr;

  std::size_t rank_ = 0;
  std::size_t length_ = 0;
  std::size_t packed_ = 0;  // numbers in the upper triangle of a block
  window_tracks loaded_;
  std::vector<double> frame_norm_;
  std::vector<std::size_t> track_count_;
  std::vector<double> outer_product_;  // cx cx' + cy cy' of one track, upper triangle by rows
  // Per frame, upper triangles like it: sums of outer products for the data terms, and for the
  // difference terms whose stencil stands at that frame.
  std::vector<double> data_blocks_;
  std::vector<double> smooth_blocks_;
  // The matrix, as the direct solver takes it: upper triangle by rows, one-based.
  std::vector<std::int32_t> row_starts_;
  std::vector<std::int32_t> columns_;
  std::vector<double> values_;
  std::vector<double> right_hand_side_;
  std::vector<double> solution_;
  std::vector<double> solved_basis_;
};

}  // namespace marrow::stabilization
