#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <list>
#include <map>
#include <memory>
#include <utility>
#include <vector>

#include "host/pixels/world_buffer.h"
#include "host/timeline/media_services.h"
#include "platform/hx/hx_effect.h"

namespace calmframe::host {

// Frames that enter an effect during one of its calls, at the call's depth and scale, and the
// output of a planned render. Used by the call's own thread.
class RenderContext {
 public:
  // `effect` is attached to the media services. Downsample ratios are above 0, at most 1.
  RenderContext(MediaServices& media, HX_EffectRef effect,
                boost::shared_ptr<const LayerState> layer, int bit_depth, HX_Ratio downsample_x,
                HX_Ratio downsample_y);
  // What the call did not check in is a mistake in the Ledger.
  ~RenderContext();
  RenderContext(const RenderContext&) = delete;
  RenderContext& operator=(const RenderContext&) = delete;

  // From now on the effect sees these parameters, whatever the user does: both commands of a render
  // go by one decision.
  void FreezeParams(std::vector<HX_ParamDef> params) { params_ = std::move(params); }
  const std::vector<HX_ParamDef>& frozen_params() const { return params_; }  // empty: none

  const LayerState& layer() const { return *layer_; }
  const boost::shared_ptr<const LayerState>& shared_layer() const { return layer_; }
  int bit_depth() const { return bit_depth_; }
  HX_Ratio downsample_x() const { return downsample_x_; }
  HX_Ratio downsample_y() const { return downsample_y_; }
  int width() const { return width_; }  // of the layer at this scale, rounded up
  int height() const { return height_; }

  // Whether the media has one at a time; it may not be readable.
  bool HasFrame(std::int64_t media_ticks) const;
  // The layer's frame at a media time, held, as is its record, until it is checked in. Null when
  // there is none, or it can't be read.
  const HX_World* CheckOutInput(std::int64_t media_ticks);
  void CheckInInput(const void* pixels);

  // The plan. A frame is ordered once under an id; an id stands for one time only.
  HX_Err Order(std::int32_t id, const HX_Rect& request, std::int64_t media_ticks,
               HX_CheckoutResult* result);
  HX_Err CheckOutOrdered(std::int32_t id, HX_World** world);
  HX_Err CheckInOrdered(std::int32_t id);

  // The world that a planned render draws into, of the rectangle.
  void SetOutput(std::shared_ptr<WorldBuffer> output) { output_ = std::move(output); }
  const std::shared_ptr<WorldBuffer>& output() const { return output_; }

 private:
  struct Held {
    PicturePtr picture;
    HX_World world{};
    int uses = 0;
  };
  struct Ordered {
    std::int64_t media_ticks = 0;
    HX_Rect rect{};  // in layer coordinates at render scale; empty when there is no frame
    Held held;
  };

  PicturePtr Fetch(std::int64_t media_ticks);

  MediaServices& media_;
  const HX_EffectRef effect_;
  const boost::shared_ptr<const LayerState> layer_;
  const int bit_depth_;
  const HX_Ratio downsample_x_, downsample_y_;
  int width_, height_;
  std::vector<HX_ParamDef> params_;
  std::list<Held> inputs_;
  std::map<std::int32_t, Ordered> ordered_;
  std::shared_ptr<WorldBuffer> output_;
};

}  // namespace calmframe::host
