#pragma once

#include <type_traits>

#include "host/plugin/plugin_library.h"

// The plug-in's own; see stabilizer/effect/src/plugin_entry.cpp.
extern "C" std::remove_pointer_t<HX_EffectMain> EffectMainExtra;

namespace calmframe::host {

// The plug-in as a part of the program, behind `entry`.
PluginLibrary LinkedPlugin(HX_EffectMain entry = EffectMainExtra);

}  // namespace calmframe::host
