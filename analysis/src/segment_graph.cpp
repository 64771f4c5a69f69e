#include "analysis/src/segment_graph.h"

#include <charconv>
#include <utility>

#include "effect/host_text.h"

namespace kelp::analysis {

using effect::ThrowIfFailed;

namespace {

class SegmentsReference {
 public:
  SegmentsReference(const HX_SequenceInfoSuite& suite, HX_EffectRef effect) : suite_(suite) {
    ThrowIfFailed(suite.AcquireSegments(effect, &segments_));
  }
  ~SegmentsReference() { suite_.ReleaseSegments(segments_); }
  SegmentsReference(const SegmentsReference&) = delete;
  SegmentsReference& operator=(const SegmentsReference&) = delete;
  HX_Segments get() const { return segments_; }

 private:
  const HX_SequenceInfoSuite& suite_;
  HX_Segments segments_ = 0;
};

}  // namespace

NodeReference& NodeReference::operator=(NodeReference&& other) noexcept {
  if (this != &other) {
    Reset();
    suite_ = other.suite_;
    node_ = other.Detach();
  }
  return *this;
}

HX_Node NodeReference::Detach() {
  return std::exchange(node_, 0);
}

void NodeReference::Reset() {
  if (node_ != 0) suite_->ReleaseNode(Detach());
}

NodeReference SegmentGraph::ClipNode(HX_EffectRef effect, const HX_SequenceInfoSuite& sequence,
                                     const HX_UtilitySuite& utility) const {
  const SegmentsReference segments(sequence, effect);
  std::int32_t start = 0, count = 0;
  std::int64_t ticks = 0;
  ThrowIfFailed(utility.GetStartFrame(effect, &start));
  ThrowIfFailed(utility.GetFrameCount(effect, &count));
  ThrowIfFailed(utility.GetTicksPerFrame(effect, &ticks));
  // Half frames of a clip are under 2^33, a frame's ticks under 2^29 at one frame a second.
  const std::int64_t half_frames = 2 * std::int64_t{start} + count;
  std::int64_t middle = 0;
  if (__builtin_mul_overflow(half_frames, ticks, &middle)) throw std::int32_t{HX_ERR_UNKNOWN};
  HX_Node node = 0;
  if (segments_.GetSegmentNodeAt(segments.get(), middle / 2, &node) != HX_ERR_NONE) return {};
  return {segments_, node};
}

std::int32_t SegmentGraph::OperatorCount(HX_Node node) const {
  std::int32_t count = 0;
  ThrowIfFailed(segments_.GetOperatorCount(node, &count));
  return count;
}

NodeReference SegmentGraph::Operator(HX_Node node, std::int32_t index) const {
  HX_Node found = 0;
  ThrowIfFailed(segments_.GetOperator(node, index, &found));
  return {segments_, found};
}

std::int32_t SegmentGraph::InputCount(HX_Node node) const {
  std::int32_t count = 0;
  ThrowIfFailed(segments_.GetInputCount(node, &count));
  return count;
}

NodeReference SegmentGraph::Input(HX_Node node, std::int32_t index) const {
  HX_Node found = 0;
  ThrowIfFailed(segments_.GetInput(node, index, &found));
  return {segments_, found};
}

HX_Guid SegmentGraph::NodeGuid(HX_Node node) const {
  HX_Guid guid{};
  ThrowIfFailed(segments_.GetNodeGuid(node, &guid));
  return guid;
}

std::string SegmentGraph::OperatorText(HX_Node effect_operator) const {
  HX_String text = nullptr;
  ThrowIfFailed(segments_.GetOperatorText(effect_operator, &text));
  return effect::TakeText(strings_, text);
}

std::int64_t SegmentGraph::NumberProperty(HX_Node node, const char* key, bool* absent) const {
  HX_String string = nullptr;
  const bool failed = segments_.GetProperty(node, key, &string) != HX_ERR_NONE;
  if (absent != nullptr) *absent = failed;
  if (failed) return 0;
  const std::string text = effect::TakeText(strings_, string);
  const char* const end = text.data() + text.size();
  std::int64_t value = 0;
  const auto [stop, error] = std::from_chars(text.data(), end, value);
  return error == std::errc() && stop == end ? value : 0;
}

}  // namespace kelp::analysis
