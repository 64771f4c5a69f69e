#pragma once

#include <deque>
#include <string>
#include <vector>

#include "host/effects/param_table.h"
#include "host/stabilize/framing.h"

namespace calmframe::library {

// The controls of a session by name: those of the effect, and what of each frame is shown.
class ControlSet {
 public:
  // As a loaded effect declares them, which may go afterwards.
  explicit ControlSet(const std::vector<HX_ParamDef>& declared);
  ControlSet(const ControlSet&) = delete;
  ControlSet& operator=(const ControlSet&) = delete;

  // See calmframe_set. Throws Refusal and ParamRefused.
  void Set(const std::string& name, const std::string& value);

  // What was set of the effect's.
  const host::ParamValues& values() const { return values_; }
  const host::WindowSettings& window() const { return window_; }

  // See calmframe_get_controls.
  std::string Json() const;

 private:
  bool SetWindow(const std::string& name, const std::string& value);

  std::vector<HX_ParamDef> declared_;
  std::deque<std::string> items_;  // that they point at
  host::ParamValues values_;
  host::WindowSettings window_;
};

}  // namespace calmframe::library
