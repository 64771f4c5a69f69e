#include <algorithm>
#include <string>

#include "host/timeline/media_core.h"

namespace calmframe::host {
namespace {

using Tables = MediaTables;
using Node = MediaTables::Placed<GraphNode>;

HX_Err AcquireSegments(HX_EffectRef effect, HX_Segments* segments) {
  return Operation("Sequence Info.AcquireSegments", [=](Tables& tables) {
    const auto attached = tables.Find(effect);
    if (!attached || !segments) return HX_ERR_UNKNOWN;
    *segments = tables.segments.Add({attached->layer->state(), attached->core});
    return HX_ERR_NONE;
  });
}

HX_Err ReleaseSegments(HX_Segments segments) {
  return GivingBack("Sequence Info.ReleaseSegments",
                    [=](Tables& tables) { return tables.segments.Remove(segments); });
}

HX_Err GetTicksPerFrame(HX_EffectRef effect, int64_t* ticks) {
  return Operation("Sequence Info.GetTicksPerFrame", [=](Tables& tables) {
    const auto attached = tables.Find(effect);
    if (!attached || !ticks) return HX_ERR_UNKNOWN;
    *ticks = attached->layer->state()->ticks_per_frame;
    return HX_ERR_NONE;
  });
}

HX_Err GetSegmentNodeAt(HX_Segments segments, int64_t ticks, HX_Node* node) {
  return Operation("Video Segment.GetSegmentNodeAt", [=](Tables& tables) {
    return WithHandle(tables.segments, segments, [&](const auto& layer) {
      const auto found = NodeAt(layer.value, ticks);
      if (!found || !node || layer.core->faults.node_missing) return HX_ERR_UNKNOWN;
      *node = tables.nodes.Add({*found, layer.core});
      return HX_ERR_NONE;
    });
  });
}

// Children of a node and their count: its operators, or its inputs.
int OperatorCount(const GraphNode& node) {
  return !node.is_operator && node.level > 0 ? 1 : 0;
}

HX_Err Count(HX_Node node, int32_t* count, const char* name) {
  return Operation(name, [=](Tables& tables) {
    return WithHandle(tables.nodes, node, [&](const Node& found) {
      if (!count) return HX_ERR_UNKNOWN;
      *count = OperatorCount(found.value);
      return HX_ERR_NONE;
    });
  });
}

HX_Err Child(HX_Node node, int32_t index, bool is_operator, HX_Node* child, const char* name) {
  return Operation(name, [=](Tables& tables) {
    return WithHandle(tables.nodes, node, [&](const Node& parent) {
      const GraphNode& found = parent.value;
      if (index < 0 || index >= OperatorCount(found) || !child) return HX_ERR_UNKNOWN;
      *child = tables.nodes.Add(
          {{found.layer, is_operator ? found.level : found.level - 1, is_operator}, parent.core});
      return HX_ERR_NONE;
    });
  });
}

HX_Err GetOperatorCount(HX_Node node, int32_t* count) {
  return Count(node, count, "Video Segment.GetOperatorCount");
}

HX_Err GetOperator(HX_Node node, int32_t index, HX_Node* effect_operator) {
  return Child(node, index, true, effect_operator, "Video Segment.GetOperator");
}

HX_Err GetInputCount(HX_Node node, int32_t* count) {
  return Count(node, count, "Video Segment.GetInputCount");
}

HX_Err GetInput(HX_Node node, int32_t index, HX_Node* input) {
  return Child(node, index, false, input, "Video Segment.GetInput");
}

HX_Err GetProperty(HX_Node node, const char* key, HX_String* text) {
  return Operation("Video Segment.GetProperty", [=](Tables& tables) {
    return WithHandle(tables.nodes, node, [&](const Node& found) {
      if (!key || !text) return HX_ERR_UNKNOWN;
      if (found.core->faults.property_missing && !found.value.is_operator) return HX_ERR_UNKNOWN;
      const std::string value = PropertyOf(found.value, key);
      if (value.empty()) return HX_ERR_UNKNOWN;
      *text = tables.strings.Make(value);
      return HX_ERR_NONE;
    });
  });
}

HX_Err GetNodeGuid(HX_Node node, HX_Guid* guid) {
  return Operation("Video Segment.GetNodeGuid", [=](Tables& tables) {
    return WithHandle(tables.nodes, node, [&](const Node& found) {
      if (found.value.is_operator || !guid) return HX_ERR_UNKNOWN;
      const auto bytes = IdentityOf(found.value).bytes();
      std::copy(bytes.begin(), bytes.end(), guid->bytes);
      return HX_ERR_NONE;
    });
  });
}

HX_Err GetOperatorText(HX_Node effect_operator, HX_String* text) {
  return Operation("Video Segment.GetOperatorText", [=](Tables& tables) {
    return WithHandle(tables.nodes, effect_operator, [&](const Node& found) {
      if (!found.value.is_operator || !text) return HX_ERR_UNKNOWN;
      *text = tables.strings.Make(IdentityOf(found.value).ToText());
      return HX_ERR_NONE;
    });
  });
}

HX_Err ReleaseNode(HX_Node node) {
  return GivingBack("Video Segment.ReleaseNode",
                    [=](Tables& tables) { return tables.nodes.Remove(node); });
}

}  // namespace

const HX_SequenceInfoSuite& SequenceInfoTable() {
  static const HX_SequenceInfoSuite table = {AcquireSegments, ReleaseSegments, GetTicksPerFrame};
  return table;
}

const HX_VideoSegmentSuite5& VideoSegmentTable() {
  static const HX_VideoSegmentSuite5 table = {GetSegmentNodeAt, GetOperatorCount, GetOperator,
                                              GetInputCount,    GetInput,         GetProperty,
                                              GetNodeGuid,      GetOperatorText,  ReleaseNode};
  return table;
}

}  // namespace calmframe::host
