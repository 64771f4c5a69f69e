#pragma once

#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/hx/hx_params.h"

namespace calmframe::host {

// Values by disk id, as projects keep them: sliders as they are, popups from 1, checkboxes 0 or 1.
using ParamValues = std::map<std::int32_t, double>;

// Present value of a record; none of those that have none (groups, buttons, layers).
std::optional<double> ValueOf(const HX_ParamDef& param);

// The parameters of one effect: index 0 is the layer, the others as the plug-in declared them. Any
// thread.
class ParamTable {
 public:
  // `declared` with index 0; see Host::declarations.
  explicit ParamTable(std::vector<HX_ParamDef> declared);

  std::size_t size() const;
  // Copies, null outside the table.
  std::optional<HX_ParamDef> At(std::int32_t index) const;
  std::vector<HX_ParamDef> All() const;
  // -1 when there is none.
  std::int32_t IndexOf(std::int32_t disk_id) const;

  // As the user sets it: clamped to what is valid. False for an index or a kind without a value,
  // and for what is not a number.
  bool SetByUser(std::int32_t index, double value);
  // As the plug-in writes it: the whole value, as it comes. False for an unknown index.
  bool SetByPlugin(std::int32_t index, const HX_ParamDef& param);
  // Behind all others.
  void Append(const HX_ParamDef& param);
  // Name, flags and ui_flags.
  bool UpdateUI(std::int32_t index, const HX_ParamDef& param);

  ParamValues Values() const;
  // Those that are known; others are left out.
  void SetValues(const ParamValues& values);
  // Tells the settings apart from any others: values of what the user can set, in the order of
  // declaration; equal in every process. Hidden parameters are the plug-in's own notes.
  std::string SettingsText() const;

 private:
  mutable std::mutex mutex_;
  std::vector<HX_ParamDef> params_;  // guarded by mutex_
};

}  // namespace calmframe::host
