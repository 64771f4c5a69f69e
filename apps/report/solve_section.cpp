#include "apps/report/solve_section.h"

#include <algorithm>
#include <cmath>
#include <numeric>
#include <string>

#include "apps/report/model_scores.h"

namespace calmframe::report {
namespace {

std::vector<double> Column(const std::vector<CameraPlace>& path, double CameraPlace::*axis) {
  std::vector<double> values;
  for (const CameraPlace& place : path) values.push_back(place.*axis);
  return values;
}

std::vector<double> Numbers(const std::vector<int>& counts) {
  return {counts.begin(), counts.end()};
}

std::string Percent(double share, int digits) {
  return Short(100 * share, digits) + " %";
}

void AddTracks(const SolveFigures& figures, Page& page) {
  page.plots.push_back(
      {"tracks",
       "Tracks a " + figures.row,
       "",
       "Features that are followed, that begin, and that the next " + figures.row + " loses.",
       {{"begun", Numbers(figures.begun)},
        {"followed", Numbers(figures.tracked)},
        {"lost", Numbers(figures.lost)}},
       10,
       true});
  std::vector<int> tracked = figures.tracked;
  std::sort(tracked.begin(), tracked.end());
  page.facts.push_back(
      {"Tracks a " + figures.row, std::to_string(tracked[tracked.size() / 2]) + " on the median, " +
                                      std::to_string(tracked.front()) + " at the least"});
  page.facts.push_back({"A track lasts", std::to_string(figures.track_life) + " " + figures.row +
                                             (figures.track_life == 1 ? "" : "s") +
                                             " on the median"});
}

void AddModels(const std::vector<double>& scores, Page& page) {
  if (std::none_of(scores.begin(), scores.end(), [](double s) { return std::isfinite(s); })) return;
  page.plots.push_back({"models",
                        "Model scores",
                        "",
                        "What a frame's warp may do: 1 shift it, 2 turn and size it too, 3 "
                        "perspective, 4 bend it; between two numbers a blend of both.",
                        {{"score", scores}},
                        4,
                        true});
  page.facts.push_back({"Warps", ModelsText(scores)});
}

void AddCrop(const SolveFigures& figures, Page& page) {
  if (figures.window.empty()) return;
  std::vector<double> x, y;
  for (const Point& place : figures.window) {
    x.push_back(place.x);
    y.push_back(place.y);
  }
  page.plots.push_back({"crop",
                        "Crop path",
                        "px",
                        "Where the centre of the crop window lies beside the frame's centre.",
                        {{"across", x}, {"down", y}},
                        4});
  page.facts.push_back(
      {"Crop window",
       std::to_string(figures.crop_width) + " x " + std::to_string(figures.crop_height) + ", " +
           Percent(static_cast<double>(figures.crop_width) / figures.width, 1) + " of the width"});
}

}  // namespace

void AddCameraPath(const SolveFigures& figures, Page& page) {
  if (figures.track_life == 0) return;
  const std::vector<CameraPlace> before = PathOf(figures.before), after = PathOf(figures.after);
  const auto add = [&](const char* id, const char* title, const char* unit, const char* about,
                       double least_span, double CameraPlace::*axis) {
    page.plots.push_back({id,
                          title,
                          unit,
                          about,
                          {{"as shot", Column(before, axis)}, {"steadied", Column(after, axis)}},
                          least_span});
  };
  page.plots_about =
      "The camera path is summed up from frame to frame: the shift, turn and size that most tracks "
      "agree on. Pixels are the clip's own, before anything is enlarged.";
  add("path-x", "Camera path, across", "px", "Where the camera points, to the right.", 4,
      &CameraPlace::x);
  add("path-y", "Camera path, down", "px", "Where the camera points, downwards.", 4,
      &CameraPlace::y);
  add("path-angle", "Camera path, turn", "degrees", "How the camera is turned, clockwise.", 0.4,
      &CameraPlace::angle);
  add("path-zoom", "Camera path, closeness", "times",
      "How close the camera is to what it shows, 1 at first.", 0.02, &CameraPlace::zoom);
}

void AddSolve(const SolveFigures& figures, const std::vector<double>& scores, Page& page) {
  if (figures.track_life > 0) {
    AddTracks(figures, page);
  } else {
    page.notes.push_back("Nothing to track was found: the frames stay as they are.");
  }
  AddModels(scores, page);
  AddCrop(figures, page);
}

void AddShake(const SolveFigures& figures, Page& page) {
  if (figures.track_life == 0) return;
  const double shake = ShakeOf(PathOf(figures.before)), left = ShakeOf(PathOf(figures.after));
  page.facts.push_back({"Shake", Short(shake, 2) + " px/" + figures.row + "² as shot, " +
                                     Short(left, 2) + " steadied"});
  constexpr double kSeen = 0.3;  // px/frame²
  NoteWhatIsLeft(shake, left, kSeen, figures, page);
}

void NoteWhatIsLeft(double shake, double left, double seen, const SolveFigures& figures,
                    Page& page) {
  constexpr double kHardly = 0.75;  // of the shake
  if (figures.track_life > 0 && shake > seen && left > kHardly * shake) {
    page.notes.push_back(
        "Hardly steadier than it was shot. Half of its tracks last " +
        std::to_string(figures.track_life) + " " + figures.row +
        "s or fewer: where they are short, as in quick pans and blur, or where someone near "
        "moves against the scene, little can be smoothed.");
  }
}

void AddEmptyShares(const std::vector<double>& empty, std::size_t rows, Page& page) {
  if (empty.empty()) return;
  const double most = *std::max_element(empty.begin(), empty.end());
  const double mean =
      std::accumulate(empty.begin(), empty.end(), 0.0) / static_cast<double>(empty.size());
  page.facts.push_back({"Left empty", most < 0.005 ? "nothing"
                                                   : Percent(mean / 100, 2) + " on the mean, " +
                                                         Percent(most / 100, 2) + " at the most"});
  Curve curve{"uncovered", {}};
  for (std::size_t row = 0; row < rows; ++row) {
    curve.values.push_back(empty[row * empty.size() / rows]);
  }
  page.plots.push_back({"empty",
                        "Uncovered share",
                        "%",
                        "How much of the picture shows nothing, as it is drawn.",
                        {curve},
                        1,
                        true});
}

}  // namespace calmframe::report
