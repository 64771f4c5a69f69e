#include "editors/mlt/controls.h"

#include <array>
#include <charconv>
#include <cmath>
#include <stdexcept>
#include <string_view>

namespace calmframe::mlt {
namespace {

struct Item {
  std::string_view value, control_value;
};

// A property and its control. Numbers have a range; others have items, the first of which is the
// default.
struct Row {
  const char *property, *control;
  double least = 0, most = 0, initial = 0;
  std::array<Item, 4> items = {};
  bool needs_analysis = false;
};

constexpr Row kRows[] = {
    {"smoothness", "Smoothness", 0, 1000, 50},
    {.property = "result",
     .control = "Result",
     .items = {{{"smooth-motion", "Smooth Motion"}, {"no-motion", "No Motion"}}}},
    {.property = "method",
     .control = "Method",
     .items = {{{"subspace-warp", "Subspace Warp"},
                {"perspective", "Perspective"},
                {"position-scale-rotation", "Position, Scale, Rotation"},
                {"position", "Position"}}}},
    {.property = "framing",
     .control = "Framing",
     .items = {{{"crop-auto-scale", "Stabilize, Crop, Auto-scale"},
                {"crop", "Stabilize, Crop"},
                {"stabilize-only", "Stabilize Only"}}}},
    {"maximum_scale", "Maximum Scale", 100, 10000, 150},
    {"crop_less_smooth_more", "Crop Less <-> Smooth More", 0, 100, 50},
    {.property = "window",
     .control = "window",
     .items = {{{"auto", "auto"}, {"follow", "follow"}, {"steady", "steady"}}}},
    {"zoom_at_most", "zoom-at-most", 0, 100, 0},
    {"zoom_speed", "zoom-speed", 0, 1000, 5},
    {.property = "steady",
     .control = "steady",
     .items = {{{"auto", "auto"}, {"background", "background"}, {"subject", "subject"}}}},
    {.property = "as_set", .control = "as-set", .items = {{{"0", "off"}, {"1", "on"}}}},
    {"additional_scale", "Additional Scale", 0, 10000, 100},
    {"action_safe_margin", "Action-safe Margin", 0, 100, 0},
    {.property = "rolling_shutter_ripple",
     .control = "Rolling Shutter Ripple",
     .items = {{{"automatic", "Automatic Reduction"}, {"enhanced", "Enhanced Reduction"}}}},
    {.property = "detailed_analysis",
     .control = "Detailed Analysis",
     .items = {{{"0", "off"}, {"1", "on"}}},
     .needs_analysis = true}};

std::string TextOf(double number) {
  char text[32];
  return {text, std::to_chars(text, text + sizeof text, number).ptr};
}

[[noreturn]] void Refuse(const Row& row, const std::string& value, const std::string& possible) {
  std::string line = row.property;
  line.append(" is '").append(value).append("', and can be ").append(possible);
  throw std::runtime_error(line);
}

Controls Read(mlt_properties properties, bool needs_analysis) {
  Controls controls;
  for (const Row& row : kRows) {
    const char* const given = mlt_properties_get(properties, row.property);
    if (row.needs_analysis != needs_analysis || !given || !*given) continue;
    if (row.items[0].value.empty()) {
      const double number = mlt_properties_get_double(properties, row.property);
      if (!(number >= row.least && number <= row.most)) {
        Refuse(row, given, TextOf(row.least) + " to " + TextOf(row.most));
      }
      if (number != row.initial) controls.emplace_back(row.control, TextOf(number));
      continue;
    }
    const Item* chosen = nullptr;
    std::string possible;
    for (const Item& item : row.items) {
      if (item.value.empty()) break;
      if (!possible.empty()) possible += ", ";
      possible += item.value;
      if (item.value == given) chosen = &item;
    }
    if (!chosen) Refuse(row, given, possible);
    if (chosen != &row.items[0]) controls.emplace_back(row.control, chosen->control_value);
  }
  return controls;
}

}  // namespace

Controls ReadAnalysisControls(mlt_properties properties) {
  return Read(properties, true);
}

Controls ReadSolveControls(mlt_properties properties) {
  return Read(properties, false);
}

}  // namespace calmframe::mlt
