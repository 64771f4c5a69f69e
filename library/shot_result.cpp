#include "library/shot_result.h"

#include <algorithm>
#include <cmath>

namespace calmframe::library {
namespace {

calmframe_shake ShakeOf(const host::Shake& shake) {
  return {shake.mean, shake.p95, shake.worst, shake.worst_at};
}

calmframe_similarity SimilarityOf(const host::Similarity& motion) {
  return {motion.a, motion.b, motion.dx, motion.dy};
}

}  // namespace

calmframe_outcome OutcomeOf(const host::Outcome& outcome) {
  using Window = host::Outcome::Window;
  calmframe_outcome told{};
  told.window = outcome.window == Window::steady   ? CALMFRAME_WINDOW_STEADY
                : outcome.window == Window::follow ? CALMFRAME_WINDOW_FOLLOW
                                                   : CALMFRAME_WINDOW_NONE;
  told.bends = outcome.bends ? 1 : 0;
  told.width_kept = outcome.width_kept;
  told.most_zoom = outcome.most_zoom;
  told.most_black = outcome.most_black;
  told.decibels = outcome.decibels();
  told.before = ShakeOf(outcome.before);
  told.after = ShakeOf(outcome.after);
  told.wobble_before = outcome.wobble_before;
  told.wobble_after = outcome.wobble_after;
  told.tracks_before = outcome.tracks_before;
  told.tracks_after = outcome.tracks_after;
  return told;
}

calmframe_shot ShotOf(const ShotResult& result) {
  return {result.first, result.end, result.solved ? 1 : 0, OutcomeOf(result.outcome)};
}

host::Outcome OutcomeOf(const std::vector<ShotResult>& shots, double frames_per_second) {
  std::vector<host::ShotOutcome> solved;
  for (const ShotResult& shot : shots) {
    if (!shot.solved) continue;
    solved.push_back({shot.outcome, static_cast<double>(shot.first) / frames_per_second,
                      static_cast<std::size_t>(shot.end - shot.first)});
  }
  if (solved.size() == 1) return solved[0].outcome;
  return solved.empty() ? host::AsFilmed() : host::OutcomeOf(solved);
}

std::string ReportOf(const std::vector<ShotResult>& shots, double frames_per_second,
                     const std::vector<std::string>& warnings) {
  nlohmann::ordered_json report = OutcomeOf(shots, frames_per_second).Json();
  report["warnings"] = warnings;
  nlohmann::ordered_json& list = report["shots"] = nlohmann::ordered_json::array();
  for (const ShotResult& shot : shots) {
    nlohmann::ordered_json object;
    object["first_frame"] = shot.first;
    object["end_frame"] = shot.end;
    object["solved"] = shot.solved;
    object.update(shot.outcome.Json());
    object["choice"] = shot.choice;
    list.push_back(std::move(object));
  }
  return report.dump();
}

std::vector<calmframe_place> PlacesAtRest(std::int64_t frames) {
  calmframe_place rest{};
  rest.before = rest.after = {1, 0, 0, 0};
  rest.zoom = 1;
  return std::vector<calmframe_place>(static_cast<std::size_t>(frames), rest);
}

std::vector<calmframe_place> PlacesOf(const host::ShownPath& path, std::int64_t frames,
                                      int rows_a_frame) {
  std::vector<calmframe_place> places = PlacesAtRest(frames);
  for (std::size_t f = 0; f < places.size(); ++f) {
    const std::size_t row = f * static_cast<std::size_t>(rows_a_frame);
    if (row >= path.windows.size()) break;
    calmframe_place& place = places[f];
    place.before = SimilarityOf(path.source.motions[row]);
    place.after = SimilarityOf(path.output.motions[row]);
    if (rows_a_frame == 2 && row > 0) {  // past the second field of the frame before
      const auto both = [row](const std::vector<host::Similarity>& motions) {
        return SimilarityOf(host::Compose(motions[row - 1], motions[row]));
      };
      place.before = both(path.source.motions);
      place.after = both(path.output.motions);
    }
    const host::WindowPlace& window = path.windows[row];
    place.zoom = path.output.zooms[row];
    place.black = path.output.uncovered[row];
    place.centre_x = window.centre.x;
    place.centre_y = window.centre.y;
    place.least_x = window.least.x;
    place.least_y = window.least.y;
    place.most_x = window.most.x;
    place.most_y = window.most.y;
  }
  return places;
}

}  // namespace calmframe::library
