#include "host/stabilize/shown_path.h"

#include <algorithm>
#include <cstddef>

#include "host/stabilize/warped_plane.h"

namespace calmframe::host {
namespace {

std::vector<WindowPlace> PlacesOf(const WarpedPlane& plane, const std::vector<Similarity>& windows,
                                  const std::vector<Point>& aims) {
  const SolvedClip& clip = plane.clip();
  const Point middle = Middle(clip);
  const double width = clip.width - 1.0, height = clip.height - 1.0;
  const double square = width / (clip.source_width - 1.0);
  std::vector<WindowPlace> places;
  places.reserve(windows.size());
  for (std::size_t f = 0; f < windows.size(); ++f) {
    const PlaneFrame frame = plane.Frame(f);
    const auto in_source = [&](Point output) {
      const Point at = windows[f](output);
      const Point source = frame.SourceAt({at.x - middle.x, at.y - middle.y});
      return Point{source.x * square - middle.x, source.y - middle.y};
    };
    WindowPlace place;
    place.centre = aims[f];
    Point first = place.centre, last = place.centre;
    for (const Point& corner : {Point{}, Point{width, 0}, Point{0, height}, Point{width, height}}) {
      const Point at = in_source(corner);
      first = {std::min(first.x, at.x), std::min(first.y, at.y)};
      last = {std::max(last.x, at.x), std::max(last.y, at.y)};
    }
    place.least = {place.centre.x - first.x - middle.x, place.centre.y - first.y - middle.y};
    place.most = {place.centre.x - last.x + middle.x, place.centre.y - last.y + middle.y};
    places.push_back(place);
  }
  return places;
}

}  // namespace

ShownPath PathShown(const MovingClip& clip, Warps warps, const std::vector<Similarity>& windows) {
  const WarpedPlane plane(clip.clip(), warps);
  ShownPath path;
  path.source = MotionOfSource(clip.clip(), *clip.motion(Warps::none));
  path.output = MotionShown(plane, *clip.motion(warps), windows);
  path.windows = PlacesOf(plane, windows, path.output.aims);
  return path;
}

}  // namespace calmframe::host
