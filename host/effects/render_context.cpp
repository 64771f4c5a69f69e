#include "host/effects/render_context.h"

#include <algorithm>
#include <cstddef>

#include "host/base/operations.h"
#include "host/timeline/picture.h"

namespace calmframe::host {
namespace {

int Scaled(int size, const HX_Ratio& ratio) {
  const std::int64_t num = ratio.num, den = ratio.den;
  return static_cast<int>(std::max<std::int64_t>((size * num + den - 1) / den, 1));
}

// The part of the world inside `rect`, which lies within it and is in its coordinates.
HX_World PartOf(HX_World world, const HX_Rect& rect) {
  world.data = static_cast<std::uint8_t*>(world.data) + std::ptrdiff_t{world.row_bytes} * rect.top +
               std::ptrdiff_t{rect.left} * BytesPerPixel(FormatOf(world));
  world.width = rect.right - rect.left;
  world.height = rect.bottom - rect.top;
  world.origin_x = rect.left;
  world.origin_y = rect.top;
  world.extent = {0, 0, world.width, world.height};
  return world;
}

}  // namespace

RenderContext::RenderContext(MediaServices& media, HX_EffectRef effect,
                             boost::shared_ptr<const LayerState> layer, int bit_depth,
                             HX_Ratio downsample_x, HX_Ratio downsample_y)
    : media_(media),
      effect_(effect),
      layer_(std::move(layer)),
      bit_depth_(bit_depth),
      downsample_x_(downsample_x),
      downsample_y_(downsample_y),
      width_(Scaled(layer_->source->info().width, downsample_x)),
      height_(Scaled(layer_->source->info().height, downsample_y)) {}

RenderContext::~RenderContext() {
  for (const Held& input : inputs_) {
    if (input.uses > 0) Ledger::Get().Mistake("checkout_param: a frame was not checked in");
  }
  for (const auto& [id, order] : ordered_) {
    if (order.held.uses > 0) {
      Ledger::Get().Mistake("render.checkout_layer_pixels: a frame was not checked in");
    }
  }
}

bool RenderContext::HasFrame(std::int64_t media_ticks) const {
  return media_ticks >= 0 && media_ticks / std::max<std::int64_t>(layer_->ticks_per_frame, 1) <
                                 layer_->source->info().frame_count;
}

PicturePtr RenderContext::Fetch(std::int64_t media_ticks) {
  if (!HasFrame(media_ticks)) return nullptr;
  InputRequest request;
  request.time_ticks = media_ticks;
  request.kind = KindOfDepth(bit_depth_);
  request.width = width_;
  request.height = height_;
  request.layer = layer_;
  return media_.Input(effect_, request);
}

const HX_World* RenderContext::CheckOutInput(std::int64_t media_ticks) {
  const PicturePtr picture = Fetch(media_ticks);
  if (!picture) return nullptr;
  auto held = std::find_if(inputs_.begin(), inputs_.end(),
                           [&](const Held& input) { return input.picture == picture; });
  if (held == inputs_.end()) {
    held = inputs_.insert(inputs_.end(), Held{picture, WorldOf(*picture), 0});
  }
  ++held->uses;
  return &held->world;
}

void RenderContext::CheckInInput(const void* pixels) {
  const auto found = std::find_if(inputs_.begin(), inputs_.end(), [&](const Held& input) {
    return input.world.data == pixels && input.uses > 0;
  });
  if (found == inputs_.end()) {
    Ledger::Get().Mistake("checkin_param: a frame that is not checked out");
  } else if (--found->uses == 0) {
    inputs_.erase(found);
  }
}

HX_Err RenderContext::Order(std::int32_t id, const HX_Rect& request, std::int64_t media_ticks,
                            HX_CheckoutResult* result) {
  const auto [order, is_new] = ordered_.try_emplace(id);
  if (is_new) {
    order->second.media_ticks = media_ticks;
  } else if (order->second.media_ticks != media_ticks) {
    Ledger::Get().Mistake("plan.checkout_layer: one id for two times");
    return HX_ERR_UNKNOWN;
  }
  *result = {};
  if (!HasFrame(media_ticks)) return HX_ERR_NONE;
  result->full_rect = {0, 0, width_, height_};
  result->result_rect = Intersect(request, result->full_rect);
  if (IsEmpty(result->result_rect)) result->result_rect = {};
  // A second order widens the first, as the frame is made once.
  HX_Rect& rect = order->second.rect;
  if (IsEmpty(rect)) {
    rect = result->result_rect;
  } else if (!IsEmpty(result->result_rect)) {
    const HX_Rect& more = result->result_rect;
    rect = {std::min(rect.left, more.left), std::min(rect.top, more.top),
            std::max(rect.right, more.right), std::max(rect.bottom, more.bottom)};
  }
  return HX_ERR_NONE;
}

HX_Err RenderContext::CheckOutOrdered(std::int32_t id, HX_World** world) {
  const auto found = ordered_.find(id);
  if (found == ordered_.end() || IsEmpty(found->second.rect)) return HX_ERR_UNKNOWN;
  Ordered& order = found->second;
  if (!order.held.picture) {
    order.held.picture = Fetch(order.media_ticks);
    if (!order.held.picture) return HX_ERR_UNKNOWN;
  }
  // Made anew each time, since the record is the plug-in's to change while it has it.
  order.held.world = PartOf(WorldOf(*order.held.picture), order.rect);
  ++order.held.uses;
  *world = &order.held.world;
  return HX_ERR_NONE;
}

HX_Err RenderContext::CheckInOrdered(std::int32_t id) {
  const auto found = ordered_.find(id);
  if (found == ordered_.end() || found->second.held.uses == 0) {
    Ledger::Get().Mistake("render.checkin_layer_pixels: a frame that is not checked out");
    return HX_ERR_UNKNOWN;
  }
  if (--found->second.held.uses == 0) found->second.held.picture.reset();
  return HX_ERR_NONE;
}

}  // namespace calmframe::host
