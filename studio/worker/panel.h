#pragma once

#include <nlohmann/json_fwd.hpp>
#include <vector>

#include "host/stabilize/steady_clip.h"

namespace calmframe::studio {

// The effect's rows, in their order, as the effect has them now: "id", "kind" (as KindText, or
// "group", "end", "button"), "name", "enabled", "expert", and of a control what DeclarationJson
// tells, "value", of a slider also "from", "to" (of the control itself), "digits" and "percent";
// of a group "closed". Hidden rows, which are the effect's notes, are left out.
nlohmann::json PanelOf(host::SteadyClip& clip);

}  // namespace calmframe::studio
