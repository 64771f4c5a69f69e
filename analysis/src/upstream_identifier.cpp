#include "analysis/src/identities.h"
#include "analysis/src/mix_hash_guid.h"
#include "analysis/src/segment_graph.h"

namespace kelp::analysis {

using effect::ScopedSuite;
using effect::ThrowIfFailed;

namespace {

using tessel::utility::Guid;

class UpstreamWalk {
 public:
  UpstreamWalk(const SegmentGraph& graph, std::uint32_t effect_id, MixHashGuid& mix)
      : graph_(graph), effect_id_(effect_id), mix_(mix) {}

  // From the output inwards: what comes before the effect is met stands downstream of it. The Guid
  // of an input covers all beneath it.
  void Visit(HX_Node node, int depth = 0) {
    if (depth > kMaxGraphDepth) throw std::int32_t{HX_ERR_UNKNOWN};
    bool past = false;
    for (std::int32_t i = graph_.OperatorCount(node); i-- > 0;) {
      const NodeReference effect_operator = graph_.Operator(node, i);
      if (past) mix_.Add(Guid::FromText(graph_.OperatorText(effect_operator.get())));
      if (graph_.NumberProperty(effect_operator.get(), HX_PROPERTY_RUNTIME_INSTANCE_ID) ==
          effect_id_) {
        past = true;
      }
    }
    const std::int32_t inputs = graph_.InputCount(node);
    for (std::int32_t i = 0; i < inputs; ++i) {
      const NodeReference input = graph_.Input(node, i);
      if (past) {
        const HX_Guid guid = graph_.NodeGuid(input.get());
        mix_.Add(guid.bytes, sizeof guid.bytes);
      } else {
        Visit(input.get(), depth + 1);
      }
    }
  }

 private:
  const SegmentGraph& graph_;
  const std::int64_t effect_id_;
  MixHashGuid& mix_;
};

}  // namespace

Guid GetUpstreamIdentifier(HX_InData* host_in, HX_OutData* host_out) {
  const effect::HostContext context = effect::RecordsOnly(host_in, host_out);
  const ScopedSuite<HX_VideoSegmentSuite5> segments(context);
  const ScopedSuite<HX_UtilitySuite> utility(context, HX_UTILITY_SUITE_VERSION_3);
  const ScopedSuite<HX_SequenceInfoSuite> sequence(context, HX_SEQUENCE_INFO_SUITE_VERSION_2);
  const ScopedSuite<HX_StringSuite1> strings(context);
  const SegmentGraph graph(*segments, *strings);
  const NodeReference clip = graph.ClipNode(host_in->effect_ref, *sequence, *utility);
  if (!clip) return {};
  std::uint32_t effect_id = 0;
  ThrowIfFailed(utility->GetRuntimeInstanceID(host_in->effect_ref, &effect_id));
  MixHashGuid mix("Analyzer upstream nodes");
  UpstreamWalk(graph, effect_id, mix).Visit(clip.get());
  return mix.Finish();
}

}  // namespace kelp::analysis
