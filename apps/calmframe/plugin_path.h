#pragma once

#include <string>

namespace calmframe {

// Where the plug-in's library lies: what the environment's CALMFRAME_PLUGIN names, else beside the
// program, else in lib/calmframe beside the program's folder.
std::string PluginPath();

}  // namespace calmframe
