#include "apps/report/solve_figures.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <utility>
#include <vector>

namespace calmframe::report {
namespace {

// Where a warp takes a place of the frame. Between the grid's vertices by both sides'
// proportion, which a cell of some 30 pixels leaves right to a fraction of a pixel.
Point Warped(const host::SolvedClip& clip, const std::vector<Point>& vertices, Point place) {
  const auto cell = [](double at, int size, int count, int* index) {
    const double in_cells = std::clamp(at / std::max(size - 1, 1), 0.0, 1.0) * (count - 1);
    *index = std::min(static_cast<int>(in_cells), count - 2);
    return in_cells - *index;
  };
  int c = 0, r = 0;
  const double across = cell(place.x, clip.width, clip.columns, &c);
  const double down = cell(place.y, clip.height, clip.rows, &r);
  const auto columns = static_cast<std::size_t>(clip.columns);
  const Point* const above =
      vertices.data() + static_cast<std::size_t>(r) * columns + static_cast<std::size_t>(c);
  const Point* const below = above + columns;
  const auto value = [&](double Point::*axis) {
    return std::lerp(std::lerp(above[0].*axis, above[1].*axis, across),
                     std::lerp(below[0].*axis, below[1].*axis, across), down);
  };
  return {value(&Point::x), value(&Point::y)};
}

// In how many rows a track is seen, the median over all tracks; 0 without any.
std::size_t MedianLife(const host::SolvedClip& clip) {
  std::vector<std::size_t> lives, open(static_cast<std::size_t>(clip.slots), 0);
  const auto end = [&lives](std::size_t& life) {
    if (life > 0) lives.push_back(life);
    life = 0;
  };
  for (std::size_t row = 0; row < static_cast<std::size_t>(clip.frame_count); ++row) {
    const host::TrackRow tracks = clip.TracksOf(row);
    for (std::size_t slot = 0; slot < open.size(); ++slot) {
      if (tracks.statuses[slot] != 0) end(open[slot]);
      open[slot] += tracks.statuses[slot] >= 0;
    }
  }
  for (std::size_t& life : open) end(life);
  if (lives.empty()) return 0;
  const auto middle = lives.begin() + static_cast<std::ptrdiff_t>(lives.size() / 2);
  std::nth_element(lives.begin(), middle, lives.end());
  return *middle;
}

}  // namespace

SolveFigures FiguresOf(const host::SolvedClip& clip) {
  SolveFigures figures;
  figures.width = clip.width;
  figures.height = clip.height;
  figures.track_life = MedianLife(clip);
  const double stretch = static_cast<double>(clip.width) / std::max(clip.source_width, 1);
  const Point centre{(clip.width - 1) / 2.0, (clip.height - 1) / 2.0};

  const auto rows = static_cast<std::size_t>(clip.frame_count);
  const auto slots = static_cast<std::size_t>(clip.slots);
  std::vector<Point> warped(slots), previous(slots);
  host::TrackRow last, tracks = clip.TracksOf(0), next;
  for (std::size_t row = 0; row < rows;
       ++row, last = std::exchange(tracks, std::exchange(next, {}))) {
    const std::vector<Point> vertices = clip.VerticesOf(row);
    if (row + 1 < rows) next = clip.TracksOf(row + 1);
    int tracked = 0, begun = 0, lost = 0;
    std::vector<Match> before, after;
    for (std::size_t slot = 0; slot < slots; ++slot) {
      if (tracks.statuses[slot] < 0) continue;
      const bool begins = tracks.statuses[slot] > 0;
      ++tracked;
      begun += begins;
      lost += row + 1 < rows && next.statuses[slot] != 0;
      const Point place{tracks.places[slot].x * stretch, tracks.places[slot].y};
      warped[slot] = Warped(clip, vertices, place);
      if (row == 0 || begins || last.statuses[slot] < 0) continue;
      const Point& was = last.places[slot];
      before.push_back({{was.x * stretch, was.y}, place});
      after.push_back({previous[slot], warped[slot]});
    }
    figures.tracked.push_back(tracked);
    figures.begun.push_back(begun);
    figures.lost.push_back(lost);
    if (row > 0) {
      figures.before.push_back(FitMotion(before, centre));
      figures.after.push_back(FitMotion(after, centre));
    }
    previous = warped;
  }

  if (clip.crop && clip.crop->width > 0 && clip.crop->height > 0) {
    figures.crop_width = clip.crop->width;
    figures.crop_height = clip.crop->height;
    for (const host::SolvedClip::Window& window : clip.crop->windows) {
      figures.window.push_back(
          {(double{window.left} + double{window.right}) / 2 + clip.crop->origin.x - centre.x,
           (double{window.top} + double{window.bottom}) / 2 + clip.crop->origin.y - centre.y});
    }
  }
  return figures;
}

}  // namespace calmframe::report
