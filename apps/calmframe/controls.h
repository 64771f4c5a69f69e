#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "apps/calmframe/flags.h"
#include "platform/hx/hx_params.h"

namespace calmframe {

// How a command line sets the effect's controls.
struct ControlFlags {
  std::map<std::int32_t, double> values;  // of the controls with a flag, by disk id; those given
  std::vector<std::string> params;        // "NAME=VALUE" of any parameter
  bool experimental = false;              // `params` may name experimental ones
};

// Adds a flag for each of the user's controls, by the control's name, --param and --experimental.
void AddControlFlags(CLI::App& command, ControlFlags& flags);

// Whether a parameter has a flag of its own.
bool HasFlag(std::int32_t disk_id);

// The parameters that are offered, of all that the effect declares.
std::vector<HX_ParamDef> OfferedParams(const ControlFlags& flags,
                                       const std::vector<HX_ParamDef>& declared);

// Values by disk id, all of them valid, later ones of one parameter counting. `declared`: all of
// the effect's parameters. Throws UsageFailure, with the nearest name for an unknown one.
std::map<std::int32_t, double> ResolveControls(const ControlFlags& flags,
                                               const std::vector<HX_ParamDef>& declared);

}  // namespace calmframe
