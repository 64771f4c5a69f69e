#include "stabilization/stabilizer_main.h"

#include <cstddef>

#include "platform/tessel/debug.h"
#include "stabilization/factorization/factorization_queue.h"
#include "stabilization/smoothing/smooth_windows.h"

namespace marrow::stabilization {

namespace {

void ClearOutputStatus(stabilizer_global& global) {
  for (track_sample& sample : global.output) sample.status = -1;
}

void BuildLongTrajectories(stabilizer_global& global, const SolverParamsRecord& parameters,
                           const progress_functor& progress) {
  progress();
  global.trajectories =
      tracking::BuildTrajectories(global.input.data(), global.feature_count, global.frame_count);
  progress();
  tessel::debug::Log("TRK file loaded from %s: %d features, %d frames, %d trajectories.",
                     global.file_name.c_str(), static_cast<int>(global.feature_count),
                     static_cast<int>(global.frame_count),
                     static_cast<int>(global.trajectories.size()));
  const std::size_t removed = std::erase_if(global.trajectories, [&](const Trajectory& t) {
    return t.last - t.first < parameters.min_duration;
  });
  progress();
  tessel::debug::Log(
      "Removed trajectories shorter than %d frames: %d trajectories removed, %d trajectories "
      "left.",
      parameters.min_duration, static_cast<int>(removed),
      static_cast<int>(global.trajectories.size()));
}

}  // namespace

int stabilizer_main(stabilizer_global& global, const SolverParamsRecord& parameters,
                    std::vector<transition_record>& transitionWindows,
                    std::vector<factorization_window>& factorizationWindows, int width, int height,
                    const progress_functor& progress) {
  SolverParamsRecord current = parameters;
  while (current.rank > 0) {
    const std::size_t rank = static_cast<std::size_t>(current.rank);
    BuildLongTrajectories(global, current, progress);
    if (global.frame_count < rank) {
      tessel::debug::Log("Moving factorizatoin disabled because of too few frames (%d).",
                         static_cast<int>(global.frame_count));
    }
    ClearOutputStatus(global);
    if (global.frame_count >= rank && 2 * global.feature_count >= rank) {
      factorize_windows(global, current, factorizationWindows, progress);
    }
    const std::vector<double> lambdas(global.frame_count, current.smoothness_lambda);
    if (smooth_windows(global, transitionWindows, factorizationWindows, lambdas, current, width,
                       height, progress)) {
      return 1;
    }
    current.rank >>= 1;
    transitionWindows.clear();
    factorizationWindows.clear();
    tessel::debug::Log("stabilizer failed, trying lower rank %d\n", current.rank);
  }
  return 0;
}

}  // namespace marrow::stabilization
