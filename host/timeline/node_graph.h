#pragma once

#include <boost/shared_ptr.hpp>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "host/timeline/layer.h"
#include "platform/tessel/guid.h"

// The graph of a layer: each effect stands on a node of its own, whose one input is the node
// beneath; the lowest node is the media's. A graph shows one state of the layer for good.
namespace calmframe::host {

struct GraphNode {
  boost::shared_ptr<const LayerState> layer;
  std::size_t level = 0;     // 0: the media; n: behind the first n effects
  bool is_operator = false;  // the effect operator on the node, not the node
};

// The top node of what stands at a time; none outside the layer's span.
std::optional<GraphNode> NodeAt(const boost::shared_ptr<const LayerState>& layer,
                                std::int64_t ticks);
// The node that enters the effect; none if it is not in the chain.
std::optional<GraphNode> InputOf(const boost::shared_ptr<const LayerState>& layer,
                                 std::uint32_t runtime_id);

// Decimal text; empty when there is none of that key.
std::string PropertyOf(const GraphNode& node, const std::string& key);

// Equal in every process, and made of contents alone: no name, time or runtime id.
tessel::utility::Guid IdentityOf(const GraphNode& node);

// Which picture stands at a time: a frame, or one field of it.
struct PictureNumber {
  std::int64_t frame = 0;  // of the source; any
  int parity = -1;         // of the field's lines; -1: the whole frame
};
PictureNumber PictureAt(const LayerState& layer, std::int64_t ticks, bool single_field);

}  // namespace calmframe::host
