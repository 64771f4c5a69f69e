#pragma once

#include <string>
#include <utility>
#include <vector>

#include "host/project/project_file.h"

namespace calmframe::host {

// Saved work and the name of its file, for what is told of it.
struct NamedProject {
  std::string name;
  Project project;
};

// The saved work of a film, from that of stretches of it that were worked apart: their shots one
// behind the other, and what each found of the clip's frames. One at least, in any order. Throws
// ProjectFailure, which names the file: one of another clip, or that was stopped before its end,
// frames that two of them hold, and frames that none does.
Project JoinProjects(std::vector<NamedProject> parts);

}  // namespace calmframe::host
