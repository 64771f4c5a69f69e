#include "stabilization/smoothing/smooth_windows.h"

#include <algorithm>
#include <memory>

#include "platform/tessel/debug.h"
#include "stabilization/models/similarity.h"
#include "stabilization/smoothing/window_solver.h"
#include "stabilization/transitions/transitions.h"
#include "stabilization/warp/cp_warper.h"

namespace marrow::stabilization {

namespace {

class window_smoother {
 public:
  window_smoother(stabilizer_global& global, std::vector<transition_record>& transitions,
                  std::vector<factorization_window>& windows, const std::vector<double>& lambdas,
                  const SolverParamsRecord& parameters, int width, int height,
                  const progress_functor& progress)
      : global_(global),
        transitions_(transitions),
        windows_(windows),
        parameters_(parameters),
        width_(width),
        height_(height),
        progress_(progress),
        translation_only_(parameters.method_level < 1.5f),
        solver_(global, parameters, lambdas, progress) {}

  bool Run() {
    while (DropWeakWindows()) {
    }
    if (windows_.empty()) {
      Bridge(0, global_.frame_count, similarity{});
      return true;
    }
    progress_();
    if (windows_.front().first != 0) {
      Bridge(0, JoinFrame(windows_.front()), similarity{});
    }
    for (std::size_t w = 0; w < windows_.size(); ++w) {
      factorization_window& window = windows_[w];
      solver_.load(w == 0 ? window : windows_[w - 1], window);
      FillOverlapRows(w);
      tessel::debug::Log("factorization window (%d : %d)\n", static_cast<int>(window.first),
                         static_cast<int>(window.end));
      if (!(parameters_.no_motion ? solver_.solve_window_no_motion() : solver_.solve_window())) {
        return false;
      }
      progress_();
      const std::uint64_t gap_end = GapEnd(w);
      if (gap_end > window.end) BridgeGap(window, gap_end);
    }
    return true;
  }

 private:
  // Up to where the transition before a window reaches into it.
  std::uint64_t JoinFrame(const factorization_window& window) const {
    return std::min<std::uint64_t>(
        window.end,
        window.first + static_cast<std::uint64_t>(parameters_.transition_window_overlap));
  }

  void Bridge(std::uint64_t first, std::uint64_t end, const similarity& target) {
    if (parameters_.no_motion) {
      lockdown_window(global_, first, end, parameters_, target, transitions_, progress_);
    } else {
      transition_window(global_, first, end, parameters_, width_, height_, translation_only_,
                        transitions_, progress_);
    }
  }

  // Where the frames behind window w that it and its successor leave open end; its own end if
  // there are none.
  std::uint64_t GapEnd(std::size_t w) const {
    if (w + 1 == windows_.size()) return global_.frame_count;
    const factorization_window& next = windows_[w + 1];
    return windows_[w].end >= next.first ? windows_[w].end : JoinFrame(next);
  }

  // Gives up the windows that a bridge follows and whose last rows hold too few tracks to lead
  // into it; what they covered joins the gap. True where there were any: the window before one may
  // have a gap behind it now.
  bool DropWeakWindows() {
    std::vector<bool> weak;
    for (std::size_t w = 0; w < windows_.size(); ++w) {
      weak.push_back(GapEnd(w) > windows_[w].end && !TailIsHeld(windows_[w]));
    }
    std::size_t w = 0;
    if (std::erase_if(windows_, [&](const factorization_window&) { return weak[w++]; }) == 0) {
      return false;
    }
    tail_warper_.reset();
    return true;
  }

  std::uint64_t TailLength(const factorization_window& window) const {
    return std::min<std::uint64_t>(window.end - window.first,
                                   static_cast<std::uint64_t>(parameters_.transition_tail_overlap));
  }

  bool TailIsHeld(const factorization_window& window) {
    for (std::uint64_t f = window.end - TailLength(window); f < window.end; ++f) {
      if (TailWarper().displacements(f).size() < CPWarper::kLeastForProjection) return false;
    }
    return true;
  }

  void FillOverlapRows(std::size_t w) {
    factorization_window& window = windows_[w];
    const factorization_window* previous = w == 0 ? nullptr : &windows_[w - 1];
    const bool behind_factorization = previous && previous->end > window.first;
    window.overlap_end = window.first;
    if (behind_factorization) {
      window.overlap_end = previous->end;
    } else if (previous ? previous->end < window.first : window.first != 0) {
      window.overlap_end = JoinFrame(window);
    }
    solver_.overlap_from_transition = !behind_factorization;

    window.overlap_rows.clear();
    const std::size_t columns = global_.feature_count;
    for (std::size_t f = window.first; f < window.overlap_end; ++f) {
      const auto row = global_.output.begin() + static_cast<std::ptrdiff_t>(f * columns);
      window.overlap_rows.insert(window.overlap_rows.end(), row,
                                 row + static_cast<std::ptrdiff_t>(columns));
      progress_();
    }
    if (behind_factorization) MarkSolvedBy(*previous, window);
  }

  // Leaves in the overlap rows only what the previous window solved.
  void MarkSolvedBy(const factorization_window& previous, factorization_window& window) {
    for (track_sample& sample : window.overlap_rows) sample.status = -1;
    const std::size_t begin = previous.trajectories_begin;
    for (std::size_t t = begin; t < begin + previous.trajectory_flags.size(); ++t) {
      if (!previous.takes_part(t)) continue;
      const Trajectory& trajectory = global_.trajectories[t];
      const auto first =
          std::max(static_cast<std::size_t>(trajectory.first), std::size_t{window.first});
      const auto end =
          std::min(static_cast<std::size_t>(trajectory.last), std::size_t{window.overlap_end});
      for (std::size_t f = first; f < end; ++f) {
        window
            .overlap_rows[(f - window.first) * global_.feature_count +
                          static_cast<std::size_t>(trajectory.feature)]
            .status = f == first ? 1 : 0;
      }
      progress_();
    }
  }

  // The window's last rows serve the bridge cleaned of outliers, as frames that move as one, and
  // are put back afterwards.
  void BridgeGap(const factorization_window& window, std::uint64_t gap_end) {
    const std::uint64_t tail = TailLength(window);
    const std::size_t columns = global_.feature_count;
    const auto tail_begin =
        global_.output.begin() + static_cast<std::ptrdiff_t>((window.end - tail) * columns);
    const std::vector<track_sample> tail_rows(
        tail_begin, tail_begin + static_cast<std::ptrdiff_t>(tail * columns));
    if (tail > 0) {
      const auto last = static_cast<std::int32_t>(window.end - 1);
      CPWarper& warper = TailWarper();
      warper.pruneDisplacements(last);
      warper.reweightRecent(last);
      for (std::uint64_t f = window.end - tail; f < window.end; ++f) {
        warper.projectFrame(static_cast<std::int32_t>(f), translation_only_);
      }
    }
    Bridge(window.end, gap_end, parameters_.no_motion ? FitAcross(window.end) : similarity{});
    std::copy(tail_rows.begin(), tail_rows.end(), tail_begin);
  }

  // Made when a gap asks for it: a clip without gaps never pays for its lists. They depend on the
  // windows and the input alone, so it does not matter when they are made.
  CPWarper& TailWarper() {
    if (!tail_warper_) {
      tail_warper_ = std::make_unique<CPWarper>(static_cast<std::int32_t>(global_.frame_count),
                                                width_, height_);
      tail_warper_->buildDisplacementsForWindows(global_, windows_, parameters_);
    }
    return *tail_warper_;
  }

  // The similarity from the input of `frame` to the output of the frame before it.
  similarity FitAcross(std::uint64_t frame) const {
    std::vector<point2> source, target;
    for (const Trajectory& t : global_.trajectories) {
      if (static_cast<std::uint64_t>(t.first) >= frame) break;
      if (static_cast<std::uint64_t>(t.last) <= frame) continue;
      const auto feature = static_cast<std::size_t>(t.feature);
      const track_sample& before = global_.output_at(frame - 1, feature);
      if (before.status < 0) continue;
      const track_sample& here = global_.input_at(frame, feature);
      source.push_back({here.x, here.y});
      target.push_back({before.x, before.y});
    }
    return fit_similarity_pairs(source, target);
  }

  stabilizer_global& global_;
  std::vector<transition_record>& transitions_;
  std::vector<factorization_window>& windows_;
  const SolverParamsRecord& parameters_;
  const int width_;
  const int height_;
  const progress_functor& progress_;
  const bool translation_only_;
  window_solver solver_;
  std::unique_ptr<CPWarper> tail_warper_;
};

}  // namespace

bool smooth_windows(stabilizer_global& global, std::vector<transition_record>& transitionWindows,
                    std::vector<factorization_window>& factorizationWindows,
                    const std::vector<double>& lambdas, const SolverParamsRecord& parameters,
                    int width, int height, const progress_functor& progress) {
  return window_smoother(global, transitionWindows, factorizationWindows, lambdas, parameters,
                         width, height, progress)
      .Run();
}

}  // namespace marrow::stabilization
