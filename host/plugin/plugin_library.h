#pragma once

#include <memory>
#include <string>

#include "host/plugin/property_record.h"
#include "platform/hx/hx_effect.h"
#include "platform/hx/hx_exports.h"

namespace calmframe::host {

// What a plug-in offers to renderers outside of it; null where it does not.
struct PluginExports {
  HX_AllowCUDARendering allow_cuda_rendering = nullptr;
  HX_GetOVVarVector get_var_vector = nullptr;
  HX_GetCropWindow get_crop_window = nullptr;
  HX_GetStabilizerData get_stabilizer_data = nullptr;
  const void* fcd_table = nullptr;
};

// A plug-in in this process; nothing of it has been called. Its library is unloaded by the
// destructor.
class PluginLibrary {
 public:
  // Throws PluginError, whose line names the file and the cause.
  explicit PluginLibrary(const std::string& path);
  // One that is part of the program: its entry, and what a property record would tell.
  PluginLibrary(HX_EffectMain linked_entry, const PluginProperties& record,
                const PluginExports& linked_exports = {});

  const std::string& path() const { return path_; }  // of the program's own: the match name
  const PluginProperties& properties() const { return properties_; }
  HX_EffectMain entry() const { return entry_; }
  const PluginExports& exports() const { return exports_; }

 private:
  struct Close {
    void operator()(void* library) const;
  };

  std::string path_;
  std::unique_ptr<void, Close> library_;
  PluginProperties properties_;
  HX_EffectMain entry_ = nullptr;
  PluginExports exports_;
};

}  // namespace calmframe::host
