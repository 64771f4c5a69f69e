#pragma once

#include <CLI/CLI.hpp>
#include <memory>
#include <string>

#include "apps/calmframe/controls.h"
#include "apps/calmframe/progress_line.h"
#include "apps/calmframe/steady_clip.h"

namespace calmframe {

void AddProjectFlag(CLI::App& command, std::string& project);

// The clip, with the work that the project keeps of it if there is such a file. Throws
// media::Failure when that is of another clip.
std::unique_ptr<SteadyClip> TakeUp(const std::string& clip, const std::string& project,
                                   const ControlFlags& controls);

// Does what is left to do, tells what was reused, and saves. No project is an empty name.
void WorkAndLeave(SteadyClip& clip, const std::string& project, ProgressLine& progress);

}  // namespace calmframe
