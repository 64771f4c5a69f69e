#include "host/stabilize/outcome.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdio>
#include <iterator>
#include <nlohmann/json.hpp>
#include <stdexcept>
#include <utility>

namespace calmframe::host {

namespace {

constexpr const char* kWindows[] = {"steady", "follow", "none"};  // as Outcome::Window counts

double Rounded(double value) {
  return std::round(value * 10000) / 10000;
}

double Decibels(double before, double after) {
  constexpr double kNone = 0.05;  // what nobody sees, and the tracks' own noise
  return 20 * std::log10(std::max(before, kNone) / std::max(after, kNone));
}

}  // namespace

double Outcome::decibels() const {
  return Decibels(before.mean, after.mean);
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
                "the width (%.1f dB %s), at its worst %.1f at %d:%02d",
                100 * width_kept, most_zoom, black, before.mean, after.mean, std::abs(decibels()),
                decibels() < 0 ? "more" : "less", after.worst, seconds / 60, seconds % 60);
  return text;
}

nlohmann::ordered_json Outcome::Json() const {
  nlohmann::ordered_json object;
  object["window"] = kWindows[static_cast<std::size_t>(window)];
  object["bends"] = bends;
  object["width_kept"] = Rounded(width_kept);
  object["most_zoom"] = Rounded(most_zoom);
  object["most_black"] = Rounded(most_black);
  object["shake_before"] = Rounded(before.mean);
  object["shake_after"] = Rounded(after.mean);
  // Of what stands here, so that it is the same when it is read and written again.
  object["decibels"] = Rounded(Decibels(Rounded(before.mean), Rounded(after.mean)));
  object["worst_shake"] = Rounded(after.worst);
  object["worst_at"] = Rounded(after.worst_at);
  object["tracks_before"] = Rounded(tracks_before);
  object["tracks_after"] = Rounded(tracks_after);
  object["wobble_before"] = Rounded(wobble_before);
  object["wobble_after"] = Rounded(wobble_after);
  object["straying"] = Rounded(straying.mean);
  object["worst_straying"] = Rounded(straying.worst);
  return object;
}

Outcome Outcome::Parse(const nlohmann::json& object) {
  Outcome outcome;
  const auto window = std::find(std::begin(kWindows), std::end(kWindows), object.at("window"));
  if (window == std::end(kWindows)) throw std::invalid_argument("no window");
  outcome.window = static_cast<Window>(window - std::begin(kWindows));
  outcome.bends = object.at("bends").get<bool>();
  for (const auto& [name, value] : {std::pair{"width_kept", &outcome.width_kept},
                                    {"most_zoom", &outcome.most_zoom},
                                    {"most_black", &outcome.most_black},
                                    {"shake_before", &outcome.before.mean},
                                    {"shake_after", &outcome.after.mean},
                                    {"worst_shake", &outcome.after.worst},
                                    {"worst_at", &outcome.after.worst_at},
                                    {"tracks_before", &outcome.tracks_before},
                                    {"tracks_after", &outcome.tracks_after},
                                    {"wobble_before", &outcome.wobble_before},
                                    {"wobble_after", &outcome.wobble_after}}) {
    *value = object.at(name).get<double>();
  }
  // Choices that were saved before it was measured lack it.
  outcome.straying.mean = object.value("straying", 0.0);
  outcome.straying.worst = object.value("worst_straying", 0.0);
  return outcome;
}

Outcome AsFilmed() {
  Outcome outcome;
  outcome.window = Outcome::Window::none;
  outcome.bends = false;
  return outcome;
}

Outcome OutcomeOf(const std::vector<ShotOutcome>& shots) {
  double frames = 0;
  for (const ShotOutcome& shot : shots) frames += static_cast<double>(shot.frames);
  Outcome film;
  film.window = Outcome::Window::none;
  film.bends = false;
  film.width_kept = 0;
  for (const ShotOutcome& shot : shots) {
    const Outcome& own = shot.outcome;
    if (own.window == Outcome::Window::follow || film.window == Outcome::Window::none) {
      film.window = own.window;
    }
    film.bends = film.bends || own.bends;
    film.most_zoom = std::max(film.most_zoom, own.most_zoom);
    film.most_black = std::max(film.most_black, own.most_black);
    if (own.after.worst >= film.after.worst) {
      film.after.worst = own.after.worst;
      film.after.worst_at = shot.begins + own.after.worst_at;
    }
    const double share = static_cast<double>(shot.frames) / frames;
    film.width_kept += share * own.width_kept;
    film.before.mean += share * own.before.mean;
    film.after.mean += share * own.after.mean;
    film.tracks_before += share * own.tracks_before;
    film.tracks_after += share * own.tracks_after;
    film.wobble_before += share * own.wobble_before;
    film.wobble_after += share * own.wobble_after;
    film.straying.mean += share * own.straying.mean;
    film.straying.worst = std::max(film.straying.worst, own.straying.worst);
  }
  return film;
}

Outcome MeasureSource(const ShownMotion& source, double frames_per_second) {
  Outcome outcome = MeasureOutcome(Outcome(), source, frames_per_second);
  outcome.before = outcome.after;
  outcome.wobble_before = outcome.wobble_after;
  outcome.tracks_before = outcome.tracks_after;
  return outcome;
}

Outcome MeasureOutcome(const Outcome& source, const ShownMotion& shown, double frames_per_second) {
  Outcome outcome;
  outcome.before = source.before;
  outcome.after = MeasureShake(shown, frames_per_second);
  outcome.wobble_before = source.wobble_before;
  outcome.tracks_before = source.tracks_before;
  outcome.tracks_after = MeasureTrackShake(shown, frames_per_second);
  outcome.wobble_after = MeasureWobble(shown);
  outcome.straying = MeasureStraying(shown, frames_per_second);
  outcome.width_kept = 0;
  for (std::size_t f = 0; f < shown.zooms.size(); ++f) {
    // Of a folded frame nothing is shown.
    const double kept = shown.zooms[f] > 0 ? 1 / shown.zooms[f] : 0;
    outcome.width_kept += kept / static_cast<double>(shown.zooms.size());
    outcome.most_zoom = std::max(outcome.most_zoom, shown.zooms[f]);
    outcome.most_black = std::max(outcome.most_black, shown.uncovered[f]);
  }
  return outcome;
}

}  // namespace calmframe::host
