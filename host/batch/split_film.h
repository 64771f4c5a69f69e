#pragma once

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

#include "host/batch/local_batch.h"
#include "host/batch/plan.h"

namespace calmframe::batch {

// How a film is worked in pieces, each a task like a clip's, so that as many machines as there are
// can share it: its shots are looked for, each is analysed, what they left becomes one project,
// stretches of frames are drawn from that, and these are joined.
struct SplitSettings {
  // Flags for the program's commands, of those that are the plan's settings.
  std::vector<std::string> looking = {}, analysis = {}, drawing = {};
  std::size_t frames_a_piece = 0;  // that a task draws; 0: 250, or more of a long film
};

// Runs all tasks of a stage, on whatever machines; returns when each has ended, or once the watcher
// stops them.
using RunStage = std::function<void(const Plan& stage, BatchWatcher& watcher)>;

// Works one of the plan's films in pieces, as far as it is not done; pieces of an earlier run are
// taken up. The watcher is told of the film alone: `shares` are those of all the plan's tasks. A
// piece that fails fails the film, and the others stay for the next run; with the film whole they
// go.
void SteadyInPieces(const Plan& plan, std::size_t film, const SplitSettings& settings,
                    const RunStage& run, std::vector<double>& shares, BatchWatcher& watcher);

}  // namespace calmframe::batch
