#pragma once

#include <string>

namespace calmframe {

// Where the plug-in's library lies: what the environment's CALMFRAME_PLUGIN names, else beside the
// program, as in a build, else where an installation has it, seen from the program.
std::string PluginPath();

}  // namespace calmframe
