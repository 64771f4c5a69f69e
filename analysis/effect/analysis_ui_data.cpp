#include "analysis/effect/analysis_ui_data.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <cmath>
#include <optional>

#include "analysis/effect/track_colors.h"
#include "effect/suite.h"
#include "effect/world.h"
#include "platform/tesselui/drawbot.h"

namespace kelp::analysis::effect {
namespace {

using kelp::effect::kOver;
using kelp::effect::ThrowIfFailed;

// Of a point at full resolution, pixels. The stroke lies on the circle, so that a unit of its own
// width leaves some of the inside to be seen.
constexpr double kStroke = 3;
constexpr double kUnit = 3;
constexpr double kRadius = 1.1 * kUnit;
constexpr double kHotRadius = 1.25 * kUnit;  // selected, or under the mouse

constexpr double kFarthest = 20000;  // of a side of a rectangle that the host is told

double ValueOf(const HX_Ratio& ratio) {
  return ratio.num > 0 && ratio.den > 0 ? static_cast<double>(ratio.num) / ratio.den : 1.0;
}

std::int32_t Limited(double side) {
  return static_cast<std::int32_t>(std::clamp(side, -kFarthest, kFarthest));
}

HX_Rect Union(const HX_Rect& a, const HX_Rect& b) {
  return {std::min(a.left, b.left), std::min(a.top, b.top), std::max(a.right, b.right),
          std::max(a.bottom, b.bottom)};
}

HX_Rect Intersection(const HX_Rect& a, const HX_Rect& b) {
  return {std::max(a.left, b.left), std::max(a.top, b.top), std::min(a.right, b.right),
          std::min(a.bottom, b.bottom)};
}

bool IsEmpty(const HX_Rect& rect) {
  return rect.right <= rect.left || rect.bottom <= rect.top;
}

// A point as it is drawn, in layer coordinates at the render's scale.
struct Dot {
  double x, y, radius, stroke;
  HX_Rect box;
  TrackColors colors;
};

HX_Rect BoxOf(const Dot& dot) {
  const double reach = dot.radius + dot.stroke / 2 + 1;  // with its smoothed edge
  return {Limited(std::floor(dot.x - reach)), Limited(std::floor(dot.y - reach)),
          Limited(std::ceil(dot.x + reach)), Limited(std::ceil(dot.y + reach))};
}

void DrawDots(const std::vector<Dot>& dots, const HX_Rect& area, HX_World& world) {
  tesselui::drawbot::Surface surface(world.data, world.row_bytes, world.width, world.height);
  for (const Dot& dot : dots) {
    if (IsEmpty(Intersection(dot.box, area))) continue;
    tesselui::drawbot::Path path;
    path.AddArc(dot.x - area.left, dot.y - area.top, dot.radius, 0, 360);
    path.Close();
    surface.FillPath(path, {dot.colors.fill});
    surface.StrokePath(path, {dot.colors.line, dot.stroke});
  }
  surface.Flush();
}

}  // namespace

AnalysisUIData::AnalysisUIData(AnalysisEffect& effect)
    : context_(effect.context()), overlay_scale_(effect.GetOverlayScale()) {
  const CurrentFrame current = effect.GetCurrentFrame(true);
  if (current.valid) {
    const AnalysisState& state = *effect.GetState();
    const marrow::tracking::AllFeatures& table = state.table();
    const std::int64_t row = current.frame - table.first_frame;
    const HX_InData& in = *context_.in;
    width_ = in.width;
    height_ = in.height;
    pixel_aspect_ = ValueOf(in.pixel_aspect);
    analysis_ = state.result->source_identity;
    if (row >= 0 && row < table.frame_count) {
      frame_ = static_cast<std::int32_t>(row);
      const auto slots = static_cast<std::size_t>(table.feature_count);
      selected_frame_.count = table.feature_count;
      selected_frame_.has_next = row + 1 < table.frame_count;
      selected_frame_.cells.resize(selected_frame_.has_next ? 2 * slots : slots);
      table.ReadRow(static_cast<std::size_t>(row), selected_frame_.cells.data());
      if (selected_frame_.has_next) {
        table.ReadRow(static_cast<std::size_t>(row) + 1, selected_frame_.cells.data() + slots);
      }
    }
  }
  AnalysisUIData::RefreshPoints();
}

bool AnalysisUIData::EqualsWithUpdate(const AnalysisUIData& other) {
  if (frame_ != other.frame_ || width_ != other.width_ || height_ != other.height_ ||
      pixel_aspect_ != other.pixel_aspect_) {
    return false;
  }
  if (overlay_scale_ != other.overlay_scale_) {
    overlay_scale_ = other.overlay_scale_;
    RefreshPoints();
  }
  return true;
}

void AnalysisUIData::RefreshPoints() {
  const auto points = boost::make_shared<ScreenPoints>();
  const Cell* const cells = selected_frame_.cells.data();
  for (std::int32_t slot = 0; slot < selected_frame_.count; ++slot) {
    const Cell& cell = cells[slot];
    if (cell.status < 0 || !std::isfinite(cell.x) || !std::isfinite(cell.y)) continue;
    const bool goes_on = selected_frame_.has_next && cells[selected_frame_.count + slot].status ==
                                                         marrow::tracking::feature_status::kTracked;
    points->push_back(
        {cell.x, cell.y, overlay_scale_ * pixel_aspect_, slot, static_cast<std::uint8_t>(goes_on)});
  }
  points_ = points;
}

void AnalysisUIData::Draw(const TrackIds& selected, const TrackIds& hovered, HX_World& output) {
  if (points_->empty() || !output.data) return;
  const HX_InData& in = *context_.in;
  const double render_x = ValueOf(in.downsample_x), render_y = ValueOf(in.downsample_y);
  TrackPalette palette(context_);
  std::vector<Dot> dots;
  dots.reserve(points_->size());
  std::optional<HX_Rect> changed;
  for (const ScreenPoint& point : *points_) {
    const bool is_selected = selected.count(point.track) != 0;
    const bool is_hovered = hovered.count(point.track) != 0;
    Dot dot;
    // By half a pixel, from where whole numbers are centres to where they are corners.
    dot.x = (point.x + 0.5) * point.horizontal_scale / pixel_aspect_ * render_x;
    dot.y = (point.y + 0.5) * overlay_scale_ * render_y;
    const double scale = overlay_scale_ * render_y;
    dot.radius = (is_selected || is_hovered ? kHotRadius : kRadius) * scale;
    dot.stroke = kStroke * scale;
    dot.box = BoxOf(dot);
    dot.colors = palette.ColorsOf(point.track, is_selected, is_hovered);
    changed = changed ? Union(*changed, dot.box) : dot.box;
    dots.push_back(dot);
  }

  const HX_Rect whole{output.origin_x, output.origin_y, output.origin_x + output.width,
                      output.origin_y + output.height};
  const HX_Rect area = Intersection(*changed, whole);
  if (!IsEmpty(area)) {
    kelp::effect::ScopedWorld layer(context_, area.right - area.left, area.bottom - area.top, true,
                                    HX_FORMAT_BGRA8);
    DrawDots(dots, area, *layer.get());
    ThrowIfFailed(in.cb->transfer(in.effect_ref, layer.get(), &kOver, nullptr,
                                  area.left - output.origin_x, area.top - output.origin_y,
                                  &output));
  }
  const kelp::effect::ScopedSuite<HX_AppSuite6> suite(context_);
  ThrowIfFailed(suite->InvalidateRect(nullptr, &*changed));
}

boost::shared_ptr<const ScreenPoints> AnalysisUIData::PointsUnder(double x, double y,
                                                                  double radius) {
  const auto distance = [&](const ScreenPoint& point) {
    return std::hypot((point.x + 0.5) * point.horizontal_scale - x,
                      (point.y + 0.5) * overlay_scale_ - y);
  };
  const auto found = boost::make_shared<ScreenPoints>();
  for (const ScreenPoint& point : *points_) {
    if (distance(point) <= radius) found->push_back(point);
  }
  std::stable_sort(found->begin(), found->end(), [&](const ScreenPoint& a, const ScreenPoint& b) {
    return distance(a) < distance(b);
  });
  return found;
}

}  // namespace kelp::analysis::effect
