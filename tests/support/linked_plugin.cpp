#include "tests/support/linked_plugin.h"

// The plug-in's own; see stabilizer/effect/src/renderer_exports.cpp.
extern "C" {
std::remove_pointer_t<HX_AllowCUDARendering> allowCUDARendering;
std::remove_pointer_t<HX_GetOVVarVector> getOVVarVector;
std::remove_pointer_t<HX_GetCropWindow> getCropWindow;
std::remove_pointer_t<HX_GetStabilizerData> getStabilizerData;
}

namespace calmframe::host {

PluginLibrary LinkedPlugin(HX_EffectMain entry) {
  PluginProperties properties;
  properties.match_name = "KLPX SubspaceStabilizer";
  properties.entry = "EffectMainExtra";
  return PluginLibrary(entry, properties,
                       {allowCUDARendering, getOVVarVector, getCropWindow, getStabilizerData});
}

}  // namespace calmframe::host
