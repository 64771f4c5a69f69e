#include "stabilization/factorization/factorization_queue.h"

#include <algorithm>
#include <deque>
#include <stdexcept>

#include "platform/tessel/debug.h"
#include "stabilization/factorization/moving_factorizer.h"

namespace marrow::stabilization {

namespace {

void ClearOutputStatus(stabilizer_global& global, std::uint64_t first, std::uint64_t end) {
  for (std::size_t i = first * global.feature_count; i < end * global.feature_count; ++i) {
    global.output[i].status = -1;
  }
}

class moving_window_maker : public window_maker {
 public:
  moving_window_maker(stabilizer_global& global, const SolverParamsRecord& parameters,
                      const progress_functor& progress)
      : global_(global), parameters_(parameters), progress_(progress) {
    if (!factorizer_.Setup(global.feature_count, global.frame_count,
                           static_cast<std::size_t>(parameters.rank),
                           static_cast<std::size_t>(std::max(parameters.duration, 1)),
                           static_cast<std::size_t>(std::max(parameters.step, 0)))) {
      throw std::runtime_error("Factorization setup error [not enough frames?]");
    }
  }

  factorization_window make(std::uint64_t first, std::uint64_t limit) override {
    factorization_window window;
    factorizer_.Factorize(global_, first, limit, parameters_.center_x, parameters_.center_y, window,
                          progress_);
    if (factorizer_.error()) throw std::runtime_error("Unknown factorization error");
    progress_();
    reprojection_errors(global_, window, parameters_.center_x, parameters_.center_y);
    progress_();
    drop_short_tracks(global_, window, parameters_.short_trajectory_duration);
    progress_();
    drop_outliers(global_, window, parameters_.reconstruction_error_threshold);
    progress_();
    return window;
  }

  quality_result check(const factorization_window& window) override {
    return quality_check(global_, window, parameters_, parameters_.conservative_threshold,
                         progress_);
  }

 private:
  stabilizer_global& global_;
  const SolverParamsRecord& parameters_;
  const progress_functor& progress_;
  moving_factorizer factorizer_;
};

}  // namespace

std::vector<std::size_t> complete_trajectories(const stabilizer_global& global,
                                               std::int64_t duration) {
  const auto frames = static_cast<std::int64_t>(global.frame_count);
  std::vector<std::ptrdiff_t> change(global.frame_count + 1);
  for (const Trajectory& t : global.trajectories) {
    const std::int64_t last_start = t.last == frames ? frames - 1 : t.last - duration;
    if (last_start < t.first) continue;
    ++change[t.first];
    --change[last_start + 1];
  }
  std::vector<std::size_t> complete(global.frame_count);
  std::ptrdiff_t count = 0;
  for (std::size_t f = 0; f < global.frame_count; ++f) {
    count += change[f];
    complete[f] = static_cast<std::size_t>(count);
  }
  return complete;
}

void run_factorization_queue(stabilizer_global& global, const SolverParamsRecord& parameters,
                             const std::vector<std::size_t>& complete, window_maker& maker,
                             std::vector<factorization_window>& windows,
                             const progress_functor& progress) {
  const std::uint64_t frame_count = global.frame_count;
  const auto rank = static_cast<std::size_t>(parameters.rank);
  const auto overlap = static_cast<std::uint64_t>(parameters.factorization_window_overlap);
  const auto most = static_cast<std::uint64_t>(parameters.max_factorization_frames);
  const auto next_start = [&](std::uint64_t first, std::uint64_t end) {
    return end < first + overlap ? first : end - overlap;
  };
  std::uint64_t override_length = 0;
  std::deque<std::uint64_t> queue = {0};
  while (!queue.empty()) {
    progress();
    std::uint64_t first = queue.front();
    queue.pop_front();
    if (first >= frame_count) return;
    while (first < frame_count && 2 * complete[first] < rank) ++first;
    if (first == frame_count) return;
    progress();

    std::uint64_t limit = most;
    if (override_length != 0) {
      limit = override_length;
      override_length = 0;
    } else if (frame_count <= overlap + most + first) {
      limit = frame_count - first + 1;  // a short rest joins the window before it
    }
    windows.push_back(maker.make(first, limit));
    const std::uint64_t end = windows.back().end;
    progress();

    if (!parameters.conservative_factorization) {
      if (end < frame_count) queue.push_back(next_start(first, end));
      continue;
    }
    const quality_result quality = maker.check(windows.back());
    if (quality.passes) {
      if (queue.empty() && end < frame_count) queue.push_back(next_start(first, end));
      continue;
    }
    tessel::debug::Log("Factorization window [%d, %d) does not pass the quality check...",
                       static_cast<int>(first), static_cast<int>(end));
    windows.pop_back();
    queue.clear();
    if (quality.bad_frame - first < overlap) {
      tessel::debug::Log("abandon the window.");
    } else {
      tessel::debug::Log("truncated to [%d, %d)", static_cast<int>(first),
                         static_cast<int>(quality.bad_frame));
      override_length = quality.bad_frame - first;
      queue.push_back(first);
    }
    queue.push_back(quality.next_good_frame);
    ClearOutputStatus(global, first, end);
  }
}

void factorize_windows(stabilizer_global& global, const SolverParamsRecord& parameters,
                       std::vector<factorization_window>& windows,
                       const progress_functor& progress) {
  moving_window_maker maker(global, parameters, progress);
  ClearOutputStatus(global, 0, global.frame_count);
  run_factorization_queue(global, parameters, complete_trajectories(global, parameters.duration),
                          maker, windows, progress);
}

}  // namespace marrow::stabilization
