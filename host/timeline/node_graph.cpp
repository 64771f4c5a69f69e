#include "host/timeline/node_graph.h"

#include "platform/hx/hx_suites.h"

namespace calmframe::host {
namespace {

using tessel::utility::Guid;
using tessel::utility::MixHash;

Guid Mix(const Guid& state, const std::string& text) {
  return MixHash(state, text.data(), text.size());
}

Guid IdentityOf(const EffectOperator& effect) {
  return Mix(Mix(Guid(), effect.match_name), effect.parameters);
}

}  // namespace

std::optional<GraphNode> NodeAt(const boost::shared_ptr<const LayerState>& layer,
                                std::int64_t ticks) {
  const std::int64_t from_start = PictureAt(*layer, ticks, false).frame - layer->start_frame;
  if (from_start < 0 || from_start >= layer->length) return std::nullopt;
  return GraphNode{layer, layer->effects.size()};
}

std::optional<GraphNode> InputOf(const boost::shared_ptr<const LayerState>& layer,
                                 std::uint32_t runtime_id) {
  for (std::size_t i = 0; i < layer->effects.size(); ++i) {
    if (layer->effects[i].runtime_id == runtime_id) return GraphNode{layer, i};
  }
  return std::nullopt;
}

std::string PropertyOf(const GraphNode& node, const std::string& key) {
  if (node.is_operator) {
    if (key != HX_PROPERTY_RUNTIME_INSTANCE_ID) return {};
    return std::to_string(node.layer->effects[node.level - 1].runtime_id);
  }
  const SourceInfo& info = node.layer->source->info();
  if (key == HX_PROPERTY_STREAM_WIDTH) return std::to_string(info.width);
  if (key == HX_PROPERTY_STREAM_HEIGHT) return std::to_string(info.height);
  if (key == HX_PROPERTY_STREAM_PAR_NUM) return std::to_string(info.pixel_aspect.num);
  if (key == HX_PROPERTY_STREAM_PAR_DEN) return std::to_string(info.pixel_aspect.den);
  return {};
}

Guid IdentityOf(const GraphNode& node) {
  if (node.is_operator) return IdentityOf(node.layer->effects[node.level - 1]);
  Guid guid = node.layer->source->info().content;
  for (std::size_t i = 0; i < node.level; ++i) {
    const Guid effect = IdentityOf(node.layer->effects[i]);
    guid = MixHash(guid, effect.bytes().data(), effect.bytes().size());
  }
  return guid;
}

PictureNumber PictureAt(const LayerState& layer, std::int64_t ticks, bool single_field) {
  PictureNumber picture;
  std::int64_t rest = ticks % layer.ticks_per_frame;
  picture.frame = ticks / layer.ticks_per_frame;
  if (rest < 0) {
    rest += layer.ticks_per_frame;
    --picture.frame;
  }
  if (!single_field || layer.field_type == HX_FIELD_PROGRESSIVE) return picture;
  // The second field stands from half the frame's time on.
  const int second = rest >= layer.ticks_per_frame - rest ? 1 : 0;
  picture.parity = layer.field_type == HX_FIELD_FIRST_ORDER ? second : 1 - second;
  return picture;
}

}  // namespace calmframe::host
