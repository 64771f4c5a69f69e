#pragma once

#include <cstddef>
#include <nlohmann/json_fwd.hpp>
#include <set>

#include "host/effects/param_table.h"
#include "host/effects/track_point.h"
#include "host/stabilize/framing.h"

namespace calmframe::studio {

// A clip keeps them with each step that can be undone.
inline constexpr std::size_t kMostDeletedTracks = 20000;

// What a person has set for a clip: of the effect's controls those that were touched, what of each
// frame is shown, and the tracks that nothing is to be solved with.
struct Settings {
  host::ParamValues controls;
  host::WindowSettings window;
  std::set<host::TrackPoint> deleted;  // a point of each track
};

// {"controls": {"20": 80}, "window": {"kind": "follow", "most_zoom": 1.2, "zoom_speed": 5,
// "still": "subject", "as_set": true}, "deleted": [[12, 3], [12, 40]]}, of frames and slots; what
// is as it comes is left out.
nlohmann::json JsonOf(const Settings& settings);
// Of such an object, also of one that somebody made up: what isn't known is left out. Throws
// std::invalid_argument, one line, for a value of another kind or out of range, more controls than
// an effect has, and more deleted tracks than kMostDeletedTracks.
Settings SettingsOf(const nlohmann::json& json);

}  // namespace calmframe::studio
