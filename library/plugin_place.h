#pragma once

#include <string>

namespace calmframe::library {

// The plug-in: where CALMFRAME_PLUGIN of the environment says, else beside this library, else where
// it was installed with it.
std::string PluginPlace();

}  // namespace calmframe::library
