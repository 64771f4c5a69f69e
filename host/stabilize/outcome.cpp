#include "host/stabilize/outcome.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <nlohmann/json.hpp>

namespace calmframe::host {

double Outcome::decibels() const {
  constexpr double kNone = 0.05;  // what nobody sees, and the tracks' own noise
  return 20 * std::log10(std::max(before.mean, kNone) / std::max(after.mean, kNone));
}

std::string Outcome::Text() const {
  constexpr double kBlack = 0.001;
  char black[64] = "nothing black";
  if (most_black > kBlack) {
    std::snprintf(black, sizeof black, "%.1f %% black in the worst frame", 100 * most_black);
  }
  const int seconds = static_cast<int>(after.worst_at);
  char text[256];
  std::snprintf(text, sizeof text,
                "%.0f %% of the width kept, zoom %.2f at most, %s; shake %.1f -> %.1f per mille of "
                "the width (%.1f dB %s), at its worst %.1f at %d:%02d%s",
                100 * width_kept, most_zoom, black, before.mean, after.mean, std::abs(decibels()),
                decibels() < 0 ? "more" : "less", after.worst, seconds / 60, seconds % 60,
                bends ? "" : "; no frame is bent");
  return text;
}

nlohmann::ordered_json Outcome::Json() const {
  const auto rounded = [](double value) { return std::round(value * 10000) / 10000; };
  nlohmann::ordered_json object;
  object["window"] = follows ? "follow" : "steady";
  object["bends"] = bends;
  object["width_kept"] = rounded(width_kept);
  object["most_zoom"] = rounded(most_zoom);
  object["most_black"] = rounded(most_black);
  object["shake_before"] = rounded(before.mean);
  object["shake_after"] = rounded(after.mean);
  object["decibels"] = rounded(decibels());
  object["worst_shake"] = rounded(after.worst);
  object["worst_at"] = rounded(after.worst_at);
  return object;
}

Outcome MeasureOutcome(const SolvedClip& clip, const Background& background,
                       const std::vector<Similarity>& windows, double frames_per_second) {
  const ShownMotion shown = MotionShown(clip, background, windows);
  Outcome outcome;
  outcome.before = MeasureShake(MotionOfSource(clip, background), frames_per_second);
  outcome.after = MeasureShake(shown, frames_per_second);
  outcome.width_kept = 0;
  for (std::size_t f = 0; f < shown.zooms.size(); ++f) {
    outcome.width_kept += 1 / shown.zooms[f] / static_cast<double>(shown.zooms.size());
    outcome.most_zoom = std::max(outcome.most_zoom, shown.zooms[f]);
    outcome.most_black = std::max(outcome.most_black, shown.uncovered[f]);
  }
  return outcome;
}

}  // namespace calmframe::host
