#pragma once

#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

#include "host/stabilize/framing.h"
#include "host/stabilize/outcome.h"
#include "host/stabilize/shown_path.h"
#include "host/stabilize/steady_clip.h"
#include "library/calmframe.h"

namespace calmframe::library {

// A shot that was worked.
struct ShotResult {
  std::int64_t first = 0, end = 0;
  bool solved = false;
  host::Outcome outcome;
  nlohmann::ordered_json choice;                     // null: nothing was chosen
  std::optional<std::vector<calmframe_place>> path;  // once it was asked for
};

calmframe_outcome OutcomeOf(const host::Outcome& outcome);
calmframe_shot ShotOf(const ShotResult& result);
// Of the shots that are solved; of none one that shows the clip as it was filmed.
host::Outcome OutcomeOf(const std::vector<ShotResult>& shots, double frames_per_second);
// See calmframe_get_report.
std::string ReportOf(const std::vector<ShotResult>& shots, double frames_per_second,
                     const std::vector<std::string>& warnings);

// A shot's, one place a frame. `rows_a_frame`: 2 of an interlaced clip.
std::vector<calmframe_place> PlacesOf(const host::ShownPath& path, std::int64_t frames,
                                      int rows_a_frame);
std::vector<calmframe_place> PlacesAtRest(std::int64_t frames);

}  // namespace calmframe::library
