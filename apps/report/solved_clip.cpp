#include "apps/report/solved_clip.h"

#include <algorithm>
#include <cmath>

namespace calmframe::report {
namespace {

// Where a warp takes a place of the frame. Between the grid's vertices by both sides' proportion,
// which a cell of some 30 pixels leaves right to a fraction of a pixel.
Point Warped(const HX_VarVector& warp, int width, int height, Point place) {
  const auto cell = [](double at, int size, int vertices, int* index) {
    const double in_cells = std::clamp(at / std::max(size - 1, 1), 0.0, 1.0) * (vertices - 1);
    *index = std::min(static_cast<int>(in_cells), std::max(vertices - 2, 0));
    return in_cells - *index;
  };
  int column = 0, row = 0;
  const double across = cell(place.x, width, warp.columns, &column);
  const double down = cell(place.y, height, warp.rows, &row);
  const auto vertex = [&](int c, int r, int axis) {
    c = std::min(c, warp.columns - 1);
    r = std::min(r, warp.rows - 1);
    return warp.values[2 * (std::ptrdiff_t{r} * warp.columns + c) + axis];
  };
  const auto value = [&](int axis) {
    const double top = std::lerp(vertex(column, row, axis), vertex(column + 1, row, axis), across);
    const double bottom =
        std::lerp(vertex(column, row + 1, axis), vertex(column + 1, row + 1, axis), across);
    return std::lerp(top, bottom, down);
  };
  return {value(0), value(1)};
}

}  // namespace

std::optional<SolvedClip> ReadSolve(const host::PluginExports& exports, const void* block,
                                    const TrackTable& table, double pixel_aspect) {
  SolvedClip solved;
  std::int32_t frames = 0, first = 0, columns = 0, rows = 0, source_width = 0, source_height = 0;
  float min_x = 0, min_y = 0, max_x = 0, max_y = 0;
  if (!exports.get_stabilizer_data || !exports.get_var_vector || !exports.get_crop_window ||
      !exports.get_stabilizer_data(block, &frames, &first, &columns, &rows, &solved.crop_width,
                                   &solved.crop_height, &min_x, &min_y, &max_x, &max_y,
                                   &source_width, &source_height)) {
    return {};
  }
  solved.height = source_height;
  solved.width = static_cast<int>(std::lround(source_width * pixel_aspect));
  solved.track_life = MedianLife(table);
  const double stretch = static_cast<double>(solved.width) / std::max(source_width, 1);
  const Point centre{(solved.width - 1) / 2.0, (solved.height - 1) / 2.0};

  const auto count = std::min(table.rows, static_cast<std::size_t>(std::max(frames, 0)));
  std::vector<Point> warped(table.slots), previous(table.slots);
  for (std::size_t row = 0; row < count; ++row) {
    const auto frame = static_cast<std::int32_t>(row);
    int tracked = 0, begun = 0, lost = 0;
    std::vector<Match> before, after;
    const HX_VarVector* warp = exports.get_var_vector(block, frame);
    for (std::size_t slot = 0; slot < table.slots; ++slot) {
      const TrackTable::Cell& cell = table.At(row, slot);
      if (!cell.alive()) continue;
      ++tracked;
      begun += cell.begins();
      const bool goes_on = row + 1 < table.rows && table.At(row + 1, slot).status == 0;
      lost += row + 1 < table.rows && !goes_on;
      const Point place{cell.x * stretch, cell.y};
      if (warp) warped[slot] = Warped(*warp, solved.width, solved.height, place);
      if (row == 0 || cell.begins()) continue;
      const TrackTable::Cell& last = table.At(row - 1, slot);
      if (!last.alive()) continue;
      before.push_back({{last.x * stretch, last.y}, place});
      if (warp) after.push_back({previous[slot], warped[slot]});
    }
    solved.tracked.push_back(tracked);
    solved.begun.push_back(begun);
    solved.lost.push_back(lost);
    if (row > 0) {
      solved.before.push_back(FitMotion(before, centre));
      solved.after.push_back(FitMotion(after, centre));
    }
    previous = warped;
    if (solved.crop_width > 0 && solved.crop_height > 0) {
      float left = 0, top = 0, right = 0, bottom = 0;
      exports.get_crop_window(block, frame, &left, &top, &right, &bottom);
      solved.window.push_back({(double{left} + double{right}) / 2 + double{min_x} - centre.x,
                               (double{top} + double{bottom}) / 2 + double{min_y} - centre.y});
    }
  }
  return solved;
}

}  // namespace calmframe::report
