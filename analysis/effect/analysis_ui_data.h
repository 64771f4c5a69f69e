#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <set>
#include <vector>

#include "analysis/effect/analysis_effect.h"
#include "platform/hx/hx_world.h"
#include "platform/tessel/guid.h"
#include "tracking/track_store.h"

namespace kelp::analysis::effect {

// A tracked point of a frame.
struct ScreenPoint {
  float x, y;               // pixels of the layer, pixel centres at whole numbers
  double horizontal_scale;  // from those to the screen: the overlay's scale and the pixel aspect
  std::int32_t track;       // its slot in the table
  std::uint8_t goes_on;     // 1: the track reaches the next frame
};

using ScreenPoints = std::vector<ScreenPoint>;
using TrackIds = std::set<std::int32_t>;

// The tracked points of one frame, to be drawn over its picture and found under the mouse. On the
// stack of one call, whose context it borrows; on that call's thread. Screen positions are square
// pixels of the layer times the overlay's scale, (0, 0) being the layer's top left corner.
//
// The order of the virtual operations is the order of the table that other callers know.
class AnalysisUIData {
 public:
  // Of the effect's current frame; without points where that is none of the analysed ones.
  explicit AnalysisUIData(AnalysisEffect& effect);
  AnalysisUIData(const AnalysisUIData&) = delete;
  AnalysisUIData& operator=(const AnalysisUIData&) = delete;

  // Whether the other is about the same frame at the same size and aspect. Then its overlay scale
  // is taken over, with the points made anew for it.
  virtual bool EqualsWithUpdate(const AnalysisUIData& other);
  // Draws the points over an output of any depth, at the render's scale, and tells the host which
  // rectangle, in layer coordinates at that scale, has changed. Throws the host's code.
  virtual void Draw(const TrackIds& selected, const TrackIds& hovered, HX_World& output);
  // Those whose centres lie within `radius` of a screen position, the nearest first.
  virtual boost::shared_ptr<const ScreenPoints> PointsUnder(double x, double y, double radius);
  virtual void RefreshPoints();

  std::int32_t frame() const { return frame_; }
  double overlay_scale() const { return overlay_scale_; }
  const tessel::utility::Guid& analysis() const { return analysis_; }
  const boost::shared_ptr<const ScreenPoints>& points() const { return points_; }

 private:
  using Cell = marrow::tracking::tracking_feature<float>;

  // The cells of the frame, and whether those of the next one stand behind them.
  struct SelectedFrame {
    std::vector<Cell> cells;
    std::int32_t count = 0;
    bool has_next = false;
  };

  const kelp::effect::HostContext& context_;
  std::int32_t frame_ = -1;  // relative to the first analysed one
  std::int32_t width_ = 1, height_ = 1;
  double pixel_aspect_ = 1;
  double overlay_scale_ = 1;
  tessel::utility::Guid analysis_;  // of what was analysed; nil when nothing was
  SelectedFrame selected_frame_;
  boost::shared_ptr<const ScreenPoints> points_;
};

}  // namespace kelp::analysis::effect
