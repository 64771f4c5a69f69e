#pragma once

#include <nlohmann/json_fwd.hpp>

#include "host/stabilize/shown_path.h"

namespace calmframe::studio {

// What a page plots of a shot, a number a frame (a field, where it is interlaced), null where there
// is none: "before" and "after" with "x", "y" (pixels of the source), "angle" (degrees) and "zoom"
// of the camera, summed up from the shot's first frame; "zooms", and "black" (0 to 1).
nlohmann::json CurvesOf(const host::ShownPath& path);

}  // namespace calmframe::studio
